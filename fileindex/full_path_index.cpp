#include "fileindex/full_path_index.h"

#include <utility>

namespace vellis::fileindex {

FullPathIndex::FullPathIndex(std::vector<std::string> full_paths)
    : full_paths_(std::move(full_paths)) {
  // The vector no longer grows, so the views stay valid.
  entries_.reserve(full_paths_.size());
  for (size_t i = 0; i < full_paths_.size(); ++i) entries_.emplace(full_paths_[i], i);
}

size_t FullPathIndex::Find(std::string_view full_path) const {
  auto it = entries_.find(full_path);
  return it == entries_.end() ? kNone : it->second;
}

size_t FullPathIndex::FindCovering(std::string_view full_path) const {
  // The covering full paths are `full_path` itself and its prefixes that end
  // just before a "/"; the longest one found first is the deepest folder.
  size_t end = full_path.size();
  for (;;) {
    if (end == 0) return kNone;  // an empty full path governs nothing
    size_t found = Find(full_path.substr(0, end));
    if (found != kNone) return found;
    size_t slash = full_path.rfind('/', end - 1);
    if (slash == std::string_view::npos) return kNone;
    end = slash;
  }
}

}  // namespace vellis::fileindex
