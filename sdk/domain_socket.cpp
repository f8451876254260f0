#include "sdk/domain_socket.h"

#include <sys/socket.h>
#include <sys/time.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "common/error.h"
#include "common/json_util.h"
#include "common/log.h"
#include "sdk/frame.h"
#include "sdk/socket_io.h"

namespace vellis::sdk {

SockConnection::~SockConnection() { Disconnect(); }

void SockConnection::Disconnect() {
  if (fd_ != -1) {
    close(fd_);
    fd_ = -1;
  }
}

void SockConnection::SetTimeouts(int send_ms, int recv_ms) {
  send_timeout_ms_ = send_ms < 1 ? 1 : send_ms;
  recv_timeout_ms_ = recv_ms < 1 ? 1 : recv_ms;
}

bool SockConnection::Fail(const std::string& why) {
  VELLIS_LOG_ERR("Connection fd=%d closed: %s", fd_, why.c_str());
  Disconnect();
  return false;
}

bool SockConnection::Send(const std::string& message) {
  if (fd_ == -1) return false;
  IoResult r = WriteFrame(fd_, message, DeadlineAfter(send_timeout_ms_));
  if (r.status == IoStatus::kBadLength) {
    return Fail("send refused: message length " + std::to_string(message.size()) +
                " is 0 or above the maximum of " + std::to_string(kMaxMessageSize) + " bytes");
  }
  if (r.status == IoStatus::kTimeout) {
    return Fail("send timed out after " + std::to_string(send_timeout_ms_) + " ms, " +
                std::to_string(r.done) + " bytes sent");
  }
  if (r.status != IoStatus::kOk) return Fail("send failed: " + IoResultText(r));
  errno = 0;  // EAGAIN of the non-blocking attempts is not news to callers
  return true;
}

bool SockConnection::Recv(std::string& message) {
  if (fd_ == -1) return false;
  std::string why;
  IoResult r = ReadFrame(fd_, &message, DeadlineAfter(recv_timeout_ms_), &why);
  switch (r.status) {
    case IoStatus::kOk:
      errno = 0;
      return true;
    case IoStatus::kBadLength:
      return Fail("receive refused: " + why);
    case IoStatus::kTimeout:
      return Fail("receive timed out after " + std::to_string(recv_timeout_ms_) + " ms, " +
                  std::to_string(r.done) + " bytes received");
    case IoStatus::kClosed:
    case IoStatus::kTruncated:
      return Fail("peer closed the connection after " + std::to_string(r.done) + " bytes");
    case IoStatus::kError:
      break;
  }
  return Fail("recv failed: " + IoResultText(r));
}

bool DomainSockConnection::Connect() {
  Disconnect();
  sockaddr_un addr;
  memset(&addr, 0, sizeof(addr));
  addr.sun_family = AF_UNIX;
  if (path_.size() >= sizeof(addr.sun_path)) {
    errno = ENAMETOOLONG;
    return false;
  }
  memcpy(addr.sun_path, path_.c_str(), path_.size() + 1);
  int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  if (fd < 0) return false;
  // On a Unix socket the send time-out also bounds a connect to a daemon
  // whose accept queue is full (transfers use their own deadlines).
  const int ms = send_timeout_ms();
  timeval tv{ms / 1000, (ms % 1000) * 1000};
  int rc = setsockopt(fd, SOL_SOCKET, SO_SNDTIMEO, &tv, sizeof(tv));
  if (rc == 0) {
    do {
      rc = connect(fd, reinterpret_cast<sockaddr*>(&addr), sizeof(addr));
    } while (rc != 0 && errno == EINTR);
  }
  if (rc != 0) {
    int saved = errno;
    close(fd);
    errno = saved;
    return false;
  }
  fd_ = fd;
  return true;
}

std::string ExchangeText(const std::string& socket_path, const std::string& request,
                         int timeout_ms) {
  DomainSockConnection conn(socket_path);
  conn.SetTimeouts(kDefaultSendTimeoutMs, timeout_ms);
  if (!conn.Connect()) {
    throw Error(kErrDaemonUnreachable,
                "Connect failed: " + socket_path + ": " + std::string(strerror(errno)));
  }
  if (!conn.Send(request)) throw Error(kErrDaemonUnreachable, "Send failed: " + socket_path);
  std::string answer;
  if (!conn.Recv(answer)) throw Error(kErrDaemonUnreachable, "Recv failed: " + socket_path);
  return answer;
}

Json::Value Exchange(const std::string& socket_path, const Json::Value& request, int timeout_ms) {
  std::string text = ExchangeText(socket_path, JsonToString(request), timeout_ms);
  Json::Value answer;
  if (!JsonFromString(answer, text) || !answer.isObject() || !answer["success"].isBool()) {
    throw Error(kErrDaemonUnreachable, "Recv failed, res=" + text);
  }
  return answer;
}

}  // namespace vellis::sdk
