// Moving exact byte counts, and whole frames (sdk/frame.h), over a
// descriptor: the one blocking transfer code of the package's sockets,
// under the daemon command channel, the search-engine client and every
// client of our daemons.
//
// Sends never raise SIGPIPE (MSG_NOSIGNAL); a descriptor that is not a
// socket is written and read with write(2) and read(2). Interrupted calls
// are repeated. Thread-safe for distinct descriptors.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>

namespace vellis::sdk {

enum class IoStatus {
  kOk,
  kClosed,     // end of stream before the first byte
  kTruncated,  // end of stream after some bytes
  kTimeout,    // the deadline passed
  kError,      // a system call failed; IoResult::error holds errno
  kBadLength,  // a frame length of 0 or above kMaxMessageSize
};

struct IoLimits {
  // At most this many bytes per system call; 0: as many as the call takes.
  size_t piece = 0;
  // A point of MonotonicMs() by which the whole transfer must be done; -1:
  // none, each call blocks as the descriptor does (its own SO_SNDTIMEO and
  // SO_RCVTIMEO then end a call with EAGAIN, an error). Deadlines apply to
  // sockets.
  int64_t deadline_ms = -1;
};

struct IoResult {
  IoStatus status = IoStatus::kOk;
  size_t done = 0;  // bytes moved
  int error = 0;    // errno of kError
};

// Milliseconds of CLOCK_MONOTONIC, and that clock `timeout_ms` from now.
int64_t MonotonicMs();
int64_t DeadlineAfter(int timeout_ms);

// Writes / reads exactly `size` bytes. Size 0 returns kOk at once.
IoResult WriteExact(int fd, const void* data, size_t size, const IoLimits& limits);
IoResult ReadExact(int fd, void* data, size_t size, const IoLimits& limits);

// Writes `text` as one frame by `deadline_ms` (-1: none). kBadLength, with
// nothing written, when `text` is empty or above kMaxMessageSize.
IoResult WriteFrame(int fd, const std::string& text, int64_t deadline_ms);

// Reads one frame into *text (replacing it) by `deadline_ms` (-1: none). A
// refused length gives kBadLength and its explanation in *why; the text
// grows with the bytes that arrive, never to the announced length at once.
// End of stream inside the frame is kTruncated.
IoResult ReadFrame(int fd, std::string* text, int64_t deadline_ms, std::string* why);

// A short English text for logs ("connection closed before a message").
std::string IoResultText(const IoResult& result);

}  // namespace vellis::sdk
