// Process chores shared by every daemon: detaching, the pid file and the
// descriptor limit.
#pragma once

#include <string>

namespace vellis::daemon {

// openlog() options of a daemon: the pid, and a copy of each line on
// stderr in the foreground, except when stderr already goes to the journal
// ($JOURNAL_STREAM, set by systemd), where the copy would double each line.
int LogOptions(bool foreground);

// The stop signals (SIGTERM, SIGINT) as a descriptor to poll: blocks them
// in this thread and in every thread it starts later (call before starting
// threads), ignores SIGPIPE, and returns a close-on-exec signalfd. Throws
// Error kErrInternal when signalfd fails.
int StopSignalDescriptor();

// The pid file of the program `name`: "/var/run/<name>.pid"; resolve with
// RootPath() at use.
std::string PidFilePath(const std::string& name);

// Detaches from the terminal: forks (the parent exits 0), starts a new
// session, changes to "/" and points stdin, stdout and stderr at /dev/null.
// Throws Error kErrInternal when fork or setsid fails. Call before starting
// threads or opening databases.
void Daemonize();

// Holds the pid file, locked, for the object's lifetime: one daemon per
// root. The file holds the pid and a newline; it is removed on destruction.
class PidFile {
 public:
  // Creates the file's folder when missing. Throws Error kErrLock when
  // another live daemon holds the file, kErrInternal when it cannot be
  // written.
  explicit PidFile(std::string path);
  ~PidFile();
  PidFile(const PidFile&) = delete;
  PidFile& operator=(const PidFile&) = delete;

 private:
  std::string path_;
  int fd_ = -1;
};

// Raises the soft limit on open descriptors to the hard limit, so that a
// server can hold thousands of connections. Returns the soft limit now in
// force.
unsigned long RaiseDescriptorLimit();

}  // namespace vellis::daemon
