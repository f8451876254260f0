#include "fileindex/elastic/comm.h"

#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <string>

#include "common/json_util.h"
#include "common/log.h"
#include "common/root_path.h"
#include "sdk/domain_socket.h"
#include "sdk/platform.h"

namespace vellis {
namespace {

std::atomic<int> g_send_timeout_ms{sdk::kDefaultSendTimeoutMs};
std::atomic<int> g_recv_timeout_ms{sdk::kDefaultRecvTimeoutMs};

// The daemon may still be starting: give its socket a little time to appear,
// but never wait without bound.
void WaitForSocket(const std::string& path) {
  for (int n = 1; access(path.c_str(), F_OK) != 0; ++n) {
    if (n > kElasticSocketWaits) break;
    VELLIS_LOG_ERR("elastic socket is not ready, retry ... %d", n);
    sdk::GetPlatform()->Sleep(1);
  }
  errno = 0;
}

// At most this much of a bad answer goes into an error's reason, so that a
// huge answer cannot flood the log.
constexpr size_t kMaxRawInReason = 4096;

std::string RawForReason(const std::string& raw) {
  if (raw.size() <= kMaxRawInReason) return raw;
  return raw.substr(0, kMaxRawInReason) + "...(" + std::to_string(raw.size()) + " bytes)";
}

}  // namespace

RequestTimeouts TEST_SetRequestTimeouts(RequestTimeouts timeouts) {
  RequestTimeouts old{g_send_timeout_ms.exchange(timeouts.send_ms),
                      g_recv_timeout_ms.exchange(timeouts.recv_ms)};
  return old;
}

void SendRequestImpl(Json::Value& res, const Json::Value& req) {
  const std::string path = RootPath(kElasticSocketPath);
  WaitForSocket(path);

  sdk::DomainSockConnection conn(path);  // closed on every path by its destructor
  conn.SetTimeouts(g_send_timeout_ms.load(), g_recv_timeout_ms.load());
  VELLIS_THROW_IF(!conn.Connect(), kErrDaemonUnreachable, "Connect failed");
  VELLIS_THROW_IF(!conn.Send(JsonToString(req)), kErrDaemonUnreachable, "Send failed");

  std::string resp_raw;
  // An answer that is not an object would make the member tests below
  // abort inside the JSON library, so it is refused here as well.
  VELLIS_THROW_IF(!conn.Recv(resp_raw) || !JsonFromString(res, resp_raw) || !res.isObject() ||
                      !res.isMember("success") || !res["success"].isBool(),
                  kErrDaemonUnreachable, "Recv failed, res=" + RawForReason(resp_raw));
  conn.Disconnect();

  if (!res["success"].asBool()) {
    Json::Value error;
    GetJsonValue(error, res, "error", true);
    int code = 0;
    std::string msg;
    GetJsonValue(code, error, "code", true);
    GetJsonValue(msg, error, "msg", true);
    throw Error(static_cast<ErrorCode>(code), "Request failed, msg=" + msg);
  }

  const Json::Value& answer = res;  // const access never adds members
  if (!req.isObject() || !req.isMember("compound") || !answer["has_fail"].isBool() ||
      !answer["has_fail"].asBool()) {
    return;
  }
  // Sub-request failures are partial: the caller's loop repeats the whole
  // compound request only when the daemon was busy for one of them.
  const Json::Value& data = answer["data"];
  VELLIS_THROW_IF(!data.isArray(), kErrDaemonUnreachable,
                  "Compound answer without data array, res=" + RawForReason(resp_raw));
  const Json::Value& subs = req["compound"];
  for (Json::ArrayIndex i = 0; i < data.size(); ++i) {
    const Json::Value& sub = data[i];
    if (sub.isObject() && sub["success"].isBool() && sub["success"].asBool()) continue;
    Json::Value error;
    GetJsonValue(error, sub, "error", true);
    int code = 0;
    std::string msg;
    GetJsonValue(code, error, "code", true);
    GetJsonValue(msg, error, "msg", false);
    if (IsBusyCode(code)) throw Error(static_cast<ErrorCode>(code), msg);
    std::string sub_text = subs.isArray() && i < subs.size() ? JsonToString(subs[i]) : "null";
    VELLIS_LOG_ERRNO("Compound failed: %s (%d) %s", sub_text.c_str(), code, msg.c_str());
  }
}

}  // namespace vellis
