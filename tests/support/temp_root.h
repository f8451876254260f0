// A temporary root directory for one test, named by $VELLIS_ROOT.
#pragma once

#include <optional>
#include <string>

namespace vellis::testing {

// Creates a fresh directory under $TMPDIR (or /tmp) with the usual folders
// (tmp, var/run, var/packages/Vellis/etc), points $VELLIS_ROOT at it, and on
// destruction restores $VELLIS_ROOT and removes the whole tree.
class TempRoot {
 public:
  TempRoot();
  ~TempRoot();
  TempRoot(const TempRoot&) = delete;
  TempRoot& operator=(const TempRoot&) = delete;

  const std::string& path() const { return path_; }
  // path() + rel, rel beginning with "/".
  std::string Path(const std::string& rel) const { return path_ + rel; }

 private:
  std::string path_;
  std::optional<std::string> old_;
};

// Whole-file helpers for tests. WriteFile creates parent folders.
void WriteFile(const std::string& path, const std::string& content);
std::string ReadFile(const std::string& path);
void MakeDirs(const std::string& path);

}  // namespace vellis::testing
