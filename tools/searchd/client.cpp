#include "tools/searchd/client.h"

#include <cerrno>
#include <cstring>

#include "common/error.h"
#include "common/json_util.h"
#include "sdk/domain_socket.h"

namespace vellis::searchd {

std::string ExchangeText(const std::string& socket_path, const std::string& request,
                         int timeout_ms) {
  // The library's own connection: the same framing, limits and time-outs as
  // every request the library sends.
  sdk::DomainSockConnection conn(socket_path);
  conn.SetTimeouts(sdk::kDefaultSendTimeoutMs, timeout_ms);
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

}  // namespace vellis::searchd
