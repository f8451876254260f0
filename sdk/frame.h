// The byte framing of one message on the package's Unix-domain sockets.
//
// A message is a 4-byte unsigned length in host byte order followed by
// exactly that many bytes of JSON text, without a terminating zero. Every
// socket of the package (the search daemon's, the indexing daemon's command
// socket, and those of the daemons to come) uses this framing. Everything
// here is pure (bytes in, values out) and thread-safe for distinct objects;
// sdk/socket_io.h moves frames over descriptors.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>

namespace vellis::sdk {

// The size of the length prefix.
inline constexpr size_t kFrameHeaderSize = 4;

// The largest message either side accepts: 256 MiB. A peer announcing more
// is refused before anything is allocated for it.
inline constexpr uint32_t kMaxMessageSize = 256u * 1024 * 1024;

// The length prefix of a message of `length` bytes.
std::string EncodeFrameHeader(uint32_t length);

// Reads the length prefix at `header` (kFrameHeaderSize bytes) into *length.
// Returns true when the length is usable for a JSON text: at least 1 and at
// most kMaxMessageSize. Otherwise returns false and puts a one-line
// explanation into *error (*length still holds the decoded value).
bool DecodeFrameHeader(const unsigned char* header, uint32_t* length, std::string* error);

// Header followed by `payload`. Returns false with *error filled when the
// payload is empty or longer than kMaxMessageSize; *frame is then untouched.
bool EncodeFrame(const std::string& payload, std::string* frame, std::string* error);

// Assembles one message from bytes as they arrive, in pieces of any size:
// the receiving side of a non-blocking server. The buffer grows only with
// bytes actually received, so a peer that announces a large message and
// sends little costs no memory.
class FrameReader {
 public:
  enum class State {
    kNeedMore,   // the message is not complete yet
    kComplete,   // message() holds the whole text
    kBadLength,  // the announced length is 0 or above kMaxMessageSize
  };

  // Takes bytes from `data` up to the end of the message and returns how
  // many it took; bytes after the message are not taken. Takes nothing once
  // the state is kComplete or kBadLength.
  size_t Feed(const char* data, size_t size);

  State state() const { return state_; }
  // Whether any byte has arrived.
  bool started() const { return received_ > 0; }
  // Bytes taken so far, the header included.
  size_t received() const { return received_; }
  // The announced length, once the header is complete (else 0); also when
  // it was refused.
  uint32_t length() const { return length_; }
  // The message text, whole once kComplete.
  const std::string& message() const { return message_; }
  std::string TakeMessage() { return std::move(message_); }
  // Why the length was refused (kBadLength).
  const std::string& error() const { return error_; }

 private:
  State state_ = State::kNeedMore;
  unsigned char header_[kFrameHeaderSize] = {};
  size_t received_ = 0;
  uint32_t length_ = 0;
  std::string message_;
  std::string error_;
};

}  // namespace vellis::sdk
