// The socket side of the daemon: a Unix-domain stream socket where each
// connection carries one framed request and its framed answer (frame.h).
//
// A connection whose frame is refused (length 0 or above the maximum),
// truncated or too slow (kRecvTimeoutMs) is closed without an answer and
// logged; it never reaches the handler. An answer too large for one message
// is replaced by error 1110.
#pragma once

#include <string>

#include "tools/searchd/frame.h"
#include "tools/searchd/handler.h"

namespace vellis::searchd {

class Server {
 public:
  // `handler` is not owned and must outlive the server.
  Server(Handler& handler, std::string socket_path);
  // Closes the listening socket and removes its file.
  ~Server();
  Server(const Server&) = delete;
  Server& operator=(const Server&) = delete;

  // Binds and listens (mode 0660; a leftover socket file is replaced; the
  // descriptor is close-on-exec). Throws Error kErrInternal naming the step.
  void Listen();

  // Waits up to `timeout_ms` for one connection and serves it on the calling
  // thread. Returns false when none arrived.
  bool Step(int timeout_ms);

  // Accepts connections until `stop_fd` becomes readable, serving them on
  // `workers` threads. Connections accepted before the stop are answered
  // before Run returns.
  void Run(int stop_fd, int workers);

  // Reads one request from the connected `fd`, answers it and closes `fd`.
  void ServeConnection(int fd);

  // The time a whole request may take to arrive (default kRecvTimeoutMs).
  void set_recv_timeout_ms(int ms) { recv_timeout_ms_ = ms; }

 private:
  int recv_timeout_ms_ = kRecvTimeoutMs;
  Handler& handler_;
  std::string socket_path_;
  int listen_fd_ = -1;
};

}  // namespace vellis::searchd
