// The transport of every request to the search daemon.
//
// One call is one connection to the daemon's Unix-domain socket: one framed
// JSON request out, one framed JSON answer back (docs/protocol.md), then the
// connection is closed. No state is kept between calls; the functions are
// reentrant.
#pragma once

#include <json/json.h>

namespace vellis {

// The search daemon's socket; resolved with RootPath() at use.
inline constexpr char kElasticSocketPath[] = "/var/run/qoruelasticd.sock";

// How many one-second waits are spent on a missing socket file before the
// connection is attempted anyway.
inline constexpr int kElasticSocketWaits = 15;

// Sends `req` and puts the parsed answer into `res`.
//
// While the socket file is missing, waits up to kElasticSocketWaits times one
// second (through the platform's Sleep), logging "elastic socket is not
// ready, retry ... <n>" each time, then connects regardless.
//
// Throws vellis::Error:
// - 913 "Connect failed" / "Send failed" when the daemon cannot be reached;
// - 913 "Recv failed, res=<raw text>" when no whole answer arrives within the
//   receive time-out (sdk::kDefaultRecvTimeoutMs), when the peer closes
//   early or announces a length of 0 or above sdk::kMaxMessageSize, or when
//   the answer is not a JSON object with a bool "success" (the raw text is
//   cut after 4096 bytes, followed by "...(<size> bytes)");
// - the daemon's own "error"."code" with "Request failed, msg=<msg>" when
//   "success" is false (120 from the JSON helpers when "error", "code" or
//   "msg" is missing or mistyped);
// - for a request with a "compound" member whose answer has "has_fail" true:
//   the code and msg of the first failed sub-request whose code is busy
//   (1400/1401). Sub-requests that failed otherwise are logged ("Compound
//   failed: ...") and not reported. 913 when such an answer has no "data"
//   array.
// On return `res` holds the whole answer.
void SendRequestImpl(Json::Value& res, const Json::Value& req);

// Transfer time-outs of SendRequestImpl in milliseconds.
struct RequestTimeouts {
  int send_ms;
  int recv_ms;
};

// Test-only: replaces the time-outs of SendRequestImpl (defaults
// sdk::kDefaultSendTimeoutMs / sdk::kDefaultRecvTimeoutMs) and returns the
// previous ones.
RequestTimeouts TEST_SetRequestTimeouts(RequestTimeouts timeouts);

}  // namespace vellis
