// The entries of a folder list by full path, so that the path queries look
// up a path's ancestors instead of comparing it with every folder.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

namespace vellis::fileindex {

class FullPathIndex {
 public:
  static constexpr size_t kNone = SIZE_MAX;

  // Indexes entry i under full_paths[i]; among entries with equal full
  // paths the first one is kept.
  explicit FullPathIndex(std::vector<std::string> full_paths);
  FullPathIndex(const FullPathIndex&) = delete;
  FullPathIndex& operator=(const FullPathIndex&) = delete;

  // The entry whose full path is exactly `full_path`, or kNone.
  size_t Find(std::string_view full_path) const;

  // Of the entries whose non-empty full path F covers `full_path`
  // (full_path + "/" begins with F + "/"), the one with the longest F (the
  // first of equal ones); kNone when none covers it. Costs one hash lookup per component
  // of `full_path`, whatever the number of entries.
  size_t FindCovering(std::string_view full_path) const;

 private:
  std::vector<std::string> full_paths_;  // owns the bytes that the keys view
  std::unordered_map<std::string_view, size_t> entries_;
};

}  // namespace vellis::fileindex
