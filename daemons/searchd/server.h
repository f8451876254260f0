// The search daemon on the daemons' shared server loop
// (daemons/common/server_loop.h): one framed request per connection, one
// framed answer. A request whose frame is refused, truncated or too slow
// never reaches the handler. An answer too large for one message is
// replaced by error 1110.
#pragma once

#include <memory>
#include <string>

#include "daemons/common/server_loop.h"
#include "daemons/searchd/handler.h"

namespace vellis::searchd {

// Time a whole request may take to arrive before its connection is closed.
inline constexpr int kRecvTimeoutMs = 30 * 1000;

// The answer to one request text: the handler's, or error 1110 when that
// would not fit one message. Never throws.
std::string AnswerText(Handler& handler, const std::string& request_text);

// A server loop that answers with `handler` (not owned; must outlive it) on
// `socket_path`, the handler's idle-time upkeep run between requests.
// Listen() is left to the caller.
std::unique_ptr<daemon::ServerLoop> MakeServer(Handler& handler, const std::string& socket_path,
                                               int workers, int recv_timeout_ms = kRecvTimeoutMs);

}  // namespace vellis::searchd
