// The indexing daemon of this build run as a child process under the test
// root ($VELLIS_TEST_BINARY_DIR/bin/vellis-fileindexd in the foreground),
// its log lines in a file beside it.
#pragma once

#include <fcntl.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdlib>
#include <string>
#include <vector>

#include "common/root_path.h"
#include "daemons/fileindexd/indexing_service.h"
#include "sdk/domain_socket.h"
#include "tests/support/searchd_process.h"
#include "tests/support/temp_root.h"

namespace vellis::testing {

class FileindexdProcess {
 public:
  // Stops a daemon that still runs (SIGKILL).
  ~FileindexdProcess() { Stop(SIGKILL); }

  // Starts the daemon with `args` after "-f" and waits until its command
  // socket takes connections. False when it exited or did not come up
  // within 10 s. Its standard error (the log, in the foreground) is
  // appended to log_path().
  bool Start(const std::vector<std::string>& args = {"--settle-ms=50"}) {
    std::vector<std::string> argv = {"vellis-fileindexd", "-f"};
    argv.insert(argv.end(), args.begin(), args.end());
    std::vector<char*> cargv;
    for (std::string& a : argv) cargv.push_back(a.data());
    cargv.push_back(nullptr);
    if ((pid_ = fork()) == 0) {
      const int fd = open(log_.c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0644);
      if (fd < 0 || dup2(fd, STDERR_FILENO) < 0) _exit(126);
      execv(bin_.c_str(), cargv.data());
      _exit(127);
    }
    for (int i = 0; i < 1000 && Running(); ++i, usleep(10000)) {
      if (sdk::DomainSockConnection(socket_).Connect()) return true;
    }
    Stop(SIGKILL);
    return false;
  }
  // Sends `sig` and returns the exit status, or minus the signal; -1000
  // when none ran. Never signals without a daemon: kill(-1) would reach
  // every process.
  int Stop(int sig) { return StopChild(&pid_, sig); }
  // Sends `sig` without waiting (SIGSTOP, SIGCONT). False without a daemon.
  bool Signal(int sig) { return pid_ > 0 && kill(pid_, sig) == 0; }
  // True while the daemon has not exited; an exited one is reaped, its
  // status kept in exit_status().
  bool Running() {
    int status = 0;
    if (pid_ <= 0) return false;
    if (waitpid(pid_, &status, WNOHANG) != pid_) return true;
    exit_status_ = WIFEXITED(status) ? WEXITSTATUS(status) : -WTERMSIG(status);
    pid_ = -1;
    return false;
  }
  int exit_status() const { return exit_status_; }

  pid_t pid() const { return pid_; }
  const std::string& socket() const { return socket_; }
  const std::string& log_path() const { return log_; }
  // The end of the log, for failure messages.
  std::string LogTail(size_t bytes = 4000) const {
    const std::string log = ReadFile(log_);
    return log.size() > bytes ? "..." + log.substr(log.size() - bytes) : log;
  }

 private:
  const char* dir_ = getenv("VELLIS_TEST_BINARY_DIR");
  std::string bin_ = std::string(dir_ ? dir_ : ".") + "/bin/vellis-fileindexd";
  std::string socket_ = RootPath(fileindexd::kCommandSocketPath);
  std::string log_ = RootPath("/fileindexd.log");
  pid_t pid_ = -1;
  int exit_status_ = -1000;
};

}  // namespace vellis::testing
