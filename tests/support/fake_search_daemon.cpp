#include "tests/support/fake_search_daemon.h"

#include <sys/socket.h>
#include <unistd.h>

#include "common/json_util.h"
#include "sdk/domain_socket.h"
#include "sdk/frame.h"

namespace vellis::testing {

FakeSearchDaemon::Reply FakeSearchDaemon::Success(const Json::Value& data) {
  Json::Value answer;
  answer["success"] = true;
  if (!data.isNull()) answer["data"] = data;
  return JsonText(answer);
}

FakeSearchDaemon::Reply FakeSearchDaemon::Failure(int code, const std::string& msg) {
  Json::Value answer;
  answer["success"] = false;
  answer["error"]["code"] = code;
  answer["error"]["msg"] = msg;
  return JsonText(answer);
}

FakeSearchDaemon::Reply FakeSearchDaemon::JsonText(const Json::Value& answer) {
  return Raw(JsonToString(answer));
}

FakeSearchDaemon::FakeSearchDaemon(const std::string& path) : FakeUnixServer(path) {
  handler_ = [](const Json::Value&) {
    Json::Value ok;
    ok["success"] = true;
    return ok;
  };
  Start();
}

FakeSearchDaemon::~FakeSearchDaemon() { Stop(); }

void FakeSearchDaemon::Push(const Reply& reply) {
  std::lock_guard<std::mutex> lock(mu_);
  script_.push_back(reply);
}

void FakeSearchDaemon::Push(const Reply& reply, int times) {
  for (int i = 0; i < times; ++i) Push(reply);
}

void FakeSearchDaemon::SetHandler(std::function<Json::Value(const Json::Value&)> handler) {
  std::lock_guard<std::mutex> lock(mu_);
  handler_ = std::move(handler);
}

std::vector<Json::Value> FakeSearchDaemon::Requests() const {
  std::lock_guard<std::mutex> lock(mu_);
  return requests_;
}

std::vector<std::string> FakeSearchDaemon::RawRequests() const {
  std::lock_guard<std::mutex> lock(mu_);
  return raw_requests_;
}

bool FakeSearchDaemon::WriteRaw(int fd, const std::string& bytes) {
  size_t off = 0;
  while (off < bytes.size()) {
    ssize_t n = send(fd, bytes.data() + off, bytes.size() - off, MSG_NOSIGNAL);
    if (n <= 0) return false;
    off += static_cast<size_t>(n);
  }
  return true;
}

void FakeSearchDaemon::Serve(int fd) {
  sdk::SockConnection conn(fd);
  conn.SetTimeouts(2000, 2000);
  std::string raw;
  if (!conn.Recv(raw)) return;
  Json::Value request;
  if (!JsonFromString(request, raw)) request = Json::Value();
  Reply reply;
  {
    std::lock_guard<std::mutex> lock(mu_);
    requests_.push_back(request);
    raw_requests_.push_back(raw);
    if (!script_.empty()) {
      reply = script_.front();
      script_.pop_front();
    } else {
      reply = JsonText(handler_(request));
    }
  }
  switch (reply.kind) {
    case Reply::Kind::kText:
      WriteRaw(fd, sdk::EncodeFrameHeader(static_cast<uint32_t>(reply.text.size())) + reply.text);
      // Wait for the client to hang up, so it never sees a reset.
      WaitReadable(fd, 2000);
      break;
    case Reply::Kind::kHeaderOnly:
      WriteRaw(fd, sdk::EncodeFrameHeader(reply.length));
      break;
    case Reply::Kind::kSilence:
      WaitReadable(fd, -1);
      break;
    case Reply::Kind::kCloseEarly:
      break;
    case Reply::Kind::kCloseMidMessage:
      WriteRaw(fd, sdk::EncodeFrameHeader(reply.length) + reply.text);
      break;
    case Reply::Kind::kTrickle: {
      std::string frame =
          sdk::EncodeFrameHeader(static_cast<uint32_t>(reply.text.size())) + reply.text;
      for (char c : frame) {
        if (!WriteRaw(fd, std::string(1, c)) || !Pause(static_cast<int>(reply.length))) break;
      }
      break;
    }
  }
}

}  // namespace vellis::testing
