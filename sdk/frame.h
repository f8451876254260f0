// The byte framing of one message on the package's Unix-domain sockets.
//
// A message is a 4-byte unsigned length in host byte order followed by
// exactly that many bytes of JSON text, without a terminating zero. The
// search daemon's socket and the indexing daemon's command socket use the
// same framing. These functions are pure (bytes in, values out) and
// thread-safe.
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

}  // namespace vellis::sdk
