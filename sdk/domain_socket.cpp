#include "sdk/domain_socket.h"

#include <poll.h>
#include <sys/socket.h>
#include <sys/time.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <ctime>

#include "common/log.h"
#include "sdk/frame.h"

namespace vellis::sdk {
namespace {

// Small messages go out in one system call; larger ones are not copied.
constexpr size_t kCoalesceLimit = 64 * 1024;

long long NowMs() {
  timespec ts;
  clock_gettime(CLOCK_MONOTONIC, &ts);
  return static_cast<long long>(ts.tv_sec) * 1000 + ts.tv_nsec / 1000000;
}

// Waits until `fd` is ready for `events` or the deadline passes. True when
// ready (or in error, which the following call then reports).
bool WaitReady(int fd, short events, long long deadline_ms) {
  for (;;) {
    long long left = deadline_ms - NowMs();
    if (left <= 0) return false;
    pollfd p{fd, events, 0};
    int rc = poll(&p, 1, static_cast<int>(left > 1000000 ? 1000000 : left));
    if (rc > 0) return true;
    if (rc < 0 && errno != EINTR) return true;  // let the caller see the error
  }
}

std::string ErrnoText(int err) {
  char buf[256];
  return strerror_r(err, buf, sizeof(buf));
}

}  // namespace

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

bool SockConnection::SendAll(const char* data, size_t size, long long deadline_ms) {
  size_t done = 0;
  while (done < size) {
    ssize_t n = send(fd_, data + done, size - done, MSG_NOSIGNAL | MSG_DONTWAIT);
    if (n > 0) {
      done += static_cast<size_t>(n);
      continue;
    }
    if (n < 0 && errno == EINTR) continue;
    if (n < 0 && (errno == EAGAIN || errno == EWOULDBLOCK)) {
      if (!WaitReady(fd_, POLLOUT, deadline_ms)) {
        return Fail("send timed out after " + std::to_string(send_timeout_ms_) + " ms, " +
                    std::to_string(done) + " of " + std::to_string(size) + " bytes sent");
      }
      continue;
    }
    return Fail("send failed: " + ErrnoText(errno));
  }
  return true;
}

bool SockConnection::RecvAll(char* data, size_t size, long long deadline_ms) {
  size_t done = 0;
  while (done < size) {
    ssize_t n = recv(fd_, data + done, size - done, MSG_DONTWAIT);
    if (n > 0) {
      done += static_cast<size_t>(n);
      continue;
    }
    if (n == 0) {
      return Fail("peer closed the connection after " + std::to_string(done) + " of " +
                  std::to_string(size) + " bytes");
    }
    if (errno == EINTR) continue;
    if (errno == EAGAIN || errno == EWOULDBLOCK) {
      if (!WaitReady(fd_, POLLIN, deadline_ms)) {
        return Fail("receive timed out after " + std::to_string(recv_timeout_ms_) + " ms, " +
                    std::to_string(done) + " of " + std::to_string(size) + " bytes received");
      }
      continue;
    }
    return Fail("recv failed: " + ErrnoText(errno));
  }
  return true;
}

bool SockConnection::Send(const std::string& message) {
  if (fd_ == -1) return false;
  long long deadline = NowMs() + send_timeout_ms_;
  std::string error;
  if (message.size() <= kCoalesceLimit) {
    std::string frame;
    if (!EncodeFrame(message, &frame, &error)) return Fail("send refused: " + error);
    if (!SendAll(frame.data(), frame.size(), deadline)) return false;
  } else {
    if (message.size() > kMaxMessageSize) {
      std::string ignored;
      EncodeFrame(message, &ignored, &error);  // only for the explanation
      return Fail("send refused: " + error);
    }
    std::string header = EncodeFrameHeader(static_cast<uint32_t>(message.size()));
    if (!SendAll(header.data(), header.size(), deadline)) return false;
    if (!SendAll(message.data(), message.size(), deadline)) return false;
  }
  errno = 0;  // EAGAIN of the non-blocking attempts is not news to callers
  return true;
}

bool SockConnection::Recv(std::string& message) {
  if (fd_ == -1) return false;
  long long deadline = NowMs() + recv_timeout_ms_;
  unsigned char header[kFrameHeaderSize];
  if (!RecvAll(reinterpret_cast<char*>(header), sizeof(header), deadline)) return false;
  uint32_t length = 0;
  std::string error;
  if (!DecodeFrameHeader(header, &length, &error)) return Fail("receive refused: " + error);
  message.resize(length);
  if (!RecvAll(&message[0], length, deadline)) {
    message.clear();
    return false;
  }
  errno = 0;
  return true;
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
  if (setsockopt(fd, SOL_SOCKET, SO_SNDTIMEO, &tv, sizeof(tv)) != 0) {
    int saved = errno;
    close(fd);
    errno = saved;
    return false;
  }
  int rc;
  do {
    rc = connect(fd, reinterpret_cast<sockaddr*>(&addr), sizeof(addr));
  } while (rc != 0 && errno == EINTR);
  if (rc != 0) {
    int saved = errno;
    close(fd);
    errno = saved;
    return false;
  }
  fd_ = fd;
  return true;
}

}  // namespace vellis::sdk
