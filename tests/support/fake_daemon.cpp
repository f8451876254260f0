#include "tests/support/fake_daemon.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <stdexcept>

#include "common/json_util.h"
#include "sdk/frame.h"
#include "sdk/socket_io.h"

namespace vellis::testing {

FakeDaemon::Reply FakeDaemon::Raw(const std::string& text) {
  return {sdk::EncodeFrameHeader(static_cast<uint32_t>(text.size())) + text};
}

FakeDaemon::Reply FakeDaemon::Success(const Json::Value& data) {
  Json::Value answer;
  answer["success"] = true;
  if (!data.isNull()) answer["data"] = data;
  return Raw(JsonToString(answer));
}

FakeDaemon::Reply FakeDaemon::Failure(int code, const std::string& msg) {
  Json::Value answer;
  answer["success"] = false;
  answer["error"]["code"] = code;
  answer["error"]["msg"] = msg;
  return Raw(JsonToString(answer));
}

FakeDaemon::FakeDaemon(const std::string& path) : path_(path) {
  sockaddr_un addr{};
  addr.sun_family = AF_UNIX;
  if (path.size() >= sizeof(addr.sun_path)) throw std::runtime_error("socket path too long");
  memcpy(addr.sun_path, path.c_str(), path.size() + 1);
  unlink(path.c_str());
  listen_fd_ = socket(AF_UNIX, SOCK_STREAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0);
  if (listen_fd_ < 0 || bind(listen_fd_, reinterpret_cast<sockaddr*>(&addr), sizeof(addr)) != 0 ||
      listen(listen_fd_, 16) != 0 || pipe2(stop_pipe_, O_CLOEXEC) != 0) {
    std::string why = strerror(errno);
    if (listen_fd_ >= 0) close(listen_fd_);
    throw std::runtime_error("fake daemon at " + path + ": " + why);
  }
  thread_ = std::thread([this] {
    while (!Stopped(listen_fd_, POLLIN, -1)) {
      int fd = accept4(listen_fd_, nullptr, nullptr, SOCK_CLOEXEC);
      if (fd < 0) continue;
      Serve(fd);
      close(fd);
    }
  });
}

FakeDaemon::~FakeDaemon() {
  Stop();
  close(listen_fd_);
  close(stop_pipe_[0]);
  close(stop_pipe_[1]);
  unlink(path_.c_str());
}

void FakeDaemon::Stop() {
  if (!thread_.joinable()) return;
  (void)!write(stop_pipe_[1], "x", 1);
  thread_.join();
}

void FakeDaemon::Push(const Reply& reply, int times) {
  std::lock_guard<std::mutex> lock(mu_);
  script_.insert(script_.end(), times, reply);
}

void FakeDaemon::SetAnswerBytes(const std::string& bytes) {
  std::lock_guard<std::mutex> lock(mu_);
  default_.bytes = bytes;
}

void FakeDaemon::SetCloseAfterAnswer(bool close) {
  std::lock_guard<std::mutex> lock(mu_);
  default_.close = close;
}

std::vector<Json::Value> FakeDaemon::Requests() const {
  std::vector<Json::Value> requests;
  for (const std::string& raw : RawRequests()) {
    if (!JsonFromString(requests.emplace_back(), raw)) requests.back() = Json::Value();
  }
  return requests;
}

std::vector<std::string> FakeDaemon::RawRequests() const {
  std::lock_guard<std::mutex> lock(mu_);
  return raw_;
}

bool FakeDaemon::Stopped(int fd, short events, int ms) {
  pollfd p[2] = {{fd, events, 0}, {stop_pipe_[0], POLLIN, 0}};
  while (poll(p, 2, ms) < 0 && errno == EINTR) {
  }
  return p[1].revents != 0;
}

void FakeDaemon::Serve(int fd) {
  std::unique_lock<std::mutex> lock(mu_);
  const Reply reply = script_.empty() ? default_ : script_.front();
  lock.unlock();
  // A request that does not arrive whole leaves the script as it was.
  std::string raw, why;
  const int64_t deadline = sdk::DeadlineAfter(2000);
  if (reply.read && sdk::ReadFrame(fd, &raw, deadline, &why).status != sdk::IoStatus::kOk) return;
  lock.lock();
  if (reply.read) raw_.push_back(raw);
  if (!script_.empty()) script_.pop_front();
  lock.unlock();
  sdk::IoLimits limits;
  limits.deadline_ms = deadline;
  const size_t piece = reply.ms_per_byte > 0 ? 1 : reply.bytes.size();
  for (size_t at = 0; at < reply.bytes.size(); at += piece) {
    if (sdk::WriteExact(fd, &reply.bytes[at], piece, limits).status != sdk::IoStatus::kOk ||
        (reply.ms_per_byte > 0 && Stopped(-1, 0, reply.ms_per_byte))) {
      return;
    }
  }
  // Held until the client hangs up, so that it never sees a reset; unread
  // request bytes do not end the wait.
  if (!reply.close) Stopped(fd, POLLRDHUP, -1);
}

}  // namespace vellis::testing
