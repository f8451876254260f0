// The daemon's protocol: one request in, one answer out, over an Engine.
//
// A request is {"command": ..., "data": {...}} or {"compound": [request,
// ...]}; the answer is {"success": true, "data": ...} or {"success": false,
// "error": {"code", "msg"}}, and for a compound request {"success": true,
// "has_fail": bool, "data": [one answer per sub-request, in order]}.
// docs/searchd.md lists the commands, their members and the error codes.
//
// Thread-safe: requests are carried out one at a time (a compound request
// as a whole), in the order in which callers get the lock.
#pragma once

#include <json/json.h>

#include <mutex>
#include <string>

#include "daemons/searchd/backend.h"

namespace vellis::searchd {

class Handler {
 public:
  // `engine` is not owned and must outlive the handler.
  explicit Handler(Engine& engine) : engine_(engine) {}

  // Answers the request text with the answer text. Never throws: text that
  // is not a JSON object is answered with error 1100.
  std::string HandleText(const std::string& request_text);

  // Answers a parsed request. Never throws.
  Json::Value Handle(const Json::Value& request);

  // Runs one step of the engine's background upkeep between requests.
  // Returns true while more remains. Never throws (failures are logged).
  bool Idle();

 private:
  // The one place where a failure becomes an error answer.
  Json::Value Answer(const Json::Value& request, bool nested);
  Json::Value Run(const Json::Value& request, bool nested);
  Json::Value Dispatch(const std::string& command, const Json::Value& data);

  Engine& engine_;
  std::mutex mu_;
};

// {"success": false, "error": {"code": code, "msg": msg}}.
Json::Value ErrorAnswer(int code, const std::string& msg);

}  // namespace vellis::searchd
