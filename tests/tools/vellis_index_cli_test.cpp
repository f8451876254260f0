// The index management commands of `vellis`, run as a user runs them,
// against fake daemons on the test root's sockets and with services off.
#include <gtest/gtest.h>

#include <cstdio>
#include <cstdlib>
#include <string>
#include <vector>

#include "common/json_util.h"
#include "common/root_path.h"
#include "fileindex/elastic/comm.h"
#include "fileindex/elastic/communication.h"
#include "tests/support/cli_runner.h"
#include "tests/support/fake_index_daemon.h"
#include "tests/support/fake_search_daemon.h"
#include "tests/support/temp_root.h"

namespace vellis::testing {
namespace {

class IndexCliTest : public ::testing::Test {
 protected:
  void SetUp() override {
    setenv("VELLIS_SERVICES", "none", 1);
    for (const char* dir : {"/photo/a", "/photo/b", "/music/x"}) MakeDirs(v_ + dir);
    ASSERT_EQ(Vellis("share add photo " + v_ + "/photo").status, 0);
    ASSERT_EQ(Vellis("share add music " + v_ + "/music").status, 0);
  }
  void TearDown() override { unsetenv("VELLIS_SERVICES"); }

  std::vector<std::string> DaemonCommands() const {
    std::vector<std::string> out;
    for (const Json::Value& c : daemon_.Commands()) {
      out.push_back(c["type"].asString() + " " + c["data"]["share_name"].asString());
    }
    return out;
  }

  TempRoot root_;
  std::string v_ = root_.Path("/volume1");
  FakeSearchDaemon search_{RootPath(kElasticSocketPath)};
  FakeIndexDaemon daemon_{RootPath(fileindex::kFileIndexDaemonSocketPath)};
};

TEST_F(IndexCliTest, FoldersAreAddedListedReadAndDeleted) {
  CliRun add = Vellis("folder add /photo/a /photo/b --categories document,photo");
  EXPECT_EQ(add.status, 0) << add.out;
  EXPECT_EQ(add.out, "added 2 folders\n");
  EXPECT_EQ(Vellis("folder add /music/x").out, "added 1 folder\n");

  EXPECT_EQ(Vellis("folder list").out,
            "PATH      NAME  DOCUMENT  AUDIO  VIDEO  PHOTO  PAUSED\n"
            "/music/x  x     yes       yes    yes    yes    no\n"
            "/photo/a  a     yes       no     no     yes    no\n"
            "/photo/b  b     yes       no     no     yes    no\n"
            "total 3\n");
  EXPECT_EQ(Vellis("folder list --offset 1 --limit 1 --desc").out,
            "PATH      NAME  DOCUMENT  AUDIO  VIDEO  PHOTO  PAUSED\n"
            "/photo/a  a     yes       no     no     yes    no\n"
            "total 3\n");

  Json::Value listed;
  ASSERT_TRUE(JsonFromString(listed, Vellis("folder list --json --status").out));
  EXPECT_EQ(listed["total"].asUInt(), 3u);
  ASSERT_EQ(listed["folder"].size(), 3u);
  EXPECT_TRUE(listed["folder"][0]["additional"]["status"].isMember("text")) << listed;

  Json::Value got;
  ASSERT_TRUE(JsonFromString(got, Vellis("folder get /photo/b --json").out));
  EXPECT_EQ(got["path"], "/photo/b");
  EXPECT_EQ(got["audio"], false);

  EXPECT_EQ(Vellis("folder delete /photo/b").out, "deleted /photo/b\n");
  EXPECT_EQ(Vellis("folder reindex /photo/a").out, "queued reindex of 1 folder\n");
  EXPECT_EQ(Vellis("folder list").out.find("/photo/b"), std::string::npos);
  EXPECT_EQ(DaemonCommands(), (std::vector<std::string>{"notify_setting_changed photo",
                                                        "notify_setting_changed music",
                                                        "notify_setting_changed photo"}));
}

TEST_F(IndexCliTest, FoldersCanComeAsJsonForScripts) {
  CliRun add = Vellis(
      "folder add --from-json "
      "'[{\"path\":\"/music/x\",\"name\":\"Tunes\",\"document\":false,\"audio\":true,"
      "\"video\":false,\"photo\":false}]'");
  EXPECT_EQ(add.status, 0) << add.out;
  Json::Value got;
  ASSERT_TRUE(JsonFromString(got, Vellis("folder get /music/x --json").out));
  EXPECT_EQ(got["name"], "Tunes");
  EXPECT_EQ(got["document"], false);
}

TEST_F(IndexCliTest, BadRequestsFailWithTheirCodeAndReason) {
  ASSERT_EQ(Vellis("folder add /photo/a").status, 0);
  struct Case {
    std::string args;
    std::string out;
  } cases[] = {
      {"folder add /photo/a", "error 901: Duplicated ID: /photo/a\n"},
      {"folder add /photo/nope", "error 903: Path cannot index: /photo/nope\n"},
      {"folder add", "error 120: Missing path\n"},
      {"folder add /photo/b --categories docs", "error 120: Unknown category: docs\n"},
      {"folder add --from-json '{\"path\":\"/photo/b\"}'", "error 120: {\"path\":\"/photo/b\"}\n"},
      {"folder add --from-json '[{'", "error 120: Not JSON: [{\n"},
      {"folder get /photo/zz", "error 902: /photo/zz\n"},
      {"folder delete /photo/zz", "error 902: /photo/zz\n"},
      {"folder reindex /photo/zz", "error 902: /photo/zz\n"},
      {"share pause ''", "error 120: Missing share name\n"},
      {"share clear photo ''", "error 120: Missing share path\n"},
      {"share rename photo ''", "error 120: Missing share_to\n"},
      {"volume pause ''", "error 120: Missing mount point\n"},
      {"user rename '' bob", "error 120: Missing user_from\n"},
      {"share check-recycle nosuch", "error 800: "},
  };
  for (const Case& c : cases) {
    CliRun r = Vellis(c.args);
    EXPECT_EQ(r.status, 1) << c.args;
    EXPECT_EQ(r.out.substr(0, c.out.size()), c.out) << c.args;
  }
  EXPECT_NE(Vellis("home enable --auth nis").status, 0);
  EXPECT_NE(Vellis("folder frobnicate").status, 0);
  EXPECT_EQ(Vellis("folder list").out.find("/photo/b"), std::string::npos);
}

TEST_F(IndexCliTest, SharesAndVolumesArePausedAndResumed) {
  ASSERT_EQ(Vellis("folder add /photo/a /music/x").status, 0);
  EXPECT_EQ(Vellis("share pause photo").out, "paused photo\n");
  Json::Value got;
  ASSERT_TRUE(JsonFromString(got, Vellis("folder get /photo/a --json").out));
  EXPECT_EQ(got["paused"], true);
  EXPECT_EQ(Vellis("share resume photo").out, "resumed photo\n");
  EXPECT_EQ(Vellis("volume pause " + v_).out, "paused " + v_ + "\n");
  EXPECT_EQ(Vellis("volume resume " + v_).out, "resumed " + v_ + "\n");
  std::vector<std::string> commands = DaemonCommands();
  ASSERT_EQ(commands.size(), 8u);
  EXPECT_EQ(std::vector<std::string>(commands.begin() + 2, commands.end()),
            (std::vector<std::string>{"worker_delete photo", "worker_create photo",
                                      "worker_delete music", "worker_delete photo",
                                      "worker_create music", "worker_create photo"}));
  EXPECT_EQ(Vellis("volume clear " + v_).out, "cleared " + v_ + "\n");
  // Nothing is paused after the resume, so the clean-up keeps both.
  EXPECT_NE(Vellis("folder list").out.find("total 2\n"), std::string::npos);
}

TEST_F(IndexCliTest, ServicesOffAreReportedNotRun) {
  CliRun r = Vellis("-v services prepare");
  EXPECT_EQ(r.status, 0) << r.out;
  EXPECT_NE(r.out.find("Service stop pkg-Vellis-fileindexd skipped: VELLIS_SERVICES=none"),
            std::string::npos)
      << r.out;
  EXPECT_NE(r.out.find("services prepared\n"), std::string::npos);
}

TEST_F(IndexCliTest, HelpNamesEveryGroupAndOperation) {
  std::string top = Vellis("--help").out;
  for (const char* group : {"folder", "share", "volume", "user", "home", "services"}) {
    EXPECT_NE(top.find(std::string("\n  ") + group + " "), std::string::npos) << group;
  }
  std::string share = Vellis("share --help").out;
  for (const char* op : {"add", "list", "remove", "pause", "resume", "clear", "rename", "migrate",
                         "check-recycle"}) {
    EXPECT_NE(share.find(std::string("\n  ") + op + " "), std::string::npos) << op;
  }
  std::string folder = Vellis("folder --help").out;
  for (const char* op : {"add", "set", "list", "get", "delete", "reindex"}) {
    EXPECT_NE(folder.find(std::string("\n  ") + op + " "), std::string::npos) << op;
  }
}

}  // namespace
}  // namespace vellis::testing
