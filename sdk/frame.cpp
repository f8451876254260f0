#include "sdk/frame.h"

#include <algorithm>
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

namespace vellis::sdk {

size_t FrameReader::Feed(const char* data, size_t size) {
  if (state_ != State::kNeedMore) return 0;
  size_t taken = 0;
  if (received_ < kFrameHeaderSize) {
    while (taken < size && received_ < kFrameHeaderSize) header_[received_++] = data[taken++];
    if (received_ < kFrameHeaderSize) return taken;
    if (!DecodeFrameHeader(header_, &length_, &error_)) {
      state_ = State::kBadLength;
      return taken;
    }
  }
  const size_t want = std::min<size_t>(size - taken, length_ - message_.size());
  message_.append(data + taken, want);
  taken += want;
  received_ += want;
  if (message_.size() == length_) state_ = State::kComplete;
  return taken;
}

}  // namespace vellis::sdk
