#include "fileindex/interim_util.h"

#include <vector>

#include "common/log.h"
#include "sdk/platform.h"
#include "sdk/share.h"

namespace vellis::fileindex {

void GetShareNameByPath(std::string& share_name, const std::string& share_path) {
  VELLIS_THROW_IF(1 > share_path.size() || '/' != share_path.at(0), kErrBadArgument, share_path);
  size_t end = share_path.find('/', 1);
  share_name = share_path.substr(1, end == std::string::npos ? std::string::npos : end - 1);
}

std::string GetFullPath(const std::string& share_path) {
  std::string share_name;
  GetShareNameByPath(share_name, share_path);
  sdk::SDKShare share(share_name);
  std::string on_disk = share.GetPath();
  return on_disk.substr(0, on_disk.rfind('/')) + share_path;
}

void GetShareNamePathByFullPath(std::string& share_name, std::string& share_path_on_disk,
                                const std::string& full_path) {
  std::vector<char> name(492, '\0');
  std::vector<char> path(4096, '\0');
  VELLIS_THROW_IF(0 > sdk::GetPlatform()->QORUShareNamePathGet(full_path, name.data(), name.size(),
                                                               path.data(), path.size()),
                  kErrInternal, "QORUShareNamePathGet failed, full_path=" + full_path);
  share_name = name.data();
  share_path_on_disk = path.data();
}

std::string ReplacePathShare(const std::string& path, const std::string& new_share,
                             const std::string& old_share) {
  size_t pos = (path + "/").find("/" + old_share + "/");
  VELLIS_THROW_IF(std::string::npos == pos, kErrBadArgument, "Cannot find share: " + old_share);
  return path.substr(0, pos + 1) + new_share + path.substr(pos + 1 + old_share.size());
}

}  // namespace vellis::fileindex
