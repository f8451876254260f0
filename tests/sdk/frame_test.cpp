#include "sdk/frame.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>

namespace vellis::sdk {
namespace {

TEST(FrameTest, HeaderRoundTripsUsableLengths) {
  for (uint32_t length : {1u, 2u, 1023u, 65536u, kMaxMessageSize - 1, kMaxMessageSize}) {
    std::string header = EncodeFrameHeader(length);
    ASSERT_EQ(header.size(), kFrameHeaderSize) << length;
    uint32_t in_host_order;
    memcpy(&in_host_order, header.data(), sizeof(in_host_order));
    EXPECT_EQ(in_host_order, length) << "host byte order expected";
    uint32_t decoded = 0;
    std::string error;
    EXPECT_TRUE(
        DecodeFrameHeader(reinterpret_cast<const unsigned char*>(header.data()), &decoded, &error))
        << length << ": " << error;
    EXPECT_EQ(decoded, length);
  }
}

TEST(FrameTest, EncodesPayloadAfterHeaderAndRefusesEmptyOne) {
  std::string frame = "untouched";
  std::string error;
  EXPECT_FALSE(EncodeFrame("", &frame, &error));
  EXPECT_EQ(frame, "untouched");
  EXPECT_NE(error.find("length is 0"), std::string::npos) << error;

  ASSERT_TRUE(EncodeFrame("{\"a\":1}", &frame, &error)) << error;
  EXPECT_EQ(frame, EncodeFrameHeader(7) + "{\"a\":1}");
}

// Bytes arrive in pieces of every size; the message comes out whole, and
// bytes after it are left for the caller.
TEST(FrameReaderTest, AssemblesAMessageFromPiecesOfAnySize) {
  const std::string text = "{\"command\":\"index_list\"}";
  const std::string bytes = EncodeFrameHeader(static_cast<uint32_t>(text.size())) + text + "NEXT";
  for (size_t piece : {size_t{1}, size_t{3}, size_t{4}, size_t{5}, bytes.size()}) {
    FrameReader reader;
    size_t fed = 0;
    while (fed < bytes.size() && reader.state() == FrameReader::State::kNeedMore) {
      const size_t n = std::min(piece, bytes.size() - fed);
      fed += reader.Feed(bytes.data() + fed, n);
    }
    ASSERT_EQ(reader.state(), FrameReader::State::kComplete) << piece;
    EXPECT_EQ(reader.message(), text) << piece;
    EXPECT_EQ(bytes.substr(fed), "NEXT") << "bytes after the message are not taken: " << piece;
    EXPECT_EQ(reader.Feed("x", 1), 0u) << piece;
  }
}

TEST(FrameReaderTest, RefusesBadLengthsWithoutAllocatingThem) {
  const struct {
    uint32_t length;
    const char* explanation;
  } cases[] = {
      {0, "length is 0"},
      {kMaxMessageSize + 1, "above the maximum"},
      {0xFFFFFFFFu, "above the maximum"},
      {__builtin_bswap32(100u), "above the maximum"},  // a peer of the other byte order
  };
  for (const auto& c : cases) {
    FrameReader reader;
    const std::string bytes = EncodeFrameHeader(c.length) + "{}";
    EXPECT_EQ(reader.Feed(bytes.data(), bytes.size()), kFrameHeaderSize) << c.length;
    EXPECT_EQ(reader.state(), FrameReader::State::kBadLength) << c.length;
    EXPECT_NE(reader.error().find(c.explanation), std::string::npos) << reader.error();
    EXPECT_EQ(reader.length(), c.length);
  }
  // A large length that is allowed: memory grows with what arrives.
  FrameReader reader;
  const std::string bytes = EncodeFrameHeader(kMaxMessageSize) + "{\"a\"";
  reader.Feed(bytes.data(), bytes.size());
  EXPECT_EQ(reader.state(), FrameReader::State::kNeedMore);
  EXPECT_TRUE(reader.started());
  EXPECT_EQ(reader.received(), bytes.size());
  EXPECT_LT(reader.message().capacity(), 4096u);
}

}  // namespace
}  // namespace vellis::sdk
