// Adding, changing, listing, reading, deleting and reindexing folders, with
// every side effect counted: index creations, monitor configurations, daemon
// commands, service requests and queued events.
#include <gtest/gtest.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cstdlib>
#include <string>
#include <vector>

#include "common/fs_util.h"
#include "common/json_util.h"
#include "fileindex/index_mgr.h"
#include "fileindex/status_mgr.h"
#include "tests/support/index_mgr_env.h"

namespace vellis::fileindex {
namespace {

using testing::FakeSearchDaemon;
using testing::IndexMgrEnv;
using testing::MakeDirs;
using testing::Thrown;
using Call = testing::FakeServicesPlatform::ServiceCall;

Json::Value Array(std::vector<Json::Value> items) {
  Json::Value a(Json::arrayValue);
  for (Json::Value& v : items) a.append(v);
  return a;
}

Json::Value Cfg(bool document, bool audio, bool video, bool photo) {
  Json::Value c(Json::objectValue);
  c["document"] = document;
  c["audio"] = audio;
  c["video"] = video;
  c["photo"] = photo;
  return c;
}

// The built folder_add_helper: under $VELLIS_TEST_BINARY_DIR (ctest sets
// it), else beside this test binary.
std::string FolderAddHelper() {
  const char* dir = getenv("VELLIS_TEST_BINARY_DIR");
  if (dir && *dir) return std::string(dir) + "/tests/folder_add_helper";
  char buf[4096];
  ssize_t n = readlink("/proc/self/exe", buf, sizeof(buf) - 1);
  return Dirname(std::string(buf, n > 0 ? static_cast<size_t>(n) : 0)) + "/folder_add_helper";
}

// Runs args[0] with `args` and this process's environment ($VELLIS_ROOT
// among it); the pid, or -1. posix_spawn runs no code of this process in
// the child, so no lock of its threads can be held there.
pid_t Spawn(const std::vector<std::string>& args) {
  std::vector<char*> argv;
  for (const std::string& a : args) argv.push_back(const_cast<char*>(a.c_str()));
  argv.push_back(nullptr);
  pid_t pid = -1;
  return posix_spawn(&pid, argv[0], nullptr, nullptr, argv.data(), environ) == 0 ? pid : -1;
}

class FolderOpsTest : public ::testing::Test {
 protected:
  FolderOpsTest() {
    photo_ = env_.AddShare("photo");
    music_ = env_.AddShare("music");
    for (const char* dir : {"/photo/a", "/photo/b", "/photo/a/deep", "/music/x"}) {
      MakeDirs(env_.Volume() + dir);
    }
  }

  static Json::Value F(const std::string& path, bool document = true, bool audio = true,
                       bool video = true, bool photo = true) {
    return IndexMgrEnv::FolderJson(path, document, audio, video, photo);
  }

  // Adds folders and forgets what that sent, so a test sees only its own
  // step.
  void Given(const Json::Value& folders) {
    FolderAdd(folders, false);
    search_requests_before_ = env_.search().Requests().size();
    daemon_commands_before_ = env_.daemon().Commands().size();
    env_.platform().ClearServiceCalls();
    env_.platform().ClearCalls();
  }

  std::vector<std::string> NewSearchCommands() const {
    std::vector<std::string> all = env_.SearchCommands();
    return std::vector<std::string>(all.begin() + static_cast<long>(search_requests_before_),
                                    all.end());
  }
  std::vector<std::string> NewDaemonCommands() const {
    std::vector<std::string> all = env_.DaemonCommands();
    return std::vector<std::string>(all.begin() + static_cast<long>(daemon_commands_before_),
                                    all.end());
  }

  std::string Full(const std::string& share_path) const { return env_.Volume() + share_path; }

  IndexMgrEnv env_;
  std::string photo_;
  std::string music_;
  size_t search_requests_before_ = 0;
  size_t daemon_commands_before_ = 0;
};

TEST_F(FolderOpsTest, AddingAShareFirstFolderRunsEveryStepOnce) {
  FolderAdd(Array({F("/photo/a", true, false, true, false)}), false);

  EXPECT_EQ(env_.FolderPaths(), std::vector<std::string>{"/photo/a"});
  EXPECT_EQ(env_.SearchCommands(), std::vector<std::string>{"index_create fileindex_photo"});
  Json::Value monitor = env_.MonitorQueues();
  ASSERT_EQ(monitor.size(), 1u) << monitor;
  const Json::Value& queue = monitor[env_.QueuePath("photo")];
  ASSERT_EQ(queue["config"].size(), 1u) << monitor;
  EXPECT_EQ(queue["type"], 1);
  EXPECT_EQ(queue["config"][0]["path"], Full("/photo/a"));
  EXPECT_EQ(queue["config"][0]["mask"], 65478);
  EXPECT_EQ(queue["config"][0]["ignore"], Array({"@eaDir"}));

  ASSERT_EQ(env_.DaemonCommands(), std::vector<std::string>{"notify_setting_changed photo"});
  EXPECT_EQ(env_.DaemonCommandObjects()[0]["data"]["is_upsert"], true);

  // Search support was off: switched on, then the file-sharing service
  // restarted, then the two daemons started.
  EXPECT_EQ(env_.platform().ServiceCalls(),
            (std::vector<Call>{{"QORUSMBSetSpotlight", "1"},
                               {"QLIBServiceRestart", "samba"},
                               {"QLIBServiceStart", "qorucontentextractd"},
                               {"QLIBServicectlStart", "pkg-Vellis-fileindexd"}}));

  // A new folder indexes every category, whatever it asked for.
  std::vector<Json::Value> events = env_.QueueEvents("photo");
  ASSERT_EQ(events.size(), 1u);
  EXPECT_EQ(events[0]["event"], 0x20000);
  EXPECT_EQ(events[0]["path"], Full("/photo/a"));
  EXPECT_EQ(events[0]["path_old"], "");
  EXPECT_EQ(events[0]["data"], Cfg(true, true, true, true));
}

TEST_F(FolderOpsTest, TwoFoldersOfOneShareInOneCallShareTheShareSteps) {
  FolderAdd(Array({F("/photo/a"), F("/photo/b")}), false);
  EXPECT_EQ(env_.SearchCommands(), std::vector<std::string>{"index_create fileindex_photo"});
  EXPECT_EQ(env_.CallCount("MonitorQueueUpsert"), 1u);
  EXPECT_EQ(env_.MonitorQueues()[env_.QueuePath("photo")]["config"].size(), 2u);
  EXPECT_EQ(env_.DaemonCommands(), std::vector<std::string>{"notify_setting_changed photo"});
  std::vector<Json::Value> events = env_.QueueEvents("photo");
  ASSERT_EQ(events.size(), 2u);
  EXPECT_EQ(events[0]["path"], Full("/photo/a"));
  EXPECT_EQ(events[1]["path"], Full("/photo/b"));
}

TEST_F(FolderOpsTest, OnlyTheFirstFolderOfAShareCreatesItsIndex) {
  Given(Array({F("/photo/a")}));
  FolderAdd(Array({F("/photo/b")}), false);
  EXPECT_EQ(NewSearchCommands(), std::vector<std::string>{});
  EXPECT_EQ(env_.CallCount("MonitorQueueUpsert"), 1u);
  EXPECT_EQ(env_.MonitorQueues()[env_.QueuePath("photo")]["config"].size(), 2u);
  EXPECT_EQ(NewDaemonCommands(), std::vector<std::string>{"notify_setting_changed photo"});
}

TEST_F(FolderOpsTest, SetReplacesTheRecordAndQueuesOnlyTheChangedCategories) {
  Given(Array({F("/photo/a")}));
  FolderSet(Array({F("/photo/a", true, false, true, true), F("/music/x")}), false);
  EXPECT_EQ(NewSearchCommands(), std::vector<std::string>{}) << "a set never creates an index";
  Json::Value saved = env_.FoldersFile();
  ASSERT_EQ(saved.size(), 2u) << saved;
  EXPECT_EQ(saved[0]["path"], "/photo/a");
  EXPECT_EQ(saved[0]["audio"], false);
  std::vector<Json::Value> events = env_.QueueEvents("photo");
  ASSERT_EQ(events.size(), 2u);
  EXPECT_EQ(events[1]["data"], Cfg(false, true, false, false));
  // A folder new to the list, through a set: every category, by the diff
  // against nothing.
  ASSERT_EQ(env_.QueueEvents("music").size(), 1u);
  EXPECT_EQ(env_.QueueEvents("music")[0]["data"], Cfg(true, true, true, true));
}

TEST_F(FolderOpsTest, UpdaterModeStoresAnUnindexablePathAndQueuesNothing) {
  FolderAdd(Array({F("/photo/not-there")}), true);
  EXPECT_EQ(env_.FolderPaths(), std::vector<std::string>{"/photo/not-there"});
  EXPECT_EQ(env_.SearchCommands(), std::vector<std::string>{"index_create fileindex_photo"});
  EXPECT_EQ(env_.DaemonCommands(), std::vector<std::string>{"notify_setting_changed photo"});
  EXPECT_TRUE(env_.QueueEvents("photo").empty());
}

TEST_F(FolderOpsTest, AnEmptyListStartsTheServicesAndSavesTheUnchangedList) {
  Given(Array({F("/photo/a")}));
  size_t events_before = env_.QueueEvents("photo").size();
  FolderAdd(Json::Value(Json::arrayValue), false);
  EXPECT_EQ(env_.FolderPaths(), std::vector<std::string>{"/photo/a"});
  EXPECT_EQ(env_.platform().ServiceCalls(),
            (std::vector<Call>{{"QLIBServiceStart", "qorucontentextractd"},
                               {"QLIBServicectlStart", "pkg-Vellis-fileindexd"}}))
      << "search support was already on";
  EXPECT_EQ(NewSearchCommands(), std::vector<std::string>{});
  EXPECT_EQ(NewDaemonCommands(), std::vector<std::string>{});
  EXPECT_EQ(env_.CallCount("MonitorQueueUpsert"), 0u);
  EXPECT_EQ(env_.QueueEvents("photo").size(), events_before);
}

// Every refused request leaves everything as it was: no list written, no
// service touched, nothing sent, nothing queued.
TEST_F(FolderOpsTest, RefusedRequestsChangeNothing) {
  sdk::ShareInfo ro;
  ro.szName = "ro";
  ro.szPath = env_.Volume() + "/ro";
  ro.read_only = true;
  MakeDirs(ro.szPath + "/a");
  env_.platform().AddShare(ro);
  env_.AddShare("music2");
  MakeDirs(env_.Volume() + "/music2/y");
  Given(Array({F("/music/x")}));
  env_.MarkFoldersFile();

  struct Case {
    const char* what;
    Json::Value folders;
    bool create;
    std::string error;
  } cases[] = {
      {"an object instead of a list", F("/photo/a"), true, "120 " + JsonToString(F("/photo/a"))},
      {"a string instead of a list", Json::Value("/photo/a"), true, "120 \"/photo/a\""},
      {"null instead of a list", Json::Value(), false, "120 null"},
      {"an element without a path", Array({Json::Value(Json::objectValue)}), true, ""},
      {"a path in a read-only share", Array({F("/ro/a")}), true, "903 Path cannot index: /ro/a"},
      {"a path that does not exist", Array({F("/photo/nope")}), false,
       "903 Path cannot index: /photo/nope"},
      {"a share that does not exist", Array({F("/nosuch/a")}), true, ""},
      {"a path already listed", Array({F("/music/x")}), true, "901 Duplicated ID: /music/x"},
      {"one path twice in one list", Array({F("/photo/a"), F("/photo/a")}), true,
       "901 Duplicated ID: /photo/a"},
      {"a bad element after a good one", Array({F("/music2/y"), F("/photo/nope")}), true,
       "903 Path cannot index: /photo/nope"},
  };
  for (const Case& c : cases) {
    std::string error = Thrown([&] { FolderUpsert(c.folders, c.create, false); });
    if (c.error.empty()) {
      EXPECT_NE(error, "no error") << c.what;
    } else {
      EXPECT_EQ(error, c.error) << c.what;
    }
    EXPECT_FALSE(env_.FoldersFileSaved()) << c.what;
    EXPECT_EQ(env_.FolderPaths(), std::vector<std::string>{"/music/x"}) << c.what;
    EXPECT_EQ(NewSearchCommands(), std::vector<std::string>{}) << c.what;
    EXPECT_EQ(NewDaemonCommands(), std::vector<std::string>{}) << c.what;
    EXPECT_TRUE(env_.platform().ServiceCalls().empty()) << c.what;
    EXPECT_EQ(env_.CallCount("MonitorQueueUpsert"), 0u) << c.what;
    EXPECT_TRUE(env_.QueueEvents("photo").empty()) << c.what;
    EXPECT_TRUE(env_.QueueEvents("music2").empty()) << c.what;
  }
  env_.platform().SetQuota(false, sdk::kPlatformErrNoSpace);
  EXPECT_EQ(Thrown([&] { FolderAdd(Array({F("/photo/a")}), false); }),
            "1003 Share (photo) space not enough");
  EXPECT_FALSE(env_.FoldersFileSaved());
  EXPECT_TRUE(env_.platform().ServiceCalls().empty());
  EXPECT_EQ(NewSearchCommands(), std::vector<std::string>{});
  // The element without a path names what it lacks.
  EXPECT_EQ(
      Thrown([&] { FolderAdd(Array({Json::Value(Json::objectValue)}), false); }).substr(0, 30),
      "120 Missing property: path, da");
}

TEST_F(FolderOpsTest, AFailedIndexCreationKeepsEarlierSharesDoneAndTheListUnsaved) {
  env_.search().Push(FakeSearchDaemon::Success());
  env_.search().Push(FakeSearchDaemon::Failure(1234, "no index for you"));
  std::string error = Thrown([&] { FolderAdd(Array({F("/photo/a"), F("/music/x")}), false); });
  EXPECT_EQ(error.substr(0, 5), "1234 ") << error;
  EXPECT_TRUE(env_.FoldersFile().isNull()) << "list saved";
  // music (first by name) is done: its index and monitor configuration stay.
  EXPECT_EQ(env_.SearchCommands(), (std::vector<std::string>{"index_create fileindex_music",
                                                             "index_create fileindex_photo"}));
  EXPECT_TRUE(env_.MonitorQueues().isMember(env_.QueuePath("music")));
  EXPECT_FALSE(env_.MonitorQueues().isMember(env_.QueuePath("photo")));
  EXPECT_TRUE(env_.DaemonCommands().empty());
  EXPECT_TRUE(env_.QueueEvents("photo").empty());
  EXPECT_TRUE(env_.QueueEvents("music").empty());
}

TEST_F(FolderOpsTest, AFailedMonitorUpdateLeavesTheListUnsaved) {
  env_.platform().FailCall("MonitorQueueUpsert", EIO, env_.QueuePath("photo"));
  EXPECT_EQ(Thrown([&] {
              FolderAdd(Array({F("/photo/a"), F("/music/x")}), false);
            }),
            "502 MonitorQueue::Upsert failed, share=photo");
  EXPECT_TRUE(env_.FoldersFile().isNull());
  EXPECT_EQ(env_.SearchCommands(), (std::vector<std::string>{"index_create fileindex_music",
                                                             "index_create fileindex_photo"}));
  EXPECT_TRUE(env_.MonitorQueues().isMember(env_.QueuePath("music")));
  EXPECT_TRUE(env_.DaemonCommands().empty());
  EXPECT_EQ(env_.platform()
                .LogsContaining("Failed [!MonitorQueue::Upsert(monitor_queue, kAppName, "
                                "MONITOR_QUEUE_TYPE_APPLICATION)], reason: MonitorQueue::Upsert "
                                "failed, share=photo")
                .size(),
            1u);
}

TEST_F(FolderOpsTest, AnUnreachableDaemonLeavesTheListSavedAndNothingQueued) {
  env_.daemon().SetAnswerBytes("");
  env_.daemon().SetCloseAfterAnswer(true);
  EXPECT_EQ(Thrown([&] { FolderAdd(Array({F("/photo/a")}), false); }).substr(0, 4), "502 ");
  EXPECT_EQ(env_.FolderPaths(), std::vector<std::string>{"/photo/a"});
  EXPECT_TRUE(env_.QueueEvents("photo").empty());
}

TEST_F(FolderOpsTest, AnEventThatCannotBeQueuedFlagsTheShareForAReindex) {
  MakeDirs(env_.QueuePath("photo"));  // a queue that cannot be appended to
  FolderAdd(Array({F("/photo/a")}), false);
  EXPECT_EQ(env_.FolderPaths(), std::vector<std::string>{"/photo/a"});
  EXPECT_EQ(StatusMgr().GetShareStatus("photo"), kShareStatusNeedReindex);
}

TEST_F(FolderOpsTest, ListPagesAndCountsEveryFolder) {
  FolderAdd(Array({F("/photo/b"), F("/photo/a"), F("/music/x")}), false);
  struct Case {
    unsigned int offset;
    unsigned int limit;
    const char* sort_direction;
    std::vector<std::string> paths;
  } cases[] = {
      {0, 10, "asc", {"/music/x", "/photo/a", "/photo/b"}},
      {1, 1, "asc", {"/photo/a"}},
      {0, 2, "desc", {"/photo/b", "/photo/a"}},
      {3, 10, "asc", {}},
      {100, 10, "asc", {}},
  };
  for (const Case& c : cases) {
    Json::Value result;
    FolderList(result, c.offset, c.limit, "path", c.sort_direction, Json::Value(Json::arrayValue));
    std::vector<std::string> paths;
    for (const Json::Value& f : result["folder"]) paths.push_back(f["path"].asString());
    EXPECT_EQ(paths, c.paths) << c.offset << "/" << c.limit << " " << c.sort_direction;
    EXPECT_EQ(result["total"], 3u) << c.offset;
    EXPECT_EQ(result["offset"], c.offset);
  }
}

TEST_F(FolderOpsTest, ListLeavesOutAFolderWhoseStatusCannotBeMade) {
  FolderAdd(Array({F("/photo/a"), F("/music/x")}), false);
  env_.platform().RemoveShare("music");
  Json::Value result;
  FolderList(result, 0, 10, "path", "asc", Array({"status"}));
  ASSERT_EQ(result["folder"].size(), 1u) << result;
  EXPECT_EQ(result["folder"][0]["path"], "/photo/a");
  EXPECT_TRUE(result["folder"][0]["additional"].isMember("status"));
  EXPECT_EQ(result["total"], 2u);
}

TEST_F(FolderOpsTest, GetReadsOneFolderOrFailsWith902) {
  FolderAdd(Array({F("/photo/a", false, true, false, true)}), false);
  Json::Value result;
  FolderGet(result, "/photo/a");
  EXPECT_EQ(result["path"], "/photo/a");
  EXPECT_EQ(result["document"], false);
  EXPECT_EQ(result["photo"], true);
  EXPECT_EQ(Thrown([&] { FolderGet(result, "/photo/b"); }), "902 /photo/b");
}

TEST_F(FolderOpsTest, DeletingOneOfTwoFoldersRewritesTheMonitorAndQueuesWhatChanged) {
  Given(Array({F("/photo/a"), F("/photo/a/deep", true, false, false, false)}));
  FolderDelete("/photo/a/deep");
  EXPECT_EQ(env_.FolderPaths(), std::vector<std::string>{"/photo/a"});
  Json::Value config = env_.MonitorQueues()[env_.QueuePath("photo")]["config"];
  ASSERT_EQ(config.size(), 1u);
  EXPECT_EQ(config[0]["path"], Full("/photo/a"));
  ASSERT_EQ(NewDaemonCommands(), std::vector<std::string>{"notify_setting_changed photo"});
  EXPECT_EQ(env_.DaemonCommandObjects().back()["data"]["is_upsert"], false);
  EXPECT_EQ(NewSearchCommands(), std::vector<std::string>{});
  // /photo/a now governs the deep folder: audio, video and photo change.
  std::vector<Json::Value> events = env_.QueueEvents("photo");
  ASSERT_EQ(events.size(), 3u);
  EXPECT_EQ(events[2]["event"], 0x20000);
  EXPECT_EQ(events[2]["path"], Full("/photo/a/deep"));
  EXPECT_EQ(events[2]["data"], Cfg(false, true, true, true));
}

TEST_F(FolderOpsTest, DeletingTheLastFolderOfAShareDropsItsIndexMonitorAndStatus) {
  Given(Array({F("/photo/a"), F("/music/x")}));
  StatusMgr().SetShareStatus("photo", kShareStatusNeedReindex);
  size_t events_before = env_.QueueEvents("photo").size();
  FolderDelete("/photo/a");
  EXPECT_EQ(env_.FolderPaths(), std::vector<std::string>{"/music/x"});
  EXPECT_FALSE(env_.MonitorQueues().isMember(env_.QueuePath("photo")));
  EXPECT_TRUE(env_.MonitorQueues().isMember(env_.QueuePath("music")));
  EXPECT_EQ(NewDaemonCommands(), std::vector<std::string>{"notify_setting_changed photo"});
  EXPECT_EQ(NewSearchCommands(), std::vector<std::string>{"index_delete fileindex_photo"});
  EXPECT_EQ(StatusMgr().GetShareStatus("photo"), 0);
  EXPECT_EQ(env_.QueueEvents("photo").size(), events_before);
}

TEST_F(FolderOpsTest, DeletingAnUnknownOrEmptyPathChangesNothing) {
  Given(Array({F("/photo/a")}));
  env_.MarkFoldersFile();
  struct Case {
    std::string path;
    std::string error;
  } cases[] = {{"", "120 Missing path"},
               {"/photo/b", "902 /photo/b"},
               {"/photo/a/", "902 /photo/a/"},
               {"/photo", "902 /photo"}};
  for (const Case& c : cases) {
    EXPECT_EQ(Thrown([&] { FolderDelete(c.path); }), c.error) << c.path;
  }
  EXPECT_FALSE(env_.FoldersFileSaved());
  EXPECT_EQ(NewDaemonCommands(), std::vector<std::string>{});
  EXPECT_EQ(NewSearchCommands(), std::vector<std::string>{});
  EXPECT_EQ(env_.CallCount("MonitorQueueDelete") + env_.CallCount("MonitorQueueUpsert"), 0u);
}

TEST_F(FolderOpsTest, AFailedMonitorRemovalKeepsTheFolderListed) {
  Given(Array({F("/photo/a")}));
  env_.platform().FailCall("MonitorQueueDelete", EIO);
  EXPECT_EQ(Thrown([&] { FolderDelete("/photo/a"); }),
            "502 MonitorQueue::Delete failed, share=photo");
  EXPECT_EQ(env_.FolderPaths(), std::vector<std::string>{"/photo/a"});
  EXPECT_EQ(NewSearchCommands(), std::vector<std::string>{});
  env_.platform().ClearFailures();
  FolderDelete("/photo/a");
  EXPECT_TRUE(env_.FolderPaths().empty());
}

TEST_F(FolderOpsTest, ReindexClearsTheBitThenQueuesOneEventPerFolder) {
  Given(Array({F("/photo/a"), F("/photo/b"), F("/music/x")}));
  StatusMgr().SetShareStatus("photo", kShareStatusNeedReindex | 4);
  StatusMgr().SetShareStatus("music", kShareStatusNeedReindex);
  FolderReindex(Array({"/photo/b", "/photo/a"}));
  EXPECT_EQ(StatusMgr().GetShareStatus("photo"), 4) << "other bits stay";
  EXPECT_EQ(StatusMgr().GetShareStatus("music"), kShareStatusNeedReindex);
  std::vector<Json::Value> events = env_.QueueEvents("photo");
  ASSERT_EQ(events.size(), 4u);
  EXPECT_EQ(events[2]["event"], 0x10000);
  EXPECT_EQ(events[2]["path"], Full("/photo/b"));
  EXPECT_TRUE(events[2]["data"].isNull());
  EXPECT_EQ(events[3]["path"], Full("/photo/a"));
}

TEST_F(FolderOpsTest, BadReindexRequestsChangeNothing) {
  Given(Array({F("/photo/a")}));
  StatusMgr().SetShareStatus("photo", kShareStatusNeedReindex);
  struct Case {
    Json::Value paths;
    std::string error;
  } cases[] = {
      {Json::Value("/photo/a"), "120 \"/photo/a\""},
      {Array({"/photo/a", 7}), "120 Not a string, data=7"},
      {Array({"/photo/a", "/photo/zzz"}), "902 /photo/zzz"},
  };
  for (const Case& c : cases) {
    EXPECT_EQ(Thrown([&] { FolderReindex(c.paths); }), c.error) << c.paths;
  }
  EXPECT_EQ(StatusMgr().GetShareStatus("photo"), kShareStatusNeedReindex);
  EXPECT_EQ(env_.QueueEvents("photo").size(), 1u);
}

// Both children are fresh processes (the helper), not forks of this one, whose
// fake daemons' threads could hold a lock at fork time; they reach those
// daemons through their sockets under the same root.
TEST_F(FolderOpsTest, TwoProcessesAddingAtOnceBothEndUpInTheList) {
  constexpr int kFolders = 6;
  for (int i = 0; i < kFolders; ++i) MakeDirs(env_.Volume() + "/photo/p" + std::to_string(i));
  std::vector<pid_t> children;
  for (int child = 0; child < 2; ++child) {
    std::vector<std::string> args = {FolderAddHelper(), "photo", photo_};
    for (int i = child; i < kFolders; i += 2) args.push_back("/photo/p" + std::to_string(i));
    pid_t pid = Spawn(args);
    ASSERT_GT(pid, 0) << args[0];
    children.push_back(pid);
  }
  for (pid_t pid : children) {
    int status = 0;
    ASSERT_EQ(waitpid(pid, &status, 0), pid);
    EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0) << status;
  }
  std::vector<std::string> paths = env_.FolderPaths();
  std::sort(paths.begin(), paths.end());
  EXPECT_EQ(paths, (std::vector<std::string>{"/photo/p0", "/photo/p1", "/photo/p2", "/photo/p3",
                                             "/photo/p4", "/photo/p5"}));
  EXPECT_EQ(env_.QueueEvents("photo").size(), static_cast<size_t>(kFolders));
  EXPECT_EQ(env_.MonitorQueues()[env_.QueuePath("photo")]["config"].size(),
            static_cast<unsigned>(kFolders));
}

}  // namespace
}  // namespace vellis::fileindex
