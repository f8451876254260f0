// The monitor's queue configuration file of the Linux platform.
#include "sdk/linux/monitor_queues.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <string>
#include <tuple>

#include "sdk/linux/linux_platform.h"
#include "tests/support/fake_platform.h"
#include "tests/support/parse_json.h"
#include "tests/support/temp_root.h"

namespace vellis::sdk {
namespace {

// A request to watch `path` into `queue`.
Json::Value Queue(const std::string& queue, const std::string& path) {
  return testing::ParseJson(R"({"queue":")" + queue + R"(","config":[{"path":")" + path +
                            R"(","mask":65478,"ignore":["@eaDir"]}]})");
}

class MonitorQueuesTest : public ::testing::Test {
 protected:
  testing::TempRoot root_;
  testing::FakePlatform fake_;
  testing::ScopedPlatform scoped_{&fake_};
  LinuxPlatform linux_;
  std::string file_ = MonitorQueueFile("fileindex");
};

TEST_F(MonitorQueuesTest, BadRequestsAreRefusedAndWriteNothing) {
  Json::Value no_mask = Queue("/q", "/p"), bad_ignore = Queue("/q", "/p");
  no_mask["config"][0].removeMember("mask");
  bad_ignore["config"][0]["ignore"].append(3);
  const std::tuple<const char*, Json::Value, std::string, int> cases[] = {
      {"not an object", Json::Value("q"), "fileindex", 1},
      {"relative queue", Queue("q", "/p"), "fileindex", 1},
      {"relative folder", Queue("/q", "p"), "fileindex", 1},
      {"no mask", no_mask, "fileindex", 1},
      {"an ignore that is not a string", bad_ignore, "fileindex", 1},
      {"no application", Queue("/q", "/p"), "", 1},
      {"application with a slash", Queue("/q", "/p"), "../etc", 1},
      {"application ..", Queue("/q", "/p"), "..", 1},
      {"queue type 0", Queue("/q", "/p"), "fileindex", 0}};
  for (const auto& [what, queue, app, type] : cases) {
    EXPECT_FALSE(linux_.MonitorQueueUpsert(queue, app, type)) << what;
    EXPECT_EQ(linux_.QLIBCErrGet(), EINVAL) << what;
  }
  EXPECT_FALSE(linux_.MonitorQueueDelete("relative", "fileindex", 1));
  EXPECT_EQ(MonitorQueueFile("../etc"), "");
  EXPECT_EQ(testing::ReadFile(file_), "");
}

TEST_F(MonitorQueuesTest, ACorruptFileIsNeverOverwritten) {
  for (const char* text : {"{\"queues\": [", "[]", "{\"queues\": 3}"}) {
    testing::WriteFile(file_, text);
    EXPECT_FALSE(linux_.MonitorQueueUpsert(Queue("/q", "/p"), "fileindex", 1)) << text;
    EXPECT_FALSE(linux_.MonitorQueueDelete("/q", "fileindex", 1)) << text;
    EXPECT_EQ(linux_.QLIBCErrGet(), EBADMSG) << text;
    EXPECT_EQ(testing::ReadFile(file_), text);
  }
}

}  // namespace
}  // namespace vellis::sdk
