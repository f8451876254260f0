#include "sdk/linux/index_paths.h"

#include <cerrno>
#include <cstring>

#include "sdk/linux/last_error.h"
#include "sdk/linux/linux_platform.h"

namespace vellis::sdk {
namespace {

// The share's folder of index data: "<volume>/@fileindex/<name>".
std::string IndexDataDir(const std::string& share_path) {
  if (share_path.size() < 2 || share_path[0] != '/' || share_path.back() == '/') return "";
  size_t slash = share_path.rfind('/');
  return share_path.substr(0, slash) + "/" + kIndexDataFolder + share_path.substr(slash);
}

}  // namespace

std::string ComposeQueuePath(const std::string& share_path) {
  std::string dir = IndexDataDir(share_path);
  return dir.empty() ? dir : dir + "/queue";
}

std::string ComposeDBPath(const std::string& share_path) {
  std::string dir = IndexDataDir(share_path);
  return dir.empty() ? dir : dir + "/db";
}

std::string ComposeIndexID(const std::string& share_name) {
  return share_name.empty() ? share_name : kIndexNamePrefix + share_name;
}

int CopyToBuffer(const std::string& value, char* buf, size_t size) {
  if (value.empty()) return FailWith(EINVAL);
  if (buf == nullptr || value.size() >= size) return FailWith(ENAMETOOLONG);
  memcpy(buf, value.c_str(), value.size() + 1);
  return static_cast<int>(value.size());
}

int LinuxPlatform::FILEIDXQueuePathCompose(const std::string& share_path, char* buf, size_t size) {
  return CopyToBuffer(ComposeQueuePath(share_path), buf, size);
}

int LinuxPlatform::FILEIDXDBPathCompose(const std::string& share_path, char* buf, size_t size) {
  return CopyToBuffer(ComposeDBPath(share_path), buf, size);
}

int LinuxPlatform::FILEIDXGetIndexID(const std::string& share_name, char* buf, size_t size) {
  return CopyToBuffer(ComposeIndexID(share_name), buf, size);
}

}  // namespace vellis::sdk
