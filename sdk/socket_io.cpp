#include "sdk/socket_io.h"

#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <ctime>

#include "sdk/frame.h"

namespace vellis::sdk {
namespace {

// Frames up to this size go out in one system call; larger ones are not
// copied.
constexpr size_t kCoalesceLimit = 64 * 1024;
// The step by which a received frame's buffer grows.
constexpr size_t kReadChunk = 64 * 1024;

// One send or recv; write(2) / read(2) for what is not a socket.
ssize_t Move(bool out, int fd, char* p, size_t n, bool dont_wait) {
  const int wait_flag = dont_wait ? MSG_DONTWAIT : 0;
  ssize_t rc = out ? send(fd, p, n, MSG_NOSIGNAL | wait_flag) : recv(fd, p, n, wait_flag);
  if (rc < 0 && errno == ENOTSOCK) rc = out ? write(fd, p, n) : read(fd, p, n);
  return rc;
}

// Waits until `fd` is ready for `events` or the deadline passes. True when
// ready (or in error, which the next call reports).
bool WaitReady(int fd, short events, int64_t deadline_ms) {
  for (;;) {
    int64_t left = deadline_ms - MonotonicMs();
    if (left <= 0) return false;
    pollfd p{fd, events, 0};
    int rc = poll(&p, 1, static_cast<int>(std::min<int64_t>(left, 1000000)));
    if (rc > 0) return true;
    if (rc < 0 && errno != EINTR) return true;
  }
}

IoResult Exact(bool out, int fd, char* data, size_t size, const IoLimits& limits) {
  IoResult r;
  const bool timed = limits.deadline_ms >= 0;
  while (r.done < size) {
    size_t want = size - r.done;
    if (limits.piece > 0) want = std::min(want, limits.piece);
    ssize_t n = Move(out, fd, data + r.done, want, timed);
    if (n > 0) {
      r.done += static_cast<size_t>(n);
      continue;
    }
    if (n == 0) {
      if (out) {
        r.status = IoStatus::kError;
        r.error = EIO;
      } else {
        r.status = r.done == 0 ? IoStatus::kClosed : IoStatus::kTruncated;
      }
      return r;
    }
    if (errno == EINTR) continue;
    if (timed && (errno == EAGAIN || errno == EWOULDBLOCK)) {
      if (!WaitReady(fd, out ? POLLOUT : POLLIN, limits.deadline_ms)) {
        r.status = IoStatus::kTimeout;
        return r;
      }
      continue;
    }
    r.status = IoStatus::kError;
    r.error = errno;
    return r;
  }
  return r;
}

}  // namespace

int64_t MonotonicMs() {
  timespec ts;
  clock_gettime(CLOCK_MONOTONIC, &ts);
  return static_cast<int64_t>(ts.tv_sec) * 1000 + ts.tv_nsec / 1000000;
}

int64_t DeadlineAfter(int timeout_ms) { return MonotonicMs() + timeout_ms; }

IoResult WriteExact(int fd, const void* data, size_t size, const IoLimits& limits) {
  return Exact(true, fd, static_cast<char*>(const_cast<void*>(data)), size, limits);
}

IoResult ReadExact(int fd, void* data, size_t size, const IoLimits& limits) {
  return Exact(false, fd, static_cast<char*>(data), size, limits);
}

IoResult WriteFrame(int fd, const std::string& text, int64_t deadline_ms) {
  IoLimits limits;
  limits.deadline_ms = deadline_ms;
  std::string frame;
  std::string why;
  if (text.size() <= kCoalesceLimit) {
    if (!EncodeFrame(text, &frame, &why)) return {IoStatus::kBadLength, 0, 0};
    return WriteExact(fd, frame.data(), frame.size(), limits);
  }
  if (text.size() > kMaxMessageSize) return {IoStatus::kBadLength, 0, 0};
  const std::string header = EncodeFrameHeader(static_cast<uint32_t>(text.size()));
  IoResult r = WriteExact(fd, header.data(), header.size(), limits);
  if (r.status != IoStatus::kOk) return r;
  r = WriteExact(fd, text.data(), text.size(), limits);
  r.done += header.size();
  return r;
}

IoResult ReadFrame(int fd, std::string* text, int64_t deadline_ms, std::string* why) {
  IoLimits limits;
  limits.deadline_ms = deadline_ms;
  text->clear();
  unsigned char header[kFrameHeaderSize];
  IoResult r = ReadExact(fd, header, sizeof(header), limits);
  if (r.status != IoStatus::kOk) return r;
  uint32_t length = 0;
  if (!DecodeFrameHeader(header, &length, why)) return {IoStatus::kBadLength, r.done, 0};
  while (text->size() < length) {
    const size_t want = std::min<size_t>(kReadChunk, length - text->size());
    const size_t old = text->size();
    text->resize(old + want);
    IoResult part = ReadExact(fd, &(*text)[old], want, limits);
    r.done += part.done;
    if (part.status != IoStatus::kOk) {
      text->clear();
      part.done = r.done;
      if (part.status == IoStatus::kClosed) part.status = IoStatus::kTruncated;
      return part;
    }
  }
  return r;
}

std::string IoResultText(const IoResult& result) {
  switch (result.status) {
    case IoStatus::kOk:
      return "ok";
    case IoStatus::kClosed:
      return "connection closed before a message";
    case IoStatus::kTruncated:
      return "connection lost inside a message, after " + std::to_string(result.done) + " bytes";
    case IoStatus::kTimeout:
      return "timed out after " + std::to_string(result.done) + " bytes";
    case IoStatus::kError: {
      char buf[256];
      return strerror_r(result.error, buf, sizeof(buf));
    }
    case IoStatus::kBadLength:
      return "message length of 0 or above the maximum refused";
  }
  return "unknown";
}

}  // namespace vellis::sdk
