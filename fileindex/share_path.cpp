// Share paths and full paths.
#include <string>

#include "common/log.h"
#include "fileindex/util.h"
#include "sdk/platform.h"
#include "sdk/share.h"

namespace vellis::fileindex {
namespace {

// The platform's lookup under the name and argument shape that the failure
// log line quotes.
int QORUShareNamePathGet(const char* full_path, char* name, size_t name_size, char* path,
                         size_t path_size) {
  return sdk::GetPlatform()->QORUShareNamePathGet(full_path, name, name_size, path, path_size);
}

}  // namespace

void GetShareNameByPath(std::string& share_name, const std::string& share_path) {
  VELLIS_THROW_IF(1 > share_path.size() || '/' != share_path.at(0), kErrBadArgument, share_path);
  size_t end = share_path.find('/', 1);
  share_name = share_path.substr(1, end == std::string::npos ? std::string::npos : end - 1);
}

std::string GetFullPath(const std::string& share_path) {
  std::string share_name;
  GetShareNameByPath(share_name, share_path);
  sdk::SDKShare share(share_name);
  std::string own_path = share.GetPath();
  size_t slash = own_path.rfind('/');
  std::string volume = slash == std::string::npos ? std::string() : own_path.substr(0, slash);
  return volume + share_path;
}

void GetShareNamePathByFullPath(std::string& share_name, std::string& share_path_on_disk,
                                const std::string& full_path) {
  // The platform takes a C string: a NUL would cut the path short and name
  // the share of another path.
  VELLIS_THROW_IF(full_path.find('\0') != std::string::npos, kErrBadArgument,
                  "path contains a NUL byte");
  char szShareName[492] = {0};
  char szSharePath[4096] = {0};
  VELLIS_THROW_IF(0 > QORUShareNamePathGet(full_path.c_str(), szShareName, sizeof(szShareName),
                                           szSharePath, sizeof(szSharePath)),
                  kErrInternal, "QORUShareNamePathGet failed, full_path=" + full_path);
  // The platform terminates what it writes; the last byte stays a NUL even
  // if it does not.
  szShareName[sizeof(szShareName) - 1] = '\0';
  szSharePath[sizeof(szSharePath) - 1] = '\0';
  share_name = szShareName;
  share_path_on_disk = szSharePath;
}

std::string ReplacePathShare(const std::string& path, const std::string& new_share,
                             const std::string& old_share) {
  // The appended "/" lets a path that ends in the share component match.
  size_t pos = (path + "/").find("/" + old_share + "/");
  VELLIS_THROW_IF(std::string::npos == pos, kErrBadArgument, "Cannot find share: " + old_share);
  return path.substr(0, pos + 1) + new_share + path.substr(pos + 1 + old_share.size());
}

}  // namespace vellis::fileindex
