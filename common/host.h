// What common/ needs of the system beneath it.
//
// common/ is the lowest layer: it may not call into the platform seam of
// sdk/. The few services it needs from the platform (the system log, sleeps
// and random numbers of the lock retries, the file copy, permission and
// mount-point tests and the user lookup of the file-system helpers) go
// through this small interface instead. sdk/ installs a Host that forwards
// to its Platform when the library is loaded, so every line and call of
// common/ reaches whatever platform the process (or a test) has installed.
// Until then, a host built on the C library serves; its platform-only
// calls fail with ENOSYS.
//
// Thread safety: implementations must be safe for concurrent calls.
#pragma once

#include <cstdint>
#include <string>

namespace vellis {

class Host {
 public:
  virtual ~Host() = default;

  // One line to the system log at `priority` (LOG_ERR, ...).
  virtual void Syslog(int priority, const std::string& line) = 0;
  virtual void USleep(uint64_t microseconds) = 0;
  // 0 to RAND_MAX.
  virtual int Rand() = 0;

  // Copies (or, with `remove_source`, moves) the regular file `from` to
  // `to`, replacing `to` when `overwrite`. 0 on success, negative on failure.
  virtual int FileCopy(const std::string& from, const std::string& to, bool overwrite,
                       bool remove_source) = 0;
  // The effective user's permission bits on `path` (1 execute, 2 write,
  // 4 read) into *perm. 0 on success, negative on failure.
  virtual int AclPermGet(const std::string& path, int* perm) = 0;
  // 1 when `path` is a mount point, 0 when not, negative on failure.
  virtual int DirIsMountPoint(const std::string& path) = 0;
  // The ids of the user `name`, looked up under the platform's own lock.
  // 0 on success, negative when there is no such user.
  virtual int UserIds(const std::string& name, uint32_t* uid, uint32_t* gid) = 0;
};

// The installed host; never null.
Host* GetHost();

// Installs `host` (not owned; must outlive its use; nullptr restores the
// C-library host) and returns the one it replaces.
Host* SetHost(Host* host);

}  // namespace vellis
