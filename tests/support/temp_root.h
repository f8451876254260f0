// A temporary root directory for one test, named by $VELLIS_ROOT, and
// whole-file helpers.
#pragma once

#include <ftw.h>
#include <sys/stat.h>

#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <optional>
#include <sstream>
#include <stdexcept>
#include <string>

#include "common/root_path.h"

namespace vellis::testing {

// Creates `path` and its missing parents.
inline void MakeDirs(const std::string& path) {
  for (size_t pos = 1; pos <= path.size(); ++pos) {
    if (pos == path.size() || path[pos] == '/') mkdir(path.substr(0, pos).c_str(), 0755);
  }
}
// Replaces the file's content, creating its parent folders.
inline void WriteFile(const std::string& path, const std::string& content) {
  if (size_t slash = path.rfind('/'); slash != std::string::npos && slash > 0)
    MakeDirs(path.substr(0, slash));
  std::ofstream out(path, std::ios::binary | std::ios::trunc);
  if (!(out << content)) throw std::runtime_error("cannot write " + path);
}
inline std::string ReadFile(const std::string& path) {
  std::ostringstream ss;
  ss << std::ifstream(path, std::ios::binary).rdbuf();
  return ss.str();
}

// Creates a fresh directory under $TMPDIR (or /tmp) with the usual folders
// (tmp, var/run, var/packages/Vellis/etc), points $VELLIS_ROOT at it, and on
// destruction restores $VELLIS_ROOT and removes the whole tree.
class TempRoot {
 public:
  TempRoot() {
    const char* tmpdir = getenv("TMPDIR");
    path_ = std::string(tmpdir && *tmpdir ? tmpdir : "/tmp") + "/vellis-test-XXXXXX";
    if (mkdtemp(path_.data()) == nullptr) throw std::runtime_error("mkdtemp failed");
    for (const char* dir : {"/tmp", "/var/run", "/var/packages/Vellis/etc"}) MakeDirs(path_ + dir);
    if (const char* old = getenv(kRootEnv)) old_ = old;
    setenv(kRootEnv, path_.c_str(), 1);
  }
  ~TempRoot() {
    old_ ? setenv(kRootEnv, old_->c_str(), 1) : unsetenv(kRootEnv);
    nftw(path_.c_str(), RemoveEntry, 64, FTW_DEPTH | FTW_PHYS);
  }
  TempRoot(const TempRoot&) = delete;
  TempRoot& operator=(const TempRoot&) = delete;

  const std::string& path() const { return path_; }
  // path() + rel, rel beginning with "/".
  std::string Path(const std::string& rel) const { return path_ + rel; }

 private:
  static int RemoveEntry(const char* path, const struct stat*, int, FTW*) {
    remove(path);
    return 0;
  }

  std::string path_;
  std::optional<std::string> old_;
};

}  // namespace vellis::testing
