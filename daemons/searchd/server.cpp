#include "daemons/searchd/server.h"

#include "common/json_util.h"
#include "daemons/searchd/error_codes.h"
#include "sdk/frame.h"

namespace vellis::searchd {

std::string AnswerText(Handler& handler, const std::string& request_text) {
  std::string answer = handler.HandleText(request_text);
  if (answer.size() > sdk::kMaxMessageSize) {
    answer = JsonToString(ErrorAnswer(
        kErrBadQuery,
        "The answer would exceed the message limit; ask for fewer documents or fields"));
  }
  return answer;
}

std::unique_ptr<daemon::ServerLoop> MakeServer(Handler& handler, const std::string& socket_path,
                                               int workers, int recv_timeout_ms) {
  daemon::ServerOptions options;
  options.socket_path = socket_path;
  options.log_name = "searchd";
  options.workers = workers;
  options.request_timeout_ms = recv_timeout_ms;
  return std::make_unique<daemon::ServerLoop>(
      options,
      [&handler](const daemon::Request& request) { return AnswerText(handler, request.text); },
      [&handler] { return handler.Idle(); });
}

}  // namespace vellis::searchd
