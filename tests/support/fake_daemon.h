// A fake daemon on a real Unix socket, the search daemon or the indexing
// daemon (both speak the same wire). Connections are served one after
// another on the fake's own thread; each request frame is recorded and
// answered with the next scripted reply, or the default one once the script
// is used up. Replies are raw bytes, so that the fake can misbehave on
// purpose: a bad header, silence, an early close or one mid-message, a
// trickled answer, a request never read.
#pragma once

#include <json/json.h>

#include <deque>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

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
  static Reply Raw(const std::string& text);
  static Reply Success(const Json::Value& data = Json::Value());
  static Reply Failure(int code, const std::string& msg);
  static Reply Busy(int code = 1400) { return Failure(code, "busy"); }

  // Serves at `path` at once (replacing a leftover socket file); throws
  // std::runtime_error when it cannot. The destructor removes the file.
  explicit FakeDaemon(const std::string& path);
  ~FakeDaemon();
  FakeDaemon(const FakeDaemon&) = delete;
  FakeDaemon& operator=(const FakeDaemon&) = delete;
  // Ends serving (an open connection is abandoned). Idempotent.
  void Stop();

  void Push(const Reply& reply, int times = 1);
  // Change the default reply, at first Raw({"success":true}).
  void SetAnswerBytes(const std::string& bytes);
  void SetCloseAfterAnswer(bool close);

  // Requests read, in order (null for one that is not JSON), and their text.
  std::vector<Json::Value> Requests() const;
  std::vector<Json::Value> Commands() const { return Requests(); }
  std::vector<std::string> RawRequests() const;

 private:
  void Serve(int fd);
  // Polls `fd` for `events` up to `ms` (-1: no limit); true if Stop() came.
  bool Stopped(int fd, short events, int ms);

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
