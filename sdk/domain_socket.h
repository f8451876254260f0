// Connections to the package's daemons over Unix-domain stream sockets: the
// client side of the package's one wire.
//
// One message each way is a frame of sdk/frame.h: a 4-byte length in host
// byte order, then the JSON text. Send and Recv move one whole message
// (sdk/socket_io.h). Every
// transfer has a deadline, so a peer that stops reading or writing (or that
// trickles one byte at a time) cannot hang the caller: the call fails when
// the whole message has not moved within the time-out.
//
// Any failure of Send or Recv closes the connection (the stream is out of
// step after a partial message) and writes one error line to the log that
// says why. Sends never raise SIGPIPE.
//
// A connection is used by one thread at a time.
#pragma once

#include <json/json.h>

#include <string>

namespace vellis::sdk {

// Time a whole outgoing message may take to be accepted by the peer.
inline constexpr int kDefaultSendTimeoutMs = 30 * 1000;
// Time a whole incoming message may take to arrive, counted from the call of
// Recv. The search daemon answers a busy state at once (busy codes); an
// answer that takes longer than this is treated as a dead daemon.
inline constexpr int kDefaultRecvTimeoutMs = 600 * 1000;

// A connected stream socket: sending and receiving framed messages.
class SockConnection {
 public:
  // Not connected: the descriptor is -1 until a subclass connects.
  SockConnection() = default;
  // Takes ownership of a connected descriptor (a server's accepted socket).
  explicit SockConnection(int fd) : fd_(fd) {}
  // Closes the descriptor if it is open.
  virtual ~SockConnection();

  SockConnection(const SockConnection&) = delete;
  SockConnection& operator=(const SockConnection&) = delete;

  // Sends `message` as one frame. False when not connected, when the message
  // is empty or longer than kMaxMessageSize, when the peer has gone, or on
  // time-out.
  bool Send(const std::string& message);

  // Receives one frame into `message` (replacing its contents). False when
  // not connected, on end of stream or a socket error before the whole
  // message, when the announced length is 0 or above kMaxMessageSize
  // (refused before allocating), or on time-out.
  bool Recv(std::string& message);

  // Closes the descriptor if it is not -1 and sets it back to -1.
  void Disconnect();

  // Time-outs in milliseconds for the following calls; values below 1 are
  // taken as 1.
  void SetTimeouts(int send_ms, int recv_ms);

  int fd() const { return fd_; }

 protected:
  int send_timeout_ms() const { return send_timeout_ms_; }

  int fd_ = -1;

 private:
  // Logs why the connection failed and closes it; returns false.
  bool Fail(const std::string& why);

  int send_timeout_ms_ = kDefaultSendTimeoutMs;
  int recv_timeout_ms_ = kDefaultRecvTimeoutMs;
};

// A client connection to the Unix-domain stream socket at a path.
class DomainSockConnection : public SockConnection {
 public:
  explicit DomainSockConnection(const std::string& path) : path_(path) {}

  // Connects (closing any earlier connection first). False when the path does
  // not fit a socket address, when nobody listens there, or when the daemon
  // does not take the connection within the send time-out (its accept queue
  // full); errno then says why. The descriptor is close-on-exec.
  bool Connect();

 private:
  std::string path_;
};

// One request, one answer: connects to the socket at `socket_path`, sends
// `request` as one frame, reads one frame back (waiting at most
// `timeout_ms`) and closes. Returns the answer's text. Throws Error 913
// (kErrDaemonUnreachable) with a reason naming the step and the socket when
// the connection, the send or the receive fails. Thread-safe.
std::string ExchangeText(const std::string& socket_path, const std::string& request,
                         int timeout_ms = 60 * 1000);

// ExchangeText on JSON: `request` serialised, the answer parsed. Throws
// Error 913 also when the answer is not a JSON object with a bool "success".
Json::Value Exchange(const std::string& socket_path, const Json::Value& request,
                     int timeout_ms = 60 * 1000);

}  // namespace vellis::sdk
