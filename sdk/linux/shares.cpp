// The share queries of the Linux platform, answered from the share registry.
#include <grp.h>
#include <pwd.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <unistd.h>

#include <cerrno>
#include <vector>

#include "sdk/linux/index_paths.h"
#include "sdk/linux/last_error.h"
#include "sdk/linux/linux_platform.h"
#include "sdk/linux/share_registry.h"

namespace vellis::sdk {
namespace {

int SetValue(int* value, bool yes) {
  *value = yes ? 1 : 0;
  return 0;
}

// The groups of `user` (primary included); empty when there are more than
// the buffer holds, which then only costs group access.
std::vector<gid_t> GroupsOf(const UserInfo& user) {
  std::vector<gid_t> groups(256);
  int n = static_cast<int>(groups.size());
  if (getgrouplist(user.name.c_str(), user.gid, groups.data(), &n) < 0) n = 0;
  groups.resize(static_cast<size_t>(n));
  return groups;
}

}  // namespace

int LinuxPlatform::QORUShareGet(const std::string& name, ShareInfo* out) {
  std::vector<ShareInfo> shares;
  if (!LoadShareRegistry(&shares)) return FailWith(errno);
  const ShareInfo* share = FindShareByName(shares, name);
  if (!share) return FailWith(ENOENT);
  *out = *share;
  return 0;
}

int LinuxPlatform::QLIBShareEnum(std::vector<std::string>* names) {
  std::vector<ShareInfo> shares;
  if (!LoadShareRegistry(&shares)) return FailWith(errno);
  names->clear();
  for (const ShareInfo& share : shares) names->push_back(share.szName);
  return 0;
}

int LinuxPlatform::QLIBShareIsEncryptedGet(const ShareInfo& share, int* value) {
  // An unlocked encrypted share is mounted at its path (a stacked encrypting
  // file system); while it is locked, its path is a plain folder of
  // ciphertext.
  return SetValue(value, share.encryption && QORUFSDirIsMntPoint(share.szPath) != 1);
}

int LinuxPlatform::QLIBShareIsReadOnlyGet(const ShareInfo& share, int* value) {
  struct statvfs vfs;
  bool mounted_read_only =
      statvfs(share.szPath.c_str(), &vfs) == 0 && (vfs.f_flag & ST_RDONLY) != 0;
  return SetValue(value, share.read_only || mounted_read_only);
}

int LinuxPlatform::QLIBShareIsEncryptionGet(const ShareInfo& share, int* value) {
  return SetValue(value, share.encryption);
}

int LinuxPlatform::QLIBShareRecycleStatusGet(const ShareInfo& share, int* value) {
  return SetValue(value, share.recycle_bin);
}

int LinuxPlatform::QLIBShareHideUnreadableGet(const ShareInfo& share, int* value) {
  return SetValue(value, share.hide_unreadable);
}

int LinuxPlatform::QORUShareUserPrivGet(const std::string& user, const ShareInfo& share) {
  UserInfo info;
  if (QORUUserGet(user, &info) < 0) return FailWith(ENOENT);
  if (info.uid == 0) return kSharePrivReadWrite;
  struct stat st;
  if (stat(share.szPath.c_str(), &st) != 0) return FailWith(errno);
  // The owner, group and other bits of the share's folder, as the kernel
  // would pick them for that user.
  mode_t bits = st.st_mode & S_IRWXO;
  if (info.uid == st.st_uid) {
    bits = (st.st_mode & S_IRWXU) >> 6;
  } else {
    for (gid_t gid : GroupsOf(info)) {
      if (gid == st.st_gid) {
        bits = (st.st_mode & S_IRWXG) >> 3;
        break;
      }
    }
  }
  if ((bits & 05) != 05) return kSharePrivNoAccess;  // must list and read
  return (bits & 02) ? kSharePrivReadWrite : kSharePrivReadOnly;
}

int LinuxPlatform::QORUShareNamePathGet(const std::string& full_path, char* name, size_t name_size,
                                        char* path, size_t path_size) {
  std::vector<ShareInfo> shares;
  if (!LoadShareRegistry(&shares)) return FailWith(errno);
  const ShareInfo* share = FindShareHolding(shares, full_path);
  if (!share) return FailWith(ENOENT);
  if (share->szName.size() >= name_size || share->szPath.size() >= path_size) {
    return FailWith(ENAMETOOLONG);
  }
  CopyToBuffer(share->szName, name, name_size);
  CopyToBuffer(share->szPath, path, path_size);
  return 0;
}

}  // namespace vellis::sdk
