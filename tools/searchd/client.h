// A minimal client of the search daemon: one connection per request.
//
// Used by the `vellis search` command, the tests and the benchmark. The
// library's own transport (fileindex/elastic) speaks the same framing.
#pragma once

#include <json/json.h>

#include <string>

namespace vellis::searchd {

// Connects to the Unix-domain stream socket at `socket_path` (SOCK_CLOEXEC),
// sends `request` as one frame, reads one frame back and closes.
// Returns the answer's text. Throws vellis::Error 913 (kErrDaemonUnreachable)
// with a reason naming the step when the connection, the send or the receive
// fails (the receive waits at most `timeout_ms`). Thread-safe.
std::string ExchangeText(const std::string& socket_path, const std::string& request,
                         int timeout_ms = 60 * 1000);

// ExchangeText on JSON: `request` serialised, the answer parsed. Throws
// Error 913 also when the answer is not a JSON object with a bool "success".
Json::Value Exchange(const std::string& socket_path, const Json::Value& request,
                     int timeout_ms = 60 * 1000);

}  // namespace vellis::searchd
