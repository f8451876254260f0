// Adding, changing, listing, deleting and reindexing folders, with every
// side effect counted: indexes, monitor configurations, daemon commands,
// service requests and queued events.
#include <gtest/gtest.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <functional>

#include "common/fs_util.h"
#include "fileindex/index_mgr.h"
#include "fileindex/status_mgr.h"
#include "tests/support/index_mgr_env.h"
#include "tests/support/parse_json.h"

namespace vellis::fileindex {
namespace {

using testing::ParseJson;
using testing::Strings;
using testing::Thrown;

const std::string kAll = R"( {"audio":true,"document":true,"photo":true,"video":true})";

class FolderOpsTest : public testing::IndexMgrTest {
 protected:
  FolderOpsTest() {
    photo_ = AddShare("photo", {"/a/deep", "/b"});
    AddShare("music", {"/x"});
  }

  std::string photo_;
};

// Search support was off: switched on, then file sharing restarted. A new
// folder indexes every category, whatever it asked for.
TEST_F(FolderOpsTest, AddingAShareFirstFolderRunsEveryStepOnce) {
  FolderAdd(List({FolderJson("/photo/a", true, false, true, false)}), false);
  EXPECT_EQ(FolderPaths(), Strings{"/photo/a"});
  EXPECT_EQ(Sent(), (Strings{"notify_setting_changed photo", "index_create fileindex_photo",
                             "MonitorQueueUpsert"}));
  EXPECT_EQ(daemon_.Commands()[0]["data"]["is_upsert"], true);
  EXPECT_EQ(MonitorQueues()[QueuePath("photo")],
            ParseJson(R"({"type":1,"config":[{"path":")" + photo_ +
                      R"(/a","mask":65478,"ignore":["@eaDir"]}]})"));
  EXPECT_EQ(platform_.ServiceCalls(),
            (std::vector<testing::ServiceCall>{{"QORUSMBSetSpotlight", "1"},
                                               {"QLIBServiceRestart", "samba"},
                                               {"QLIBServiceStart", "qorucontentextractd"},
                                               {"QLIBServicectlStart", "pkg-Vellis-fileindexd"}}));
  EXPECT_EQ(Events("photo"), Strings{"131072 /photo/a" + kAll});
}

// A folder new to the list: every category, by the diff against nothing;
// a set never creates an index.
TEST_F(FolderOpsTest, SetReplacesTheRecordAndQueuesOnlyTheChangedCategories) {
  Given({"/photo/a"});
  FolderSet(List({FolderJson("/photo/a", true, false, true, true), FolderJson("/music/x")}), false);
  EXPECT_EQ(Sent(), (Strings{"notify_setting_changed music", "notify_setting_changed photo",
                             "MonitorQueueUpsert", "MonitorQueueUpsert"}));
  EXPECT_EQ(FoldersFile()[0]["audio"], false);
  EXPECT_EQ(Events("photo")[1],
            R"(131072 /photo/a {"audio":true,"document":false,"photo":false,"video":false})");
  EXPECT_EQ(Events("music"), Strings{"131072 /music/x" + kAll});
}

// Every refused request leaves everything as it was.
TEST_F(FolderOpsTest, RefusedRequestsChangeNothing) {
  AddShare("music2", {"/y"});
  Given({"/music/x"});
  StatusMgr().SetShareStatus("music", kShareStatusNeedReindex);
  MarkFoldersFile();
  auto add = [](const Json::Value& folders) { return [=] { FolderAdd(folders, false); }; };
  auto set = [](const Json::Value& folders) { return [=] { FolderSet(folders, false); }; };
  auto reindex = [](const char* paths) { return [=] { FolderReindex(ParseJson(paths)); }; };
  struct Case {
    std::function<void()> op;
    std::string error;  // its beginning
  } cases[] = {
      {add(FolderJson("/photo/a")), "120 {"},
      {set(Json::Value()), "120 null"},
      {add(List({Json::Value(Json::objectValue)})), "120 Missing property: path"},
      {set(List(Strings{"/photo/nope"})), "903 Path cannot index: /photo/nope"},
      {add(List(Strings{"/nosuch/a"})), "800 "},
      {add(List(Strings{"/photo/a", "/photo/a"})), "901 Duplicated ID: /photo/a"},
      {add(List(Strings{"/music2/y", "/photo/nope"})), "903 Path cannot index: /photo/nope"},
      {[] { FolderDelete(""); }, "120 Missing path"},
      {[] { FolderDelete("/music/x/"); }, "902 /music/x/"},
      {reindex(R"(["/music/x", 7])"), "120 Not a string, data=7"},
      {reindex(R"(["/music/x", "/photo/a"])"), "902 /photo/a"},
  };
  for (const Case& c : cases) EXPECT_EQ(Thrown(c.op).substr(0, c.error.size()), c.error);
  platform_.SetQuota(false, sdk::kPlatformErrNoSpace);
  EXPECT_EQ(Thrown(add(List(Strings{"/photo/a"}))), "1003 Share (photo) space not enough");
  EXPECT_FALSE(FoldersFileSaved());
  EXPECT_EQ(Sent(), Strings{});
  EXPECT_TRUE(platform_.ServiceCalls().empty());
  EXPECT_EQ(Events("photo").size() + Events("music2").size() + Events("music").size(), 1u);
  EXPECT_EQ(StatusMgr().GetShareStatus("music"), kShareStatusNeedReindex);
}

TEST_F(FolderOpsTest, ListLeavesOutAFolderWhoseStatusCannotBeMadeAndGetReadsOne) {
  Given({"/photo/a", "/music/x"});
  platform_.RemoveShare("music");
  Json::Value result;
  FolderList(result, 0, 10, "path", "asc", ParseJson(R"(["status"])"));
  ASSERT_EQ(result["folder"].size(), 1u) << result;
  EXPECT_TRUE(result["folder"][0]["additional"].isMember("status"));
  EXPECT_EQ(result["total"], 2u);
  FolderGet(result, "/photo/a");
  EXPECT_EQ(result, FoldersFile()[0]);
}

// The need-reindex bit is cleared before the events are queued, in order.
TEST_F(FolderOpsTest, ReindexClearsTheBitThenQueuesOneEventPerFolder) {
  Given({"/photo/a", "/photo/b"});
  StatusMgr().SetShareStatus("photo", kShareStatusNeedReindex | 4);
  FolderReindex(ParseJson(R"(["/photo/b", "/photo/a"])"));
  EXPECT_EQ(StatusMgr().GetShareStatus("photo"), 4) << "other bits stay";
  const Strings events = Events("photo");
  EXPECT_EQ(Strings(events.begin() + 2, events.end()),
            (Strings{"65536 /photo/b", "65536 /photo/a"}));
}

// /photo/a now governs the deep folder: audio, video and photo change. The
// share's last folder takes its index, monitor configuration and status.
TEST_F(FolderOpsTest, DeletingAFolderRewritesTheMonitorAndQueuesWhatChanged) {
  FolderAdd(List({FolderJson("/photo/a"), FolderJson("/photo/a/deep", true, false, false, false)}),
            false);
  StatusMgr().SetShareStatus("photo", kShareStatusNeedReindex);
  ForgetSent();
  FolderDelete("/photo/a/deep");
  EXPECT_EQ(Sent(), (Strings{"notify_setting_changed photo", "MonitorQueueUpsert"}));
  EXPECT_EQ(daemon_.Commands().back()["data"]["is_upsert"], false);
  EXPECT_EQ(MonitorPaths("photo"), ParseJson("[\"" + photo_ + "/a\"]"));
  EXPECT_EQ(Events("photo").back(),
            R"(131072 /photo/a/deep {"audio":true,"document":false,"photo":true,"video":true})");
  ForgetSent();
  FolderDelete("/photo/a");
  EXPECT_EQ(FolderPaths(), Strings{});
  EXPECT_EQ(Sent(), (Strings{"notify_setting_changed photo", "index_delete fileindex_photo",
                             "MonitorQueueDelete"}));
  EXPECT_FALSE(MonitorQueues().isMember(QueuePath("photo")));
  EXPECT_EQ(StatusMgr().GetShareStatus("photo"), 0);
  EXPECT_EQ(Events("photo").size(), 3u);
}

// The children are fresh processes (folder_add_helper, beside this test),
// not forks of this one, whose fake daemons' threads could hold a lock at
// fork time; they reach those daemons through their sockets.
TEST_F(FolderOpsTest, TwoProcessesAddingAtOnceBothEndUpInTheList) {
  char exe[4096] = {};
  ASSERT_GT(readlink("/proc/self/exe", exe, sizeof(exe) - 1), 0);
  const std::string helper = Dirname(exe) + "/folder_add_helper";
  Strings want;
  std::vector<pid_t> children;
  for (int child = 0; child < 2; ++child) {
    Strings args = {helper, "photo", photo_};
    for (int i = child; i < 6; i += 2) {
      want.push_back(args.emplace_back("/photo/p" + std::to_string(i)));
      testing::MakeDirs(Volume() + args.back());
    }
    std::vector<char*> argv;
    for (std::string& a : args) argv.push_back(a.data());
    argv.push_back(nullptr);
    pid_t pid = -1;
    ASSERT_EQ(posix_spawn(&pid, argv[0], nullptr, nullptr, argv.data(), environ), 0) << helper;
    children.push_back(pid);
  }
  for (pid_t pid : children) {
    int status = 0;
    ASSERT_EQ(waitpid(pid, &status, 0), pid);
    EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0) << status;
  }
  Strings paths = FolderPaths();
  std::sort(paths.begin(), paths.end());
  std::sort(want.begin(), want.end());
  EXPECT_EQ(paths, want);
  EXPECT_EQ(Events("photo").size(), 6u);
  EXPECT_EQ(MonitorPaths("photo").size(), 6u);
}

}  // namespace
}  // namespace vellis::fileindex
