#include "common/fs_util.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cctype>
#include <cerrno>
#include <climits>
#include <cstdlib>

#include "common/log.h"
#include "common/host.h"

namespace vellis {
namespace {

constexpr int kMaxLinkDepth = 40;  // as the kernel's own limit on link chains

bool IsDirExistDepth(const std::string& path, bool follow_link, int depth) {
  struct stat st;
  if (lstat(path.c_str(), &st) != 0) return false;
  if (S_ISDIR(st.st_mode)) return true;
  if (!S_ISLNK(st.st_mode) || !follow_link || depth >= kMaxLinkDepth) return false;
  char target[4096];
  ssize_t n = readlink(path.c_str(), target, sizeof(target));
  if (n <= 0 || static_cast<size_t>(n) >= sizeof(target)) return false;
  return IsDirExistDepth(std::string(target, static_cast<size_t>(n)), true, depth + 1);
}

}  // namespace

int OpenRegularFile(const std::string& path, int flags, unsigned int mode) {
  int fd = open(path.c_str(), flags | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK, mode);
  if (fd < 0) return -1;
  struct stat st;
  if (fstat(fd, &st) != 0 || !S_ISREG(st.st_mode)) {
    const bool dir = S_ISDIR(st.st_mode);
    close(fd);
    errno = dir ? EISDIR : EINVAL;
    return -1;
  }
  return fd;
}

bool IsFileExist(const std::string& path) {
  struct stat st;
  return lstat(path.c_str(), &st) == 0 && S_ISREG(st.st_mode);
}

bool IsDirExist(const std::string& path, bool follow_link) {
  return IsDirExistDepth(path, follow_link, 0);
}

bool IsDirentDir(const dirent& entry, const std::string& /*path*/) {
  // An entry of unknown type is deliberately never taken for a directory:
  // callers then treat it as a file, which a later lstat of theirs corrects.
  return entry.d_type == DT_DIR;
}

bool CheckACLPerm(const std::string& path, int perm) {
  int granted = 0;
  if (GetHost()->AclPermGet(path, &granted) < 0) return false;
  return (granted & perm) != 0;
}

bool IsMountPoint(const std::string& path) {
  return GetHost()->DirIsMountPoint(path) > 0;
}

bool StringStartWith(const std::string& s, const std::string& prefix) {
  return s.size() >= prefix.size() && s.compare(0, prefix.size(), prefix) == 0;
}

std::string Basename(const std::string& path) {
  size_t pos = path.rfind('/');
  return pos == std::string::npos ? path : path.substr(pos + 1);
}

std::string Dirname(const std::string& path) {
  size_t pos = path.rfind('/');
  return pos == std::string::npos ? path : path.substr(0, pos);
}

std::string GetFileExtension(const std::string& path, bool lower) {
  std::string base = Basename(path);
  size_t dot = base.rfind('.');
  if (dot == std::string::npos) return std::string();
  std::string ext = base.substr(dot + 1);
  if (lower) {
    for (char& c : ext) c = static_cast<char>(tolower(static_cast<unsigned char>(c)));
  }
  return ext;
}

bool MakeDirs(const std::string& path, unsigned int mode) {
  const int saved = errno;  // EEXIST on the way is expected, not news
  for (size_t pos = 1; pos <= path.size(); ++pos) {
    if (pos == path.size() || path[pos] == '/') mkdir(path.substr(0, pos).c_str(), mode);
  }
  struct stat st;
  if (stat(path.c_str(), &st) == 0 && S_ISDIR(st.st_mode)) {
    errno = saved;
    return true;
  }
  return false;
}

std::string RealPath(const std::string& path) {
  char buf[PATH_MAX];
  if (realpath(path.c_str(), buf) == nullptr) return std::string();
  return buf;
}

bool Unlink(const std::string& path) { return unlink(path.c_str()) == 0 || errno == ENOENT; }

bool MVFile(const std::string& from, const std::string& to) {
  return GetHost()->FileCopy(from, to, /*overwrite=*/true, /*remove_source=*/true) == 0;
}

bool CPFile(const std::string& from, const std::string& to) {
  return GetHost()->FileCopy(from, to, /*overwrite=*/true, /*remove_source=*/false) == 0;
}

bool ChownVellis(const std::string& path) {
  uint32_t uid = 0;
  uint32_t gid = 0;
  VELLIS_THROW_IF(0 > GetHost()->UserIds(kServiceUserName, &uid, &gid), kErrServiceUser,
                  std::string("QORUUserGet failed, user=") + kServiceUserName);
  return chown(path.c_str(), uid, gid) == 0;
}

}  // namespace vellis
