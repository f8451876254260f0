#include "sdk/frame.h"

#include <gtest/gtest.h>

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

TEST(FrameTest, RefusesLengthsNoJsonTextCanHave) {
  struct Case {
    uint32_t length;
    const char* explanation;
  } cases[] = {
      {0, "length is 0"},
      {kMaxMessageSize + 1, "above the maximum"},
      {0xFFFFFFFFu, "above the maximum"},
      {__builtin_bswap32(100u), "above the maximum"},  // a peer of the other byte order
  };
  for (const auto& c : cases) {
    std::string header = EncodeFrameHeader(c.length);
    uint32_t decoded = 0;
    std::string error;
    EXPECT_FALSE(
        DecodeFrameHeader(reinterpret_cast<const unsigned char*>(header.data()), &decoded, &error))
        << c.length;
    EXPECT_NE(error.find(c.explanation), std::string::npos) << c.length << ": " << error;
    EXPECT_EQ(decoded, c.length);
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

}  // namespace
}  // namespace vellis::sdk
