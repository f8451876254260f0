// The search daemon of this build run as a child process on the test root's
// socket ($VELLIS_TEST_BINARY_DIR/bin/vellis-searchd in the foreground).
#pragma once

#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdlib>
#include <string>

#include "common/root_path.h"
#include "fileindex/elastic/comm.h"
#include "sdk/domain_socket.h"

namespace vellis::testing {

// Stops the child `*pid` with `sig`, reaps it and clears `*pid`. Returns its
// exit status, or minus the signal that ended it; -1000 when none ran.
// Never signals without a child: kill(-1) would reach every process.
inline int StopChild(pid_t* pid, int sig) {
  int status = 0;
  if (*pid <= 0 || kill(*pid, sig) != 0 || waitpid(*pid, &status, 0) != *pid) return -1000;
  *pid = -1;
  return WIFEXITED(status) ? WEXITSTATUS(status) : -WTERMSIG(status);
}

class SearchdProcess {
 public:
  // Stops a daemon that still runs (SIGKILL).
  ~SearchdProcess() { Stop(SIGKILL); }

  // Starts the daemon and waits until its socket takes connections. False
  // when it exited or did not come up within 5 s.
  bool Start() {
    if ((pid_ = fork()) == 0) {
      if (freopen("/dev/null", "w", stderr) == nullptr) _exit(126);
      execl(bin_.c_str(), "vellis-searchd", "-f", "--recv-timeout-ms=300", nullptr);
      _exit(127);
    }
    for (int i = 0; i < 500; ++i, usleep(10000)) {
      if (sdk::DomainSockConnection(socket_).Connect()) return true;
      if (pid_ > 0 && waitpid(pid_, nullptr, WNOHANG) == pid_) break;
    }
    pid_ = -1;
    return false;
  }
  // Sends `sig` and returns the exit status, or minus the signal; -1000
  // when none ran. Never signals without a daemon: kill(-1) would reach
  // every process.
  int Stop(int sig) { return StopChild(&pid_, sig); }

  pid_t pid() const { return pid_; }
  const std::string& bin() const { return bin_; }
  const std::string& socket() const { return socket_; }

 private:
  const char* dir_ = getenv("VELLIS_TEST_BINARY_DIR");
  std::string bin_ = std::string(dir_ ? dir_ : ".") + "/bin/vellis-searchd";
  std::string socket_ = RootPath(kElasticSocketPath);
  pid_t pid_ = -1;
};

}  // namespace vellis::testing
