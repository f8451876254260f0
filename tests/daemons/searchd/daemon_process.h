// The built vellis-searchd run as a child process under the test's root.
#pragma once

#include <signal.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <thread>

namespace vellis::searchd::testing {

inline std::string DaemonBinary() {
  const char* dir = getenv("VELLIS_TEST_BINARY_DIR");
  return std::string(dir ? dir : ".") + "/bin/vellis-searchd";
}

// A connected descriptor to the socket at `path`, or -1.
inline int ConnectTo(const std::string& path) {
  struct sockaddr_un addr;
  memset(&addr, 0, sizeof(addr));
  addr.sun_family = AF_UNIX;
  strncpy(addr.sun_path, path.c_str(), sizeof(addr.sun_path) - 1);
  int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  if (connect(fd, reinterpret_cast<struct sockaddr*>(&addr), sizeof(addr)) != 0) {
    close(fd);
    return -1;
  }
  return fd;
}

class DaemonProcess {
 public:
  DaemonProcess() = default;
  DaemonProcess(const DaemonProcess&) = delete;
  DaemonProcess& operator=(const DaemonProcess&) = delete;
  // A daemon still running is killed.
  ~DaemonProcess() {
    if (pid_ > 0) Stop(SIGKILL);
  }

  // Starts the daemon in the foreground with `extra_arg` (may be empty) and
  // waits until `socket` answers connections. Returns an empty string, or
  // why it did not come up.
  std::string Start(const std::string& socket, const std::string& extra_arg = "") {
    pid_ = fork();
    if (pid_ == 0) {
      // The daemon copies its log lines to stderr in the foreground.
      if (freopen("/dev/null", "w", stderr) == nullptr) _exit(126);
      const std::string bin = DaemonBinary();
      if (extra_arg.empty()) {
        execl(bin.c_str(), "vellis-searchd", "--foreground", static_cast<char*>(nullptr));
      } else {
        execl(bin.c_str(), "vellis-searchd", "--foreground", extra_arg.c_str(),
              static_cast<char*>(nullptr));
      }
      _exit(127);
    }
    for (int i = 0; i < 500; ++i) {
      int status = 0;
      if (waitpid(pid_, &status, WNOHANG) == pid_) {
        pid_ = -1;
        return "daemon " + DaemonBinary() + " exited at start, status " + std::to_string(status);
      }
      int fd = ConnectTo(socket);
      if (fd >= 0) {
        close(fd);
        return "";
      }
      std::this_thread::sleep_for(std::chrono::milliseconds(10));
    }
    return "daemon did not come up";
  }

  // Sends `sig`, waits, and returns the exit status (or minus the signal).
  // Never signals when no daemon runs: kill(-1) would reach every process.
  int Stop(int sig) {
    if (pid_ <= 0) return -1;
    kill(pid_, sig);
    int status = 0;
    waitpid(pid_, &status, 0);
    pid_ = -1;
    return WIFEXITED(status) ? WEXITSTATUS(status) : -WTERMSIG(status);
  }

  pid_t pid() const { return pid_; }

 private:
  pid_t pid_ = -1;
};

}  // namespace vellis::searchd::testing
