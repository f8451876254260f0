// The monitor's queue configuration file of the Linux platform.
#include "sdk/linux/monitor_queues.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <string>

#include "common/json_util.h"
#include "sdk/linux/linux_platform.h"
#include "tests/support/fake_platform.h"
#include "tests/support/temp_root.h"

namespace vellis::sdk {
namespace {

using testing::ReadFile;
using testing::WriteFile;

Json::Value Queue(const std::string& queue, const std::string& path) {
  Json::Value q(Json::objectValue);
  q["queue"] = queue;
  q["config"] = Json::Value(Json::arrayValue);
  if (!path.empty()) {
    Json::Value item(Json::objectValue);
    item["path"] = path;
    item["mask"] = 65478;
    item["ignore"].append("@eaDir");
    q["config"].append(item);
  }
  return q;
}

class MonitorQueuesTest : public ::testing::Test {
 protected:
  Json::Value Doc() const {
    Json::Value doc;
    EXPECT_TRUE(JsonFromFile(doc, MonitorQueueFile("fileindex")));
    return doc;
  }

  testing::TempRoot root_;
  testing::FakePlatform fake_;
  testing::ScopedPlatform scoped_{&fake_};
  LinuxPlatform linux_;
};

TEST_F(MonitorQueuesTest, QueuesAreKeptPerApplicationByQueuePath) {
  EXPECT_EQ(MonitorQueueFile("fileindex"),
            root_.Path("/var/packages/Vellis/etc/monitor/fileindex.json"));
  ASSERT_TRUE(linux_.MonitorQueueUpsert(Queue("/v/@fileindex/a/queue", "/v/a/x"), "fileindex", 1));
  ASSERT_TRUE(linux_.MonitorQueueUpsert(Queue("/v/@fileindex/b/queue", ""), "fileindex", 1));
  ASSERT_TRUE(linux_.MonitorQueueUpsert(Queue("/v/@fileindex/a/queue", "/v/a/y"), "fileindex", 1));
  ASSERT_TRUE(linux_.MonitorQueueUpsert(Queue("/v/@other/queue", "/v/o"), "other", 1));
  Json::Value doc = Doc();
  EXPECT_EQ(doc["app"], "fileindex");
  ASSERT_EQ(doc["queues"].size(), 2u) << doc;
  EXPECT_EQ(doc["queues"]["/v/@fileindex/a/queue"]["type"], 1);
  EXPECT_EQ(doc["queues"]["/v/@fileindex/a/queue"]["config"], Queue("", "/v/a/y")["config"]);
  EXPECT_EQ(doc["queues"]["/v/@fileindex/b/queue"]["config"], Json::Value(Json::arrayValue));

  ASSERT_TRUE(linux_.MonitorQueueDelete("/v/@fileindex/a/queue", "fileindex", 1));
  ASSERT_TRUE(linux_.MonitorQueueDelete("/v/@fileindex/a/queue", "fileindex", 1))
      << "deleting what is not there succeeds";
  ASSERT_TRUE(linux_.MonitorQueueDelete("/v/x/queue", "never-written", 1));
  doc = Doc();
  EXPECT_EQ(doc["queues"].size(), 1u);
  EXPECT_TRUE(doc["queues"].isMember("/v/@fileindex/b/queue"));
}

TEST_F(MonitorQueuesTest, BadRequestsAreRefusedAndWriteNothing) {
  Json::Value no_mask = Queue("/q", "/p");
  no_mask["config"][0].removeMember("mask");
  Json::Value bad_ignore = Queue("/q", "/p");
  bad_ignore["config"][0]["ignore"].append(3);
  struct Case {
    const char* what;
    Json::Value queue;
    std::string app;
    int type;
  } cases[] = {
      {"not an object", Json::Value("q"), "fileindex", 1},
      {"relative queue", Queue("q", "/p"), "fileindex", 1},
      {"relative folder", Queue("/q", "p"), "fileindex", 1},
      {"no mask", no_mask, "fileindex", 1},
      {"an ignore that is not a string", bad_ignore, "fileindex", 1},
      {"no application", Queue("/q", "/p"), "", 1},
      {"application with a slash", Queue("/q", "/p"), "../etc", 1},
      {"application ..", Queue("/q", "/p"), "..", 1},
      {"queue type 0", Queue("/q", "/p"), "fileindex", 0},
  };
  for (const Case& c : cases) {
    EXPECT_FALSE(linux_.MonitorQueueUpsert(c.queue, c.app, c.type)) << c.what;
    EXPECT_EQ(linux_.QLIBCErrGet(), EINVAL) << c.what;
  }
  EXPECT_FALSE(linux_.MonitorQueueDelete("relative", "fileindex", 1));
  EXPECT_EQ(MonitorQueueFile("../etc"), "");
  EXPECT_TRUE(ReadFile(MonitorQueueFile("fileindex")).empty());
}

TEST_F(MonitorQueuesTest, ACorruptFileIsNeverOverwritten) {
  const std::string file = MonitorQueueFile("fileindex");
  for (const char* text : {"{\"queues\": [", "[]", "{\"queues\": 3}"}) {
    WriteFile(file, text);
    EXPECT_FALSE(linux_.MonitorQueueUpsert(Queue("/q", "/p"), "fileindex", 1)) << text;
    EXPECT_FALSE(linux_.MonitorQueueDelete("/q", "fileindex", 1)) << text;
    EXPECT_EQ(linux_.QLIBCErrGet(), EBADMSG) << text;
    EXPECT_EQ(ReadFile(file), text);
  }
}

}  // namespace
}  // namespace vellis::sdk
