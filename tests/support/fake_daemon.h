// A fake daemon on a real Unix socket, the search daemon or the indexing
// daemon (both speak the same wire). Connections are served one after
// another on the fake's own thread; each request frame is recorded and
// answered with the next scripted reply, or the default one once the script
// is used up. Replies are raw bytes, so that the fake can misbehave on
// purpose: a bad header, silence, an early close or one mid-message, a
// trickled answer, a request never read.
#pragma once

#include <fcntl.h>
#include <json/json.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <deque>
#include <mutex>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

#include "common/json_util.h"
#include "sdk/frame.h"
#include "sdk/socket_io.h"

namespace vellis::testing {

class FakeDaemon {
 public:
  struct Reply {
    std::string bytes;    // written as they are once the request is read
    bool close = false;   // close right after `bytes`, else wait for the client to hang up
    int ms_per_byte = 0;  // above 0: `bytes` one at a time, this far apart
    bool read = true;     // false: the request is neither read nor recorded
  };
  // `text` as one frame, and the daemon's usual answers so.
  static Reply Raw(const std::string& text) {
    return {sdk::EncodeFrameHeader(static_cast<uint32_t>(text.size())) + text};
  }
  static Reply Success(const Json::Value& data = Json::Value()) {
    return Raw(data.isNull() ? R"({"success":true})"
                             : R"({"success":true,"data":)" + JsonToString(data) + "}");
  }
  static Reply Failure(int code, const std::string& msg) {
    return Raw(R"({"success":false,"error":{"code":)" + std::to_string(code) + R"(,"msg":)" +
               JsonToString(Json::Value(msg)) + "}}");
  }
  static Reply Busy(int code = 1400) { return Failure(code, "busy"); }

  // Serves at `path` at once (replacing a leftover socket file); throws
  // std::runtime_error when it cannot.
  explicit FakeDaemon(const std::string& path) : path_(path) {
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
  // Ends serving (an open connection is abandoned) and removes the socket file.
  ~FakeDaemon() {
    (void)!write(stop_pipe_[1], "x", 1);
    thread_.join();
    for (int fd : {listen_fd_, stop_pipe_[0], stop_pipe_[1]}) close(fd);
    unlink(path_.c_str());
  }

  void Push(const Reply& reply, int times = 1) {
    std::lock_guard<std::mutex> lock(mu_);
    script_.insert(script_.end(), times, reply);
  }
  // Change the default reply, at first Raw({"success":true}).
  void SetAnswerBytes(const std::string& bytes) {
    std::lock_guard<std::mutex> lock(mu_);
    default_.bytes = bytes;
  }
  void SetCloseAfterAnswer(bool close) {
    std::lock_guard<std::mutex> lock(mu_);
    default_.close = close;
  }

  // Requests read, in order (null for one that is not JSON), and their text.
  std::vector<Json::Value> Requests() const {
    std::vector<Json::Value> requests;
    for (const std::string& raw : RawRequests()) {
      if (!JsonFromString(requests.emplace_back(), raw)) requests.back() = Json::Value();
    }
    return requests;
  }
  std::vector<Json::Value> Commands() const { return Requests(); }
  std::vector<std::string> RawRequests() const {
    std::lock_guard<std::mutex> lock(mu_);
    return raw_;
  }

 private:
  // Polls `fd` for `events` up to `ms` (-1: no limit); true once told to stop.
  bool Stopped(int fd, short events, int ms) {
    pollfd p[2] = {{fd, events, 0}, {stop_pipe_[0], POLLIN, 0}};
    while (poll(p, 2, ms) < 0 && errno == EINTR) continue;
    return p[1].revents != 0;
  }

  void Serve(int fd) {
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

  std::string path_;
  int listen_fd_ = -1;
  int stop_pipe_[2] = {-1, -1};
  mutable std::mutex mu_;
  std::deque<Reply> script_;
  Reply default_ = Raw(R"({"success":true})");
  std::vector<std::string> raw_;
  std::thread thread_;
};

using FakeSearchDaemon = FakeDaemon;
using FakeIndexDaemon = FakeDaemon;

}  // namespace vellis::testing
