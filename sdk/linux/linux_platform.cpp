#include "sdk/linux/linux_platform.h"

#include <fcntl.h>
#include <pwd.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <ctime>
#include <vector>

namespace vellis::sdk {

int64_t LinuxPlatform::Time() { return static_cast<int64_t>(time(nullptr)); }

void LinuxPlatform::Sleep(unsigned int seconds) { sleep(seconds); }

void LinuxPlatform::USleep(uint64_t microseconds) {
  // usleep() may refuse values of a second or more; nanosleep does not.
  timespec ts{static_cast<time_t>(microseconds / 1000000),
              static_cast<long>((microseconds % 1000000) * 1000)};
  while (nanosleep(&ts, &ts) != 0 && errno == EINTR) {
  }
}

int LinuxPlatform::Rand() { return rand(); }

void LinuxPlatform::Syslog(int priority, const std::string& message) {
  syslog(priority, "%s", message.c_str());
}

int LinuxPlatform::QORUACLPermGet(const std::string& path, int* perm) {
  struct stat st;
  if (lstat(path.c_str(), &st) != 0) return -1;
  // The access of the effective user and groups, as the kernel decides it
  // (ACLs included).
  int bits = 0;
  if (faccessat(AT_FDCWD, path.c_str(), R_OK, AT_EACCESS) == 0) bits |= kAclRead;
  if (faccessat(AT_FDCWD, path.c_str(), W_OK, AT_EACCESS) == 0) bits |= kAclWrite;
  if (faccessat(AT_FDCWD, path.c_str(), X_OK, AT_EACCESS) == 0) bits |= kAclExecute;
  *perm = bits;
  return 0;
}

int LinuxPlatform::QORUFSDirIsMntPoint(const std::string& path) {
  struct stat st, parent;
  if (lstat(path.c_str(), &st) != 0 || !S_ISDIR(st.st_mode)) return -1;
  if (stat((path + "/..").c_str(), &parent) != 0) return -1;
  // A mount point sits on another device than its parent; "/" is its own
  // parent.
  if (st.st_dev != parent.st_dev) return 1;
  return st.st_ino == parent.st_ino ? 1 : 0;
}

namespace {

// Copies the regular file `from` into a temporary beside `to` and renames it
// over `to`, so that a reader never sees half a file.
int CopyRegularFile(const std::string& from, const std::string& to) {
  int in = open(from.c_str(), O_RDONLY | O_CLOEXEC | O_NOFOLLOW);
  if (in < 0) return -1;
  struct stat st;
  if (fstat(in, &st) != 0 || !S_ISREG(st.st_mode)) {
    close(in);
    errno = EINVAL;
    return -1;
  }
  std::string tmp = to + ".copy-XXXXXX";
  std::vector<char> tmpl(tmp.begin(), tmp.end());
  tmpl.push_back('\0');
  int out = mkostemp(tmpl.data(), O_CLOEXEC);
  if (out < 0) {
    close(in);
    return -1;
  }
  std::vector<char> buf(1 << 16);
  bool ok = true;
  for (;;) {
    ssize_t n = read(in, buf.data(), buf.size());
    if (n < 0 && errno == EINTR) continue;
    if (n < 0) ok = false;
    if (n <= 0) break;
    for (ssize_t off = 0; off < n;) {
      ssize_t w = write(out, buf.data() + off, n - off);
      if (w < 0 && errno == EINTR) continue;
      if (w <= 0) {
        ok = false;
        break;
      }
      off += w;
    }
    if (!ok) break;
  }
  ok = ok && fchmod(out, st.st_mode & 07777) == 0 && fsync(out) == 0;
  int saved = errno;
  close(in);
  if (close(out) != 0) ok = false;
  if (ok && rename(tmpl.data(), to.c_str()) == 0) return 0;
  unlink(tmpl.data());
  errno = saved;
  return -1;
}

}  // namespace

int LinuxPlatform::QORUFileCopy(const std::string& from, const std::string& to,
                                const CopyArgs& args) {
  struct stat st;
  if (!args.overwrite && lstat(to.c_str(), &st) == 0) {
    errno = EEXIST;
    return -1;
  }
  if (args.remove_source && rename(from.c_str(), to.c_str()) == 0) return 0;
  if (CopyRegularFile(from, to) != 0) return -1;
  if (args.remove_source && unlink(from.c_str()) != 0) return -1;
  return 0;
}

int LinuxPlatform::QORUUserGet(const std::string& name, UserInfo* out) {
  long size = sysconf(_SC_GETPW_R_SIZE_MAX);
  std::vector<char> buf(size > 0 ? size : 16384);
  passwd pw;
  passwd* result = nullptr;
  if (getpwnam_r(name.c_str(), &pw, buf.data(), buf.size(), &result) != 0 || !result) return -1;
  out->name = pw.pw_name;
  out->uid = pw.pw_uid;
  out->gid = pw.pw_gid;
  out->home = pw.pw_dir ? pw.pw_dir : "";
  return 0;
}

}  // namespace vellis::sdk
