// A scriptable search daemon on a real Unix socket, for the tests of the
// search-engine client.
//
// Each connection carries one request: the daemon reads one frame, records
// it, and answers with the next scripted reply; once the script is used up
// it answers with the handler (by default {"success": true}).
#pragma once

#include <json/json.h>

#include <cstdint>
#include <deque>
#include <functional>
#include <mutex>
#include <string>
#include <vector>

#include "tests/support/fake_unix_server.h"

namespace vellis::testing {

class FakeSearchDaemon : public FakeUnixServer {
 public:
  struct Reply {
    enum class Kind {
      kText,             // `text` as one frame
      kHeaderOnly,       // a length prefix announcing `length`, then close
      kSilence,          // no answer; the connection stays open
      kCloseEarly,       // close without answering
      kCloseMidMessage,  // announce `length`, send `text` (shorter), close
      kTrickle,          // `text` framed, one byte every `length` ms
    };
    Kind kind = Kind::kText;
    std::string text;
    uint32_t length = 0;
  };

  static Reply Success(const Json::Value& data = Json::Value());
  static Reply Failure(int code, const std::string& msg);
  static Reply Busy(int code = 1400) { return Failure(code, "busy"); }
  static Reply JsonText(const Json::Value& answer);
  static Reply Raw(const std::string& text) { return {Reply::Kind::kText, text, 0}; }
  static Reply HeaderOnly(uint32_t length) { return {Reply::Kind::kHeaderOnly, "", length}; }
  static Reply Silence() { return {Reply::Kind::kSilence, "", 0}; }
  static Reply CloseEarly() { return {Reply::Kind::kCloseEarly, "", 0}; }
  static Reply CloseMidMessage(uint32_t length, const std::string& part) {
    return {Reply::Kind::kCloseMidMessage, part, length};
  }
  static Reply Trickle(const std::string& text, uint32_t ms_per_byte) {
    return {Reply::Kind::kTrickle, text, ms_per_byte};
  }

  // Serves at `path` (normally RootPath(kElasticSocketPath)) at once.
  explicit FakeSearchDaemon(const std::string& path);
  ~FakeSearchDaemon() override;

  // Appends replies to the script.
  void Push(const Reply& reply);
  void Push(const Reply& reply, int times);
  // Computes the answer once the script is empty.
  void SetHandler(std::function<Json::Value(const Json::Value& request)> handler);

  // Requests received, in order (null for a request that was not JSON).
  std::vector<Json::Value> Requests() const;
  std::vector<std::string> RawRequests() const;

 protected:
  void Serve(int fd) override;

 private:
  // False once the peer is gone.
  bool WriteRaw(int fd, const std::string& bytes);

  mutable std::mutex mu_;
  std::deque<Reply> script_;
  std::function<Json::Value(const Json::Value&)> handler_;
  std::vector<Json::Value> requests_;
  std::vector<std::string> raw_requests_;
};

}  // namespace vellis::testing
