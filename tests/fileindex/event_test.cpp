#include <gtest/gtest.h>

#include <string>

#include "common/error.h"
#include "common/json_util.h"
#include "fileindex/optree.h"
#include "tests/support/fake_platform.h"

namespace vellis::fileindex {
namespace {

TEST(EventTest, ReadsEveryKeyAndDefaultsTheOptionalOnes) {
  Event bare(R"({"event":2,"path":"/volume1/share/a"})");
  EXPECT_EQ(bare.event, 2u);
  EXPECT_EQ(bare.path, "/volume1/share/a");
  EXPECT_EQ(bare.path_old, "");
  EXPECT_TRUE(bare.data.isNull());
  EXPECT_FALSE(bare.is_dir);

  Event full(
      R"({"event":131328,"is_dir":true,"path":"/s/new","path_old":"/s/old","data":{"audio":true}})");
  EXPECT_EQ(full.event, 0x20100u);
  EXPECT_TRUE(full.is_dir);
  EXPECT_EQ(full.path, "/s/new");
  EXPECT_EQ(full.path_old, "/s/old");
  EXPECT_EQ(JsonToString(full.data), R"({"audio":true})");
}

// The tree reads a whole queue through one reused event: each line must
// leave exactly its own fields, whatever the line before it held.
TEST(EventTest, AssignOverAnEarlierLineKeepsNothingOfIt) {
  struct Case {
    std::string line;
    uint32_t event;
    bool is_dir;
    std::string path, path_old, data;
  } cases[] = {
      {R"({"event":131328,"is_dir":true,"path":"/s/new","path_old":"/s/old","data":{"audio":true}})",
       0x20100u, true, "/s/new", "/s/old", R"({"audio":true})"},
      {R"({"event":2,"path":"/s/a"})", 2u, false, "/s/a", "", "null"},
      {R"({"event":256,"path":"/s/b","path_old":"/s/a/very/long/old/path/beyond/short/strings"})",
       256u, false, "/s/b", "/s/a/very/long/old/path/beyond/short/strings", "null"},
      // Members in any order; numbers and null convert as the JSON helpers
      // convert them (1 is true, null is the empty string).
      {R"({"path_old":null,"path":"/s/c","is_dir":1,"event":64})", 64u, true, "/s/c", "", "null"},
      {R"({"data":[1],"event":4,"is_dir":"yes","path":"/s/d","path_old":5})", 4u, false, "/s/d",
       "5", "[1]"},
  };
  Event e;
  for (int pass = 0; pass < 2; ++pass) {  // the second pass follows the last case
    for (const auto& c : cases) {
      e.Assign(c.line);
      EXPECT_EQ(e.event, c.event) << c.line;
      EXPECT_EQ(e.is_dir, c.is_dir) << c.line;
      EXPECT_EQ(e.path, c.path) << c.line;
      EXPECT_EQ(e.path_old, c.path_old) << c.line;
      EXPECT_EQ(JsonToString(e.data), c.data) << c.line;
    }
  }
}

TEST(EventTest, RefusesLinesThatAreNotAQueueEvent) {
  testing::FakePlatform platform;
  testing::ScopedPlatform scoped(&platform);
  struct Case {
    std::string line;
    ErrorCode code;
    std::string reason_start;
  } cases[] = {
      {"", kErrMalformedEvent, "Malformed event_raw: "},
      {"not json", kErrMalformedEvent, "Malformed event_raw: not json"},
      {R"({"event":2,"path":"/a")", kErrMalformedEvent, "Malformed event_raw: {"},
      {R"({"event":2,"path":"/a"} trailing)", kErrMalformedEvent, "Malformed event_raw: {"},
      {std::string(R"({"event":2,"path":"/a)") + '\0' + R"(b"})", kErrMalformedEvent,
       "Malformed event_raw: "},
      {"{\"event\":2,\"path\":\"/a\xff\"}", kErrMalformedEvent, "Malformed event_raw: "},
      {"{\"event\":2,\"path\":\"/a\xc0\xaf\"}", kErrMalformedEvent, "Malformed event_raw: "},
      {R"({"event":"2","path":"/a"})", kErrBadArgument, "Not a string"},
      {R"({"event":-1,"path":"/a"})", kErrBadArgument, "Not a string"},
      {R"({"event":[2],"path":"/a"})", kErrBadArgument, "Not a string"},
      {R"({"event":2,"path":["/a"]})", kErrBadArgument, "Not a string"},
      {R"({"event":2})", kErrBadArgument, "Missing property: path"},
      {R"({"path":"/a"})", kErrBadArgument, "Missing property: event"},
      {"[2]", kErrBadArgument, "Not an object"},
  };
  for (const auto& c : cases) {
    try {
      Event e(c.line);
      ADD_FAILURE() << "accepted: " << c.line;
    } catch (const Error& e) {
      EXPECT_EQ(e.GetCode(), c.code) << c.line;
      EXPECT_EQ(std::string(e.what()).rfind(c.reason_start, 0), 0u)
          << c.line << " gave reason: " << e.what();
    }
  }
  // The empty line's reason has nothing behind the colon and space.
  try {
    Event e("");
    ADD_FAILURE() << "the empty line was accepted";
  } catch (const Error& e) {
    EXPECT_EQ(std::string(e.what()), "Malformed event_raw: ");
  }
  // A malformed line is logged with its whole text before the throw.
  EXPECT_EQ(platform.LogsContaining("Malformed event_raw: not json").size(), 1u);
}

}  // namespace
}  // namespace vellis::fileindex
