#include "tools/searchd/frame.h"

#include <poll.h>
#include <sys/socket.h>
#include <time.h>

#include <cerrno>
#include <cstring>

namespace vellis::searchd {
namespace {

int64_t NowMs() {
  struct timespec ts;
  clock_gettime(CLOCK_MONOTONIC, &ts);
  return static_cast<int64_t>(ts.tv_sec) * 1000 + ts.tv_nsec / 1000000;
}

// Waits until `fd` is ready for `events` or the deadline passes.
bool WaitReady(int fd, short events, int64_t deadline_ms) {
  for (;;) {
    int64_t left = deadline_ms - NowMs();
    if (left <= 0) return false;
    struct pollfd p = {fd, events, 0};
    int n = poll(&p, 1, static_cast<int>(left));
    if (n > 0) return true;
    if (n < 0 && errno != EINTR) return true;  // let the transfer report it
  }
}

// Reads exactly `size` bytes. `got_any` tells whether at least one byte
// arrived (to tell a clean close from a truncated frame).
FrameStatus RecvAll(int fd, char* data, size_t size, int64_t deadline_ms, bool* got_any) {
  size_t done = 0;
  while (done < size) {
    if (!WaitReady(fd, POLLIN, deadline_ms)) return FrameStatus::kTimeout;
    ssize_t n = recv(fd, data + done, size - done, MSG_DONTWAIT);
    if (n > 0) {
      done += static_cast<size_t>(n);
      *got_any = true;
      continue;
    }
    if (n < 0 && (errno == EINTR || errno == EAGAIN || errno == EWOULDBLOCK)) continue;
    return *got_any ? FrameStatus::kTruncated : FrameStatus::kClosed;
  }
  return FrameStatus::kOk;
}

FrameStatus SendAll(int fd, const char* data, size_t size, int64_t deadline_ms) {
  size_t done = 0;
  while (done < size) {
    if (!WaitReady(fd, POLLOUT, deadline_ms)) return FrameStatus::kTimeout;
    ssize_t n = send(fd, data + done, size - done, MSG_NOSIGNAL | MSG_DONTWAIT);
    if (n > 0) {
      done += static_cast<size_t>(n);
      continue;
    }
    if (n < 0 && (errno == EINTR || errno == EAGAIN || errno == EWOULDBLOCK)) continue;
    return FrameStatus::kTruncated;
  }
  return FrameStatus::kOk;
}

}  // namespace

const char* FrameStatusText(FrameStatus status) {
  switch (status) {
    case FrameStatus::kOk:
      return "ok";
    case FrameStatus::kClosed:
      return "connection closed before a message";
    case FrameStatus::kTruncated:
      return "connection lost inside a message";
    case FrameStatus::kBadLength:
      return "message length of 0 or above the maximum refused";
    case FrameStatus::kTimeout:
      return "message did not arrive in time";
  }
  return "unknown";
}

FrameStatus ReadFrame(int fd, std::string& out, int timeout_ms) {
  int64_t deadline = NowMs() + timeout_ms;
  unsigned char header[sdk::kFrameHeaderSize];
  bool got_any = false;
  FrameStatus st =
      RecvAll(fd, reinterpret_cast<char*>(header), sizeof(header), deadline, &got_any);
  if (st != FrameStatus::kOk) return st;
  uint32_t length = 0;
  std::string why;
  if (!sdk::DecodeFrameHeader(header, &length, &why)) return FrameStatus::kBadLength;
  // The buffer grows with the bytes that actually arrive, so a large length
  // announced by a peer that then sends little costs no memory.
  out.clear();
  char chunk[64 * 1024];
  size_t left = length;
  while (left > 0) {
    size_t want = left < sizeof(chunk) ? left : sizeof(chunk);
    st = RecvAll(fd, chunk, want, deadline, &got_any);
    if (st != FrameStatus::kOk) {
      out.clear();
      return st == FrameStatus::kClosed ? FrameStatus::kTruncated : st;
    }
    out.append(chunk, want);
    left -= want;
  }
  return FrameStatus::kOk;
}

FrameStatus WriteFrame(int fd, const std::string& message, int timeout_ms) {
  if (message.empty() || message.size() > kMaxMessageBytes) return FrameStatus::kBadLength;
  int64_t deadline = NowMs() + timeout_ms;
  const std::string header = sdk::EncodeFrameHeader(static_cast<uint32_t>(message.size()));
  FrameStatus st = SendAll(fd, header.data(), header.size(), deadline);
  if (st != FrameStatus::kOk) return st;
  return SendAll(fd, message.data(), message.size(), deadline);
}

}  // namespace vellis::searchd
