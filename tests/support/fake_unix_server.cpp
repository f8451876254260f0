#include "tests/support/fake_unix_server.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <stdexcept>

namespace vellis::testing {

FakeUnixServer::FakeUnixServer(const std::string& path) : path_(path) {
  sockaddr_un addr;
  memset(&addr, 0, sizeof(addr));
  addr.sun_family = AF_UNIX;
  if (path.size() >= sizeof(addr.sun_path)) throw std::runtime_error("socket path too long");
  memcpy(addr.sun_path, path.c_str(), path.size() + 1);
  unlink(path.c_str());
  listen_fd_ = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  if (listen_fd_ < 0 || bind(listen_fd_, reinterpret_cast<sockaddr*>(&addr), sizeof(addr)) != 0 ||
      listen(listen_fd_, 16) != 0 || pipe2(stop_pipe_, O_CLOEXEC) != 0) {
    std::string why = strerror(errno);
    if (listen_fd_ >= 0) close(listen_fd_);
    throw std::runtime_error("fake server at " + path + ": " + why);
  }
}

FakeUnixServer::~FakeUnixServer() {
  Stop();
  close(listen_fd_);
  close(stop_pipe_[0]);
  close(stop_pipe_[1]);
  unlink(path_.c_str());
}

void FakeUnixServer::Start() {
  thread_ = std::thread([this] { Run(); });
}

void FakeUnixServer::Stop() {
  if (!thread_.joinable()) return;
  char c = 'x';
  (void)!write(stop_pipe_[1], &c, 1);
  thread_.join();
}

bool FakeUnixServer::WaitReadable(int fd, int timeout_ms) {
  pollfd p[2] = {{fd, POLLIN, 0}, {stop_pipe_[0], POLLIN, 0}};
  for (;;) {
    int rc = poll(p, 2, timeout_ms);
    if (rc < 0 && errno == EINTR) continue;
    if (rc <= 0) return false;
    return p[1].revents == 0;
  }
}

bool FakeUnixServer::Pause(int ms) {
  pollfd p{stop_pipe_[0], POLLIN, 0};
  return poll(&p, 1, ms) == 0;
}

void FakeUnixServer::Run() {
  while (WaitReadable(listen_fd_, -1)) {
    int fd = accept4(listen_fd_, nullptr, nullptr, SOCK_CLOEXEC);
    if (fd >= 0) Serve(fd);
  }
}

}  // namespace vellis::testing
