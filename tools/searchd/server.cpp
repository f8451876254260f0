#include "tools/searchd/server.h"

#include <poll.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <condition_variable>
#include <cstring>
#include <deque>
#include <mutex>
#include <thread>
#include <vector>

#include "common/error.h"
#include "common/json_util.h"
#include "sdk/platform.h"
#include "tools/searchd/error_codes.h"
#include "tools/searchd/frame.h"

namespace vellis::searchd {
namespace {

constexpr int kListenBacklog = 128;
// Quiet time before upkeep is looked at again when none was pending.
constexpr int kIdleMs = 1000;

[[noreturn]] void Fail(const std::string& step) {
  throw Error(kErrInternal, step + ": " + strerror(errno));
}

}  // namespace

Server::Server(Handler& handler, std::string socket_path)
    : handler_(handler), socket_path_(std::move(socket_path)) {}

Server::~Server() {
  if (listen_fd_ >= 0) {
    close(listen_fd_);
    unlink(socket_path_.c_str());
  }
}

void Server::Listen() {
  struct sockaddr_un addr;
  memset(&addr, 0, sizeof(addr));
  addr.sun_family = AF_UNIX;
  if (socket_path_.size() >= sizeof(addr.sun_path)) {
    throw Error(kErrInternal, "Socket path too long: " + socket_path_);
  }
  memcpy(addr.sun_path, socket_path_.c_str(), socket_path_.size());
  int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  if (fd < 0) Fail("socket");
  // Only a socket file is replaced; anything else at the path is an error.
  struct stat st;
  if (lstat(socket_path_.c_str(), &st) == 0 && S_ISSOCK(st.st_mode)) unlink(socket_path_.c_str());
  if (bind(fd, reinterpret_cast<struct sockaddr*>(&addr), sizeof(addr)) != 0) {
    int err = errno;
    close(fd);
    errno = err;
    Fail("bind " + socket_path_);
  }
  chmod(socket_path_.c_str(), 0660);
  if (listen(fd, kListenBacklog) != 0) {
    int err = errno;
    close(fd);
    unlink(socket_path_.c_str());
    errno = err;
    Fail("listen");
  }
  listen_fd_ = fd;
}

void Server::ServeConnection(int fd) {
  std::string request;
  FrameStatus st = ReadFrame(fd, request, recv_timeout_ms_);
  if (st == FrameStatus::kOk) {
    std::string answer = handler_.HandleText(request);
    if (answer.size() > kMaxMessageBytes) {
      answer = JsonToString(
          ErrorAnswer(kErrBadQuery,
                      "The answer would exceed the message limit; ask for fewer documents or "
                      "fields"));
    }
    st = WriteFrame(fd, answer);
    if (st != FrameStatus::kOk) {
      sdk::GetPlatform()->Syslog(
          LOG_WARNING, std::string("searchd: answer not delivered: ") + FrameStatusText(st));
    }
  } else if (st != FrameStatus::kClosed) {
    sdk::GetPlatform()->Syslog(LOG_WARNING,
                               std::string("searchd: request dropped: ") + FrameStatusText(st));
  }
  close(fd);
}

bool Server::Step(int timeout_ms) {
  struct pollfd p = {listen_fd_, POLLIN, 0};
  if (poll(&p, 1, timeout_ms) <= 0) return false;
  int fd = accept4(listen_fd_, nullptr, nullptr, SOCK_CLOEXEC);
  if (fd < 0) return false;
  ServeConnection(fd);
  return true;
}

void Server::Run(int stop_fd, int workers) {
  std::mutex mu;
  std::condition_variable cv;
  std::deque<int> pending;
  bool stopping = false;
  std::vector<std::thread> threads;
  for (int i = 0; i < (workers < 1 ? 1 : workers); ++i) {
    threads.emplace_back([&] {
      for (;;) {
        int fd;
        {
          std::unique_lock<std::mutex> lock(mu);
          cv.wait(lock, [&] { return stopping || !pending.empty(); });
          if (pending.empty()) return;
          fd = pending.front();
          pending.pop_front();
        }
        ServeConnection(fd);
      }
    });
  }
  bool merging = false;
  for (;;) {
    struct pollfd p[2] = {{listen_fd_, POLLIN, 0}, {stop_fd, POLLIN, 0}};
    // Upkeep runs in short steps after a quiet second without connections,
    // then step after step while work remains and nobody connects.
    int n = poll(p, 2, merging ? 0 : kIdleMs);
    if (n == 0) {
      bool idle;
      {
        std::lock_guard<std::mutex> lock(mu);
        idle = pending.empty();
      }
      merging = idle && handler_.Idle();
      continue;
    }
    merging = false;
    if (n < 0 && errno == EINTR) continue;
    if (n < 0 || (p[1].revents & (POLLIN | POLLHUP | POLLERR)) != 0) break;
    if ((p[0].revents & POLLIN) == 0) continue;
    int fd = accept4(listen_fd_, nullptr, nullptr, SOCK_CLOEXEC);
    if (fd < 0) continue;
    std::lock_guard<std::mutex> lock(mu);
    pending.push_back(fd);
    cv.notify_one();
  }
  {
    std::lock_guard<std::mutex> lock(mu);
    stopping = true;
  }
  cv.notify_all();
  for (std::thread& t : threads) t.join();
}

}  // namespace vellis::searchd
