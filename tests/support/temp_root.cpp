#include "tests/support/temp_root.h"

#include <ftw.h>
#include <sys/stat.h>

#include <cstdlib>
#include <fstream>
#include <sstream>
#include <stdexcept>

#include "common/root_path.h"

namespace vellis::testing {
namespace {

int RemoveEntry(const char* path, const struct stat*, int, FTW*) {
  remove(path);
  return 0;
}

}  // namespace

void MakeDirs(const std::string& path) {
  for (size_t pos = 1; pos <= path.size(); ++pos) {
    if (pos == path.size() || path[pos] == '/') mkdir(path.substr(0, pos).c_str(), 0755);
  }
}

TempRoot::TempRoot() {
  const char* tmpdir = getenv("TMPDIR");
  std::string tmpl = std::string(tmpdir && *tmpdir ? tmpdir : "/tmp") + "/vellis-test-XXXXXX";
  if (mkdtemp(tmpl.data()) == nullptr) throw std::runtime_error("mkdtemp failed");
  path_ = tmpl;
  for (const char* dir : {"/tmp", "/var/run", "/var/packages/Vellis/etc"}) MakeDirs(path_ + dir);
  if (const char* old = getenv(kRootEnv)) old_ = old;
  setenv(kRootEnv, path_.c_str(), 1);
}

TempRoot::~TempRoot() {
  if (old_) {
    setenv(kRootEnv, old_->c_str(), 1);
  } else {
    unsetenv(kRootEnv);
  }
  nftw(path_.c_str(), RemoveEntry, 64, FTW_DEPTH | FTW_PHYS);
}

void WriteFile(const std::string& path, const std::string& content) {
  size_t slash = path.rfind('/');
  if (slash != std::string::npos && slash > 0) MakeDirs(path.substr(0, slash));
  std::ofstream out(path, std::ios::binary | std::ios::trunc);
  if (!(out << content)) throw std::runtime_error("cannot write " + path);
}

std::string ReadFile(const std::string& path) {
  std::ostringstream ss;
  ss << std::ifstream(path, std::ios::binary).rdbuf();
  return ss.str();
}

}  // namespace vellis::testing
