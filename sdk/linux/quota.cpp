// Free space for a share's index on the Linux platform.
#include <sys/statvfs.h>

#include <cerrno>

#include "sdk/linux/last_error.h"
#include "sdk/linux/linux_platform.h"

namespace vellis::sdk {

int LinuxPlatform::QORUQuotaIsEnough(uint32_t /*uid*/, const std::string& path, uint64_t bytes,
                                     int /*flags*/) {
  // No per-user quotas here: the space that unprivileged writers may still
  // use on the file system decides, for every user alike.
  struct statvfs vfs;
  if (statvfs(path.c_str(), &vfs) != 0) {
    SetPlatformError(errno);
    return 0;
  }
  uint64_t free_bytes = static_cast<uint64_t>(vfs.f_bavail) * vfs.f_frsize;
  if (free_bytes < bytes) {
    SetPlatformError(kPlatformErrNoSpace);
    return 0;
  }
  // An index needs new files too; file systems without an inode count
  // report f_files as 0.
  if (vfs.f_files != 0 && vfs.f_favail == 0) {
    SetPlatformError(kPlatformErrNoInodes);
    return 0;
  }
  return 1;
}

}  // namespace vellis::sdk
