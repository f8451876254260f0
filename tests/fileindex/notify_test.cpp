// Notifications to the administrators: the notifier's arguments, and its
// delivery by vellis-notify.
#include <gtest/gtest.h>
#include <unistd.h>

#include <cstdlib>
#include <string>
#include <vector>

#include "common/json_util.h"
#include "fileindex/util.h"
#include "sdk/linux/process.h"
#include "tests/support/fake_share_platform.h"
#include "tests/support/temp_root.h"

namespace vellis::fileindex {
namespace {

using testing::FakeSharePlatform;
using testing::ScopedPlatform;
using testing::TempRoot;

const char kLink[] = "<a data-qoru-app=\"QORU.Vellis.Application\" data-qoru-fn=\"preference\">";

// The built vellis-notify: beside `vellis`, two folders up from this test.
std::string NotifierPath() {
  const char* dir = getenv("VELLIS_TEST_BINARY_DIR");
  if (dir && *dir) return std::string(dir) + "/bin/vellis-notify";
  char buf[4096];
  ssize_t n = readlink("/proc/self/exe", buf, sizeof(buf) - 1);
  std::string exe(buf, n > 0 ? static_cast<size_t>(n) : 0);
  return Dirname(Dirname(exe)) + "/bin/vellis-notify";
}

class NotifyTest : public ::testing::Test {
 protected:
  NotifyTest() : scoped_(&platform_) {}

  FakeSharePlatform platform_;
  ScopedPlatform scoped_;
};

TEST_F(NotifyTest, RunsTheNotifierWithExactlyItsArguments) {
  platform_.SetExecResult(3);
  EXPECT_EQ(SendHMXNotify(), 3);
  EXPECT_EQ(NotifyLackOfMemory(), 3);
  std::vector<FakeSharePlatform::Exec> execs = platform_.Execs();
  ASSERT_EQ(execs.size(), 2u);
  for (const auto& exec : execs) {
    EXPECT_EQ(exec.program, "/usr/qoru/bin/qoruhmxnotify");
    EXPECT_EQ(exec.options, 187);
  }
  EXPECT_EQ(execs[0].args,
            (std::vector<std::string>{"-c", "QORU.Vellis.Application", "-b", "true", "-e", "false",
                                      "@administrators", "app:displayname", "error:index_no_space",
                                      kLink, "</a>"}));
  EXPECT_EQ(execs[1].args,
            (std::vector<std::string>{"-c", "QORU.Vellis.Application", "@administrators",
                                      "app:displayname", "error:lack_of_memory"}));
  EXPECT_TRUE(platform_.LogsContaining("").empty()) << "notifications never log";
}

class NotifyDeliveryTest : public NotifyTest {
 protected:
  void SetUp() override {
    platform_.SetExecResult(0, true);
    setenv(sdk::kNotifierEnv, NotifierPath().c_str(), 1);
  }
  void TearDown() override { unsetenv(sdk::kNotifierEnv); }

  std::vector<Json::Value> Delivered() {
    std::vector<Json::Value> lines;
    std::string text =
        testing::ReadFile(root_.Path("/var/packages/Vellis/var/notifications.jsonl"));
    for (size_t begin = 0; begin < text.size();) {
      size_t end = text.find('\n', begin);
      Json::Value v;
      EXPECT_TRUE(JsonFromString(v, text.substr(begin, end - begin)));
      lines.push_back(v);
      begin = end == std::string::npos ? text.size() : end + 1;
    }
    return lines;
  }

  TempRoot root_;
};

TEST_F(NotifyDeliveryTest, NotifierAppendsOneLinePerNotification) {
  ASSERT_EQ(access(NotifierPath().c_str(), X_OK), 0) << NotifierPath();
  EXPECT_EQ(SendHMXNotify(), 0);
  EXPECT_EQ(NotifyLackOfMemory(), 0);
  std::vector<Json::Value> lines = Delivered();
  ASSERT_EQ(lines.size(), 2u);
  EXPECT_EQ(lines[0]["to"].asString(), "@administrators");
  EXPECT_EQ(lines[0]["app"].asString(), "QORU.Vellis.Application");
  EXPECT_EQ(lines[0]["message"].asString(), "error:index_no_space");
  EXPECT_EQ(lines[0]["params"].size(), 2u);
  EXPECT_EQ(lines[0]["params"][0].asString(), kLink);
  EXPECT_EQ(lines[0]["options"]["b"].asString(), "true");
  EXPECT_EQ(lines[1]["message"].asString(), "error:lack_of_memory");
  EXPECT_EQ(lines[1]["title"].asString(), "app:displayname");
}

TEST_F(NotifyDeliveryTest, MissingNotifierLosesTheNotificationQuietly) {
  setenv(sdk::kNotifierEnv, root_.Path("/no/such/notifier").c_str(), 1);
  EXPECT_LT(SendHMXNotify(), 0);
  EXPECT_LT(NotifyLackOfMemory(), 0);
  EXPECT_TRUE(Delivered().empty());
}

TEST_F(NotifyDeliveryTest, NotifierRefusesIncompleteArguments) {
  std::string notifier = NotifierPath();
  struct Case {
    std::vector<std::string> args;
    int status;
  } cases[] = {
      {{"-c", "app", "@administrators", "title", "msg"}, 0},
      {{"@administrators", "title", "msg"}, 2},
      {{"-c", "app", "@administrators", "title"}, 2},
      {{"-c"}, 2},
      {{"-c", "app", "-x", "1", "@administrators", "title", "msg"}, 2},
  };
  for (const Case& c : cases) {
    EXPECT_EQ(sdk::GetPlatform()->QLIBCExecl(notifier, 0x3, c.args), c.status) << c.args.size();
  }
  EXPECT_EQ(Delivered().size(), 1u);
}

}  // namespace
}  // namespace vellis::fileindex
