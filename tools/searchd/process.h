// Process chores of the daemon: detaching and the pid file.
#pragma once

#include <string>

namespace vellis::searchd {

// The daemon's pid file; resolve with RootPath() at use.
inline constexpr char kPidFilePath[] = "/var/run/vellis-searchd.pid";

// Detaches from the terminal: forks (the parent exits 0), starts a new
// session, changes to "/" and points stdin, stdout and stderr at /dev/null.
// Throws Error kErrInternal when fork or setsid fails. Call before starting
// threads or opening databases.
void Daemonize();

// Holds the pid file, locked, for the object's lifetime: one daemon per
// root. The file holds the pid and a newline; it is removed on destruction.
class PidFile {
 public:
  // Throws Error kErrLock when another live daemon holds the file,
  // kErrInternal when it cannot be written.
  explicit PidFile(std::string path);
  ~PidFile();
  PidFile(const PidFile&) = delete;
  PidFile& operator=(const PidFile&) = delete;

 private:
  std::string path_;
  int fd_ = -1;
};

}  // namespace vellis::searchd
