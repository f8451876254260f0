// A Unix-domain stream server on its own thread, the base of the fake
// daemons of the tests.
#pragma once

#include <atomic>
#include <string>
#include <thread>

namespace vellis::testing {

class FakeUnixServer {
 public:
  // Binds and listens at `path` (an old socket file there is removed).
  // Throws std::runtime_error when that fails. Serving starts with Start().
  explicit FakeUnixServer(const std::string& path);
  // Stops serving and removes the socket file. A subclass calls Stop() in
  // its own destructor, before its members go.
  virtual ~FakeUnixServer();
  FakeUnixServer(const FakeUnixServer&) = delete;
  FakeUnixServer& operator=(const FakeUnixServer&) = delete;

  // Starts the serving thread: connections are accepted and served one after
  // another, in order.
  void Start();
  // Ends the serving thread (an open connection is abandoned). Idempotent.
  void Stop();

  const std::string& path() const { return path_; }

 protected:
  // Serves one accepted connection; owns `fd` and closes it.
  virtual void Serve(int fd) = 0;
  // Waits up to `timeout_ms` (-1: no limit) until `fd` is readable or has
  // hung up. False when the wait ended because of Stop() or the time-out.
  bool WaitReadable(int fd, int timeout_ms);
  // Waits `ms` milliseconds unless stopped first. False when stopped.
  bool Pause(int ms);

 private:
  void Run();

  std::string path_;
  int listen_fd_ = -1;
  int stop_pipe_[2] = {-1, -1};
  std::thread thread_;
};

}  // namespace vellis::testing
