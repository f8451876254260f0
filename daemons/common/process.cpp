#include "daemons/common/process.h"

#include <fcntl.h>
#include <signal.h>
#include <sys/file.h>
#include <sys/resource.h>
#include <sys/signalfd.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>

#include "common/error.h"
#include "common/fs_util.h"

namespace vellis::daemon {

int StopSignalDescriptor() {
  sigset_t stop;
  sigemptyset(&stop);
  sigaddset(&stop, SIGTERM);
  sigaddset(&stop, SIGINT);
  pthread_sigmask(SIG_BLOCK, &stop, nullptr);
  signal(SIGPIPE, SIG_IGN);
  const int fd = signalfd(-1, &stop, SFD_CLOEXEC);
  if (fd < 0) throw Error(kErrInternal, std::string("signalfd failed: ") + strerror(errno));
  return fd;
}

int LogOptions(bool foreground) {
  const char* journal = getenv("JOURNAL_STREAM");
  return LOG_PID | (foreground && !(journal && *journal) ? LOG_PERROR : 0);
}

std::string PidFilePath(const std::string& name) { return "/var/run/" + name + ".pid"; }

void Daemonize() {
  pid_t pid = fork();
  if (pid < 0) throw Error(kErrInternal, std::string("fork: ") + strerror(errno));
  if (pid > 0) _exit(0);
  if (setsid() < 0) throw Error(kErrInternal, std::string("setsid: ") + strerror(errno));
  if (chdir("/") != 0) throw Error(kErrInternal, std::string("chdir: ") + strerror(errno));
  int null = open("/dev/null", O_RDWR | O_CLOEXEC);
  if (null >= 0) {
    dup2(null, STDIN_FILENO);
    dup2(null, STDOUT_FILENO);
    dup2(null, STDERR_FILENO);
    if (null > STDERR_FILENO) close(null);
  }
}

PidFile::PidFile(std::string path) : path_(std::move(path)) {
  MakeDirs(Dirname(path_));
  fd_ = open(path_.c_str(), O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0644);
  if (fd_ < 0) throw Error(kErrInternal, "open " + path_ + ": " + strerror(errno));
  if (flock(fd_, LOCK_EX | LOCK_NB) != 0) {
    close(fd_);
    fd_ = -1;
    throw Error(kErrLock, "Another instance holds " + path_);
  }
  std::string text = std::to_string(getpid()) + "\n";
  if (ftruncate(fd_, 0) != 0 ||
      write(fd_, text.data(), text.size()) != static_cast<ssize_t>(text.size())) {
    int err = errno;
    unlink(path_.c_str());
    close(fd_);
    fd_ = -1;
    throw Error(kErrInternal, "write " + path_ + ": " + strerror(err));
  }
}

PidFile::~PidFile() {
  if (fd_ >= 0) {
    unlink(path_.c_str());
    close(fd_);
  }
}

unsigned long RaiseDescriptorLimit() {
  rlimit limit;
  if (getrlimit(RLIMIT_NOFILE, &limit) != 0) return 0;
  if (limit.rlim_cur < limit.rlim_max) {
    rlimit raised = limit;
    raised.rlim_cur = limit.rlim_max;
    if (setrlimit(RLIMIT_NOFILE, &raised) == 0) limit = raised;
  }
  return static_cast<unsigned long>(limit.rlim_cur);
}

}  // namespace vellis::daemon
