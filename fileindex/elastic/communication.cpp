#include "fileindex/elastic/communication.h"

#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <cstring>
#include <vector>

#include "common/json_util.h"
#include "common/log.h"
#include "common/root_path.h"
#include "sdk/frame.h"
#include "sdk/platform.h"
#include "sdk/socket_io.h"

namespace vellis::fileindex {
namespace {

constexpr unsigned int kPieceSize = 1024;

std::atomic<int> g_send_timeout_ms{kCommandSendTimeoutMs};
std::atomic<int> g_recv_timeout_ms{kCommandRecvTimeoutMs};

std::string ErrnoText(int err) {
  char buf[256];
  return strerror_r(err, buf, sizeof(buf));
}

timeval ToTimeval(int ms) {
  timeval tv;
  tv.tv_sec = ms / 1000;
  tv.tv_usec = (ms % 1000) * 1000;
  return tv;
}

// Closes the command socket on every path out of SendCommandToDaemon.
class ScopedFd {
 public:
  explicit ScopedFd(int fd) : fd_(fd) {}
  ~ScopedFd() { close(fd_); }
  ScopedFd(const ScopedFd&) = delete;
  ScopedFd& operator=(const ScopedFd&) = delete;

 private:
  int fd_;
};

}  // namespace

CommandTimeouts TEST_SetCommandTimeouts(CommandTimeouts timeouts) {
  return {g_send_timeout_ms.exchange(timeouts.send_ms),
          g_recv_timeout_ms.exchange(timeouts.recv_ms)};
}

void BufferWrite(int fd, unsigned int length, const unsigned char* buffer) {
  sdk::IoLimits limits;
  limits.piece = kPieceSize;
  sdk::IoResult r = sdk::WriteExact(fd, buffer, length, limits);
  errno = r.error;
  VELLIS_THROW_IF(r.status != sdk::IoStatus::kOk, kErrInternal,
                  "write failed, reason=" + ErrnoText(r.error));
}

void BufferRead(int fd, unsigned int length, unsigned char* buffer) {
  sdk::IoLimits limits;
  limits.piece = kPieceSize;
  sdk::IoResult r = sdk::ReadExact(fd, buffer, length, limits);
  // End of stream before the whole message is a failure too.
  VELLIS_THROW_IF(r.status == sdk::IoStatus::kClosed || r.status == sdk::IoStatus::kTruncated,
                  kErrInternal, "read failed, reason=end of stream");
  errno = r.error;
  VELLIS_THROW_IF(r.status != sdk::IoStatus::kOk, kErrInternal,
                  "read failed, reason=" + ErrnoText(r.error));
}

std::string SendCommandToDaemon(const std::string& type, const Json::Value& data) {
  int fd_socket = -1;
  VELLIS_THROW_IF(0 > (fd_socket = socket(PF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)), kErrInternal,
                  "socket failed, reason=" + ErrnoText(errno));
  ScopedFd closer(fd_socket);
  // Set before connecting: on a Unix socket the send time-out also bounds a
  // connect to a daemon whose accept queue is full.
  timeval timeout = ToTimeval(g_send_timeout_ms.load());
  VELLIS_THROW_IF(0 > setsockopt(fd_socket, SOL_SOCKET, SO_SNDTIMEO, &timeout, sizeof(timeout)),
                  kErrInternal, "setsockopt failed, reason=" + ErrnoText(errno));
  timeout = ToTimeval(g_recv_timeout_ms.load());
  VELLIS_THROW_IF(0 > setsockopt(fd_socket, SOL_SOCKET, SO_RCVTIMEO, &timeout, sizeof(timeout)),
                  kErrInternal, "setsockopt failed, reason=" + ErrnoText(errno));

  const std::string path = RootPath(kFileIndexDaemonSocketPath);
  sockaddr_un addr;
  memset(&addr, 0, sizeof(addr));
  addr.sun_family = AF_UNIX;
  VELLIS_THROW_IF(path.size() >= sizeof(addr.sun_path), kErrInternal,
                  "socket path too long, path=" + path);
  memcpy(addr.sun_path, path.c_str(), path.size() + 1);
  // The daemon may be starting: its socket file appears a little later.
  for (int attempt = 1;; ++attempt) {
    if (0 == connect(fd_socket, reinterpret_cast<sockaddr*>(&addr), sizeof(addr))) break;
    if (errno != ENOENT || attempt >= kCommandConnectAttempts) break;
    sdk::GetPlatform()->Sleep(1);
  }
  errno = 0;

  Json::Value command(Json::objectValue);
  command["type"] = type;
  command["data"] = data;
  const std::string text = JsonToString(command);
  VELLIS_THROW_IF(text.size() > sdk::kMaxMessageSize, kErrInternal,
                  "command too long, size=" + std::to_string(text.size()));
  const std::string header = sdk::EncodeFrameHeader(static_cast<uint32_t>(text.size()));
  BufferWrite(fd_socket, sdk::kFrameHeaderSize,
              reinterpret_cast<const unsigned char*>(header.data()));
  BufferWrite(fd_socket, static_cast<unsigned int>(text.size()),
              reinterpret_cast<const unsigned char*>(text.data()));

  unsigned char answer_header[sdk::kFrameHeaderSize];
  BufferRead(fd_socket, sizeof(answer_header), answer_header);
  uint32_t length = 0;
  std::string error;
  VELLIS_THROW_IF(!sdk::DecodeFrameHeader(answer_header, &length, &error), kErrInternal,
                  "bad answer: " + error);
  std::string answer(length, '\0');
  BufferRead(fd_socket, length, reinterpret_cast<unsigned char*>(&answer[0]));
  return answer;
}

}  // namespace vellis::fileindex
