// An advisory lock on a companion file, held for the object's lifetime.
//
// Serialises processes (the indexing daemon, management operations and
// hooks) that read-modify-write the same configuration, status and queue
// files.
#pragma once

#include <string>

namespace vellis {

// Lock files of the configuration and status files; resolve them with
// RootPath() before use.
inline constexpr char kFolderCfgLockPath[] = "/tmp/vellis_cfg_folder.lock";
inline constexpr char kStatusCfgLockPath[] = "/tmp/vellis_cfg_fi_status.lock";

class LockFile {
 public:
  // The number of non-blocking attempts before giving up.
  static constexpr int kMaxAttempts = 64;

  // Returns only when the lock is held (LOCK_EX, or LOCK_SH when `exclusive`
  // is false). The file is created when missing (mode 0644 before umask) and
  // never removed. Never blocks: each of up to 64 attempts opens the file
  // afresh and tries a non-blocking lock, sleeping a random 0 to 0.9 s
  // (through the platform) after a busy attempt.
  // Throws Error 506: "open failed, path=<path>, reason=<text>" when the
  // file cannot be opened (at once, without retry; a symbolic link, FIFO or
  // anything but a regular file is refused this way), the system's text for
  // an unexpected flock error, or "Exceed max retry, path=<path>" after 64
  // busy attempts.
  LockFile(const std::string& path, bool exclusive);

  // Releases the lock, then closes the descriptor. Never throws.
  ~LockFile();

  LockFile(const LockFile&) = delete;
  LockFile& operator=(const LockFile&) = delete;

 private:
  int fd_;
  std::string path_;
};

}  // namespace vellis
