// Message framing on the search daemon's socket.
//
// One message is a 4-byte unsigned length in host byte order followed by
// exactly that many bytes of JSON text (no terminating zero). A length of 0
// or above kMaxMessageBytes is refused before anything is allocated.
// Every transfer has a deadline, so a peer that stalls mid-frame (or trickles
// one byte at a time) cannot hold a caller past it. Sends use MSG_NOSIGNAL:
// a vanished peer is an error, never a SIGPIPE.
//
// The functions keep no state and are thread-safe for distinct descriptors.
#pragma once

#include <cstdint>
#include <string>

#include "sdk/frame.h"

namespace vellis::searchd {

// The socket of the search daemon; resolve with RootPath() at use.
inline constexpr char kSocketPath[] = "/var/run/qoruelasticd.sock";

// The largest message, either way: the library's limit (256 MiB).
inline constexpr uint32_t kMaxMessageBytes = sdk::kMaxMessageSize;

// Time a whole incoming message may take, counted from the start of the
// read: a peer that stalls longer is dropped.
inline constexpr int kRecvTimeoutMs = 30 * 1000;
// Time a whole outgoing message may take to be accepted by the peer.
inline constexpr int kSendTimeoutMs = 30 * 1000;

enum class FrameStatus {
  kOk,
  kClosed,     // end of stream before the first byte of the length
  kTruncated,  // end of stream or socket error inside the frame
  kBadLength,  // a length of 0 or above kMaxMessageBytes
  kTimeout,    // the deadline passed
};

// A short English text for logs and errors ("length 0 refused", ...).
const char* FrameStatusText(FrameStatus status);

// Reads one frame from `fd` into `out` (replacing it) within `timeout_ms`.
FrameStatus ReadFrame(int fd, std::string& out, int timeout_ms = kRecvTimeoutMs);

// Writes `message` as one frame within `timeout_ms`. kBadLength for an empty
// message or one above kMaxMessageBytes (nothing is sent); kTruncated when
// the peer has gone.
FrameStatus WriteFrame(int fd, const std::string& message, int timeout_ms = kSendTimeoutMs);

}  // namespace vellis::searchd
