#include "sdk/frame.h"

#include <cstring>

namespace vellis::sdk {
namespace {

// The one rule for both directions, so that sender and receiver never
// disagree about what may cross the socket.
bool CheckLength(uint64_t length, const char* what, std::string* error) {
  if (length == 0) {
    *error = std::string(what) + " length is 0, a JSON text was expected";
    return false;
  }
  if (length > kMaxMessageSize) {
    *error = std::string(what) + " length " + std::to_string(length) + " is above the maximum of " +
             std::to_string(kMaxMessageSize) + " bytes";
    return false;
  }
  return true;
}

}  // namespace

std::string EncodeFrameHeader(uint32_t length) {
  std::string header(kFrameHeaderSize, '\0');
  memcpy(&header[0], &length, kFrameHeaderSize);
  return header;
}

bool DecodeFrameHeader(const unsigned char* header, uint32_t* length, std::string* error) {
  memcpy(length, header, kFrameHeaderSize);
  return CheckLength(*length, "announced message", error);
}

bool EncodeFrame(const std::string& payload, std::string* frame, std::string* error) {
  if (!CheckLength(payload.size(), "message", error)) return false;
  *frame = EncodeFrameHeader(static_cast<uint32_t>(payload.size()));
  frame->append(payload);
  return true;
}

}  // namespace vellis::sdk
