#include "common/lock_file.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "common/fs_util.h"
#include "common/host.h"
#include "common/log.h"

namespace vellis {
LockFile::LockFile(const std::string& path, bool exclusive) : fd_(-1), path_(path) {
  int budget = kMaxAttempts;
  for (;;) {
    VELLIS_THROW_IF(0 > (fd_ = OpenRegularFile(path_, O_RDONLY | O_CREAT)), kErrLock,
                    "open failed, path=" + path_ + ", reason=" + strerror(errno));
    if (flock(fd_, (exclusive ? LOCK_EX : LOCK_SH) | LOCK_NB) == 0) return;
    int err = errno;
    close(fd_);  // a half-made lock object must not leak its descriptor
    fd_ = -1;
    if (err != EINTR && err != EWOULDBLOCK) throw Error(kErrLock, strerror(err));
    GetHost()->USleep(static_cast<uint64_t>(GetHost()->Rand() % 10) * 100000);
    if (--budget == 0) throw Error(kErrLock, "Exceed max retry, path=" + path_);
  }
}

LockFile::~LockFile() {
  if (fd_ < 0) return;
  flock(fd_, LOCK_UN);
  close(fd_);
}

}  // namespace vellis
