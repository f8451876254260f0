#include "tools/searchd/client.h"

#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "common/error.h"
#include "common/json_util.h"
#include "tools/searchd/frame.h"

namespace vellis::searchd {
namespace {

// Closes the descriptor on every path out.
class Fd {
 public:
  explicit Fd(int fd) : fd_(fd) {}
  ~Fd() {
    if (fd_ >= 0) close(fd_);
  }
  Fd(const Fd&) = delete;
  Fd& operator=(const Fd&) = delete;
  int get() const { return fd_; }

 private:
  int fd_;
};

}  // namespace

std::string ExchangeText(const std::string& socket_path, const std::string& request,
                         int timeout_ms) {
  struct sockaddr_un addr;
  memset(&addr, 0, sizeof(addr));
  addr.sun_family = AF_UNIX;
  if (socket_path.size() >= sizeof(addr.sun_path)) {
    throw Error(kErrDaemonUnreachable, "Socket path too long: " + socket_path);
  }
  memcpy(addr.sun_path, socket_path.c_str(), socket_path.size());
  Fd fd(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  if (fd.get() < 0) throw Error(kErrDaemonUnreachable, "socket: " + std::string(strerror(errno)));
  if (connect(fd.get(), reinterpret_cast<struct sockaddr*>(&addr), sizeof(addr)) != 0) {
    throw Error(kErrDaemonUnreachable,
                "Connect failed: " + socket_path + ": " + std::string(strerror(errno)));
  }
  FrameStatus st = WriteFrame(fd.get(), request);
  if (st != FrameStatus::kOk) {
    throw Error(kErrDaemonUnreachable, std::string("Send failed: ") + FrameStatusText(st));
  }
  std::string answer;
  st = ReadFrame(fd.get(), answer, timeout_ms);
  if (st != FrameStatus::kOk) {
    throw Error(kErrDaemonUnreachable, std::string("Recv failed: ") + FrameStatusText(st));
  }
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

}  // namespace vellis::searchd
