// The management operations: adding, changing, listing, deleting and
// reindexing folders; pausing indexing; keeping shares, volumes, renames,
// recycle bins and the related services in step with the index. Every side
// effect is counted (indexes, monitor configurations, daemon commands,
// service requests, queued events), with the order of the steps, exact names
// (music2 is not music, /volume10 not /volume1) and what a failure leaves done.
#include "fileindex/index_mgr.h"

#include <gtest/gtest.h>
#include <spawn.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <functional>

#include "common/fs_util.h"
#include "common/root_path.h"
#include "fileindex/status_mgr.h"
#include "tests/support/folder_env.h"
#include "tests/support/parse_json.h"

namespace vellis::fileindex {
namespace {

using testing::FakeSearchDaemon;
using testing::ParseJson;
using testing::Strings;
using testing::Thrown;
using ServiceCalls = std::vector<testing::FakeServicesPlatform::ServiceCall>;

const std::string kAll = R"( {"audio":true,"document":true,"photo":true,"video":true})";
const Strings kPauseSteps = {"worker_delete music", "index_pause fileindex_music",
                             "MonitorQueueDelete"};
// The service calls made when the last indexed folder goes.
const ServiceCalls kServicesStopped = {{"QORUSMBSetSpotlight", "0"},
                                       {"QLIBServiceRestart", "samba"},
                                       {"QLIBServiceStop", "qorucontentextractd"},
                                       {"QLIBServicectlStop", "pkg-Vellis-fileindexd"}};

class FolderOpsTest : public testing::IndexMgrTest {
 protected:
  FolderOpsTest() {
    AddShare("music", {"/a", "/b", "/x"});
    AddShare("music2", {"/c"});
    photo_ = AddShare("photo", {"/a/deep", "/b"});
    AddShare("video", {"/v"}, "volume10");
  }

  // "<paused 0|1><volume_to_be_clean below the root>" per folder.
  std::string Paused() const {
    std::string out;
    for (const Json::Value& f : FoldersFile()) {
      const std::string volume = f["volume_to_be_clean"].asString();
      out += std::string(out.empty() ? "" : " ") + (f["paused"].asBool() ? "1" : "0") +
             volume.substr(volume.empty() ? 0 : root_.path().size());
    }
    return out;
  }

  std::string photo_;
};
using ShareOpsTest = FolderOpsTest;

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
            (ServiceCalls{{"QORUSMBSetSpotlight", "1"},
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

TEST_F(FolderOpsTest, RefusedRequestsChangeNothing) {
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
      {add(List(Strings{"/music2/c", "/photo/nope"})), "903 Path cannot index: /photo/nope"},
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

// Only the share's own folders are marked; a share without folders ("mus",
// "photo") is left alone.
TEST_F(ShareOpsTest, PauseAndResumeAreMirrorImagesOnTheSharesOwnFolders) {
  Given({"/music/a", "/music2/c", "/music/b"});
  SharePause("music");
  EXPECT_EQ(Sent(), kPauseSteps);
  EXPECT_EQ(Paused(), "1 0 1");
  EXPECT_FALSE(MonitorQueues().isMember(QueuePath("music")));
  EXPECT_EQ(MonitorPaths("music2").size(), 1u);
  ForgetSent();
  ShareResume("music");
  EXPECT_EQ(Sent(),
            (Strings{"worker_create music", "index_resume fileindex_music", "MonitorQueueUpsert"}));
  EXPECT_EQ(Paused(), "0 0 0");
  MarkFoldersFile();
  for (const char* share : {"mus", "photo"}) SharePause(share);
  EXPECT_FALSE(FoldersFileSaved());
  EXPECT_EQ(Events("music").size(), 2u) << "the queue is never touched";
}

// A failure at each step shows which steps came before it; calling again
// completes the pause. A failed resume never gives the daemon its worker.
TEST_F(ShareOpsTest, AFailedPauseOrResumeLeavesTheStepsBeforeItDone) {
  Given({"/music/a", "/music2/c", "/music/b"});
  struct Case {
    std::function<void()> inject;
    Strings sent;
  } cases[] = {
      {[&] { daemon_.SetAnswerBytes(""), daemon_.SetCloseAfterAnswer(true); },
       {"worker_delete music"}},
      {[&] { platform_.FailCall("MonitorQueueDelete", EIO); },
       {"worker_delete music", "MonitorQueueDelete"}},
      {[&] { search_.Push(FakeSearchDaemon::Failure(77, "no")); }, kPauseSteps},
  };
  for (const Case& c : cases) {
    ForgetSent();
    c.inject();
    EXPECT_NE(Thrown([] { SharePause("music"); }), "no error") << c.sent.back();
    EXPECT_EQ(Sent(), c.sent);
    EXPECT_EQ(Paused(), "0 0 0") << c.sent.back() << ": list saved";
    daemon_.SetAnswerBytes(std::string("\x10\0\0\0{\"success\":true}", 20));
    daemon_.SetCloseAfterAnswer(false);
    platform_.ClearFailures();
  }
  SharePause("music");
  ForgetSent();
  platform_.FailCall("MonitorQueueUpsert", EIO);
  EXPECT_EQ(Thrown([] { ShareResume("music"); }), "502 MonitorQueue::Upsert failed, share=music");
  EXPECT_EQ(Sent(), (Strings{"index_resume fileindex_music", "MonitorQueueUpsert"}));
  EXPECT_EQ(Paused(), "1 0 1");
}

TEST_F(ShareOpsTest, ClearingAShareRemovesItsDataIndexFoldersAndStatus) {
  Given({"/music/a", "/music2/c", "/music/b"});
  StatusMgr().SetShareStatus("music", kShareStatusNeedReindex);
  StatusMgr().SetShareStatus("music2", kShareStatusNeedReindex);
  platform_.SetExecResult(0, true);  // really remove
  const std::string data = Volume() + "/@fileindex/music";
  for (const char* file : {"/queue.tmp", "/db/segment", "/keep"})
    testing::WriteFile(data + file, "x");
  ShareClearPaused("music", Volume() + "/music");
  for (const char* gone : {"/queue", "/queue.tmp", "/db"}) {
    EXPECT_NE(access((data + gone).c_str(), F_OK), 0) << gone;
  }
  EXPECT_EQ(access((data + "/keep").c_str(), F_OK), 0);
  EXPECT_EQ(Sent(), Strings{"index_delete fileindex_music"});
  EXPECT_EQ(FolderPaths(), Strings{"/music2/c"});
  EXPECT_EQ(StatusMgr().GetShareStatus("music"), 0);
  EXPECT_EQ(StatusMgr().GetShareStatus("music2"), kShareStatusNeedReindex);
  EXPECT_TRUE(platform_.ServiceCalls().empty()) << "folders are left";
  ShareClearPaused("music2", Volume() + "/music2");  // the last share: the services stop
  EXPECT_EQ(platform_.ServiceCalls(), kServicesStopped);
}

// The share now lives on volume2; the platform reports its new path.
TEST_F(ShareOpsTest, MigrationMovesTheIndexAndTheMonitorAndQueuesTheMove) {
  Given({"/music/a", "/music2/c", "/music/b"});
  const std::string old_path = Volume() + "/music", old_queue = QueuePath("music");
  const std::string new_path = AddShare("music", {"/a", "/b"}, "volume2");
  ShareMigrate("music", old_path);
  EXPECT_EQ(Sent(), (Strings{"worker_delete music", "worker_create music",
                             "index_config_set fileindex_music", "MonitorQueueDelete",
                             "MonitorQueueUpsert"}));
  EXPECT_EQ(search_.Requests().back()["data"]["data"]["path"],
            Volume("volume2") + "/@fileindex/music/db");
  EXPECT_FALSE(MonitorQueues().isMember(old_queue));
  EXPECT_EQ(MonitorPaths("music")[0], new_path + "/a");
  EXPECT_EQ(Events("music"), (Strings{"256 /music <- /music", "65536 /music/a", "65536 /music/b"}));
  EXPECT_NE(testing::ReadFile(QueuePath("music")).find(R"("path_old":")" + old_path + "\""),
            std::string::npos);
}

// A folder paused before the volume is resumed with it; a clear removes the
// shares that the pause marked but keeps their indexes, and stops the
// services with the last folder.
TEST_F(ShareOpsTest, AVolumeIsPausedResumedAndClearedShareByShare) {
  Given({"/photo/a", "/video/v", "/photo/b", "/music/a"});
  StatusMgr().SetShareStatus("photo", kShareStatusNeedReindex);
  SharePause("music");
  ForgetSent();
  VolumePause(Volume());
  EXPECT_EQ(Paused(), "1/volume1 0 1/volume1 1/volume1");
  EXPECT_EQ(Sent(),
            (Strings{"worker_delete music", "worker_delete photo", "index_pause fileindex_music",
                     "index_pause fileindex_photo", "MonitorQueueDelete", "MonitorQueueDelete"}));
  VolumeResume(Volume());
  EXPECT_EQ(Paused(), "0/volume1 0 0/volume1 0/volume1");
  EXPECT_EQ(MonitorPaths("photo").size(), 2u);
  VolumePause(Volume());
  ForgetSent();
  VolumeClearPaused(Volume());
  EXPECT_EQ(FolderPaths(), Strings{"/video/v"});
  EXPECT_EQ(StatusMgr().GetShareStatus("photo"), 0);
  EXPECT_EQ(Sent(), Strings{});
  EXPECT_TRUE(platform_.ServiceCalls().empty()) << "a folder is left";
  VolumePause(Volume("volume10"));
  VolumeClearPaused(Volume("volume10"));
  EXPECT_EQ(platform_.ServiceCalls(), kServicesStopped);
}

// /homes/alice2 is not in alice's home.
TEST_F(ShareOpsTest, UserRenameMovesTheHomeAndWhatIsInsideItOnly) {
  AddShare("homes", {"/alice/docs", "/alice2/docs"});
  Given({"/homes/alice/docs", "/homes/alice", "/homes/alice2/docs"});
  UserRename("alice", "bob");
  EXPECT_EQ(FolderPaths(), (Strings{"/homes/bob/docs", "/homes/bob", "/homes/alice2/docs"}));
  EXPECT_EQ(LogCount("Update homes rule: [/homes/alice/docs] -> [/homes/bob/docs]"), 1u);
  EXPECT_EQ(LogCount("Update homes rule: ["), 2u);
  EXPECT_EQ(Events("homes").back(), "256 /homes/bob <- /homes/alice");
}

// The share has been renamed on the platform before the hook runs.
TEST_F(ShareOpsTest, ShareRenameMovesTheSharesFoldersIndexAndDocuments) {
  Given({"/music/a", "/music2/c", "/music/b"});
  ASSERT_EQ(rename((Volume() + "/music").c_str(), (Volume() + "/tunes").c_str()), 0);
  platform_.RemoveShare("music");
  AddShare("tunes");
  ShareRename("music", "tunes");
  EXPECT_EQ(FolderPaths(), (Strings{"/tunes/a", "/music2/c", "/tunes/b"}));
  EXPECT_EQ(Sent(), Strings{"index_config_set fileindex_music"});
  EXPECT_EQ(
      search_.Requests().back()["data"]["data"],
      ParseJson(R"({"id":"fileindex_tunes","path":")" + Volume() + R"(/@fileindex/tunes/db"})"));
  EXPECT_EQ(Events("tunes"), Strings{"256 /tunes <- /music"});
}

// Disable enumerates every home; a bin outside every share is logged and
// the others queued; a failing enumeration queues nothing. A share's own bin
// is queued only while the share's path is a real directory.
TEST_F(ShareOpsTest, RecycleBinTriggersQueueOneReindexPerBinInOrder) {
  const std::string homes = AddShare("homes"), photo = Volume() + "/photo";
  platform_.SetHomeRecyclePaths(
      {homes + "/bob/#recycle", "/nowhere/x/#recycle", "", homes + "/alice/#recycle"});
  HomeEnable(sdk::kAuthLdap);
  HomeDisable(sdk::kAuthDomain);
  const Strings both = {"65536 /homes/bob/#recycle", "65536 /homes/alice/#recycle"};
  EXPECT_EQ(Events("homes"), (Strings{both[0], both[1], both[0], both[1]}));
  EXPECT_EQ(platform_.AuthTypes(), std::vector<int>{sdk::kAuthLdap});
  EXPECT_EQ(LogCount("AddCustomEvent failed"), 2u);
  platform_.FailCall("QORURecycleHomeEnumRecyclePathForAuthType", ENOENT);
  platform_.FailCall("QORURecycleHomeEnumRecyclePath", ENOENT);
  HomeEnable(sdk::kAuthLocal);
  HomeDisable(sdk::kAuthDomain);
  EXPECT_EQ(Events("homes").size(), 4u);
  EXPECT_EQ(LogCount("QORURecycleHomeEnumRecyclePathForAuthType failed. auth: 1") +
                LogCount("QORURecycleHomeEnumRecyclePath failed. auth: 2"),
            2u);
  ShareCheckRecycle("photo");
  ASSERT_EQ(rename(photo.c_str(), (photo + ".old").c_str()), 0);
  ShareCheckRecycle("photo");
  ASSERT_EQ(symlink((photo + ".old").c_str(), photo.c_str()), 0);
  ShareCheckRecycle("photo");
  EXPECT_EQ(Events("photo"), Strings{"65536 /photo/#recycle"});
  EXPECT_EQ(Thrown([] { ShareCheckRecycle("nosuch"); }).substr(0, 4), "800 ");
}

// No restart after a failed switch; the daemons are still asked for.
TEST_F(ShareOpsTest, EveryServiceStepRunsWhateverTheOneBeforeDid) {
  platform_.SetErrorSite("smb_conf.cpp", 42);
  for (const char* call : {"QORUSMBSetSpotlight", "QLIBServiceStart", "QLIBServicectlStart",
                           "QLIBServiceStop", "QLIBServicectlStop"}) {
    platform_.FailCall(call, ENOENT);
  }
  SetupRelatedServices(true);
  SetupRelatedServices(false);
  EXPECT_EQ(platform_.ServiceCalls(),
            (ServiceCalls{{"QORUSMBSetSpotlight", "1"},
                          {"QLIBServiceStart", "qorucontentextractd"},
                          {"QLIBServicectlStart", "pkg-Vellis-fileindexd"},
                          {"QLIBServiceStop", "qorucontentextractd"},
                          {"QLIBServicectlStop", "pkg-Vellis-fileindexd"}}));
  for (const char* line :
       {"QORUSMBSetSpotlight failed: err=[0x0002 smb_conf.cpp:42]",
        "Failed [0 > QLIBServiceStart(\"qorucontentextractd\", TRUE)]",
        "Failed [0 > QLIBServicectlStart(\"pkg-Vellis-fileindexd\", QLIB_SERVICECTL_UPSTART)]",
        "Failed [0 > QLIBServiceStop(\"qorucontentextractd\", FALSE)]",
        "Failed [0 > QLIBServicectlStop(\"pkg-Vellis-fileindexd\", QLIB_SERVICECTL_UPSTART)]"}) {
    EXPECT_EQ(LogCount(line), 1u) << line;
  }
  platform_.ClearFailures();  // the switch works, the restart fails
  platform_.FailCall("QLIBServiceRestart", ENOENT);
  SetupRelatedServices(true);
  EXPECT_EQ(LogCount("QLIBServiceRestart failed: err="), 1u);
}

// A list that cannot be read counts as empty, and is logged.
TEST_F(ShareOpsTest, PrepareServicesFollowsWhetherAnyFolderIsListed) {
  PrepareServices();
  EXPECT_EQ(platform_.ServiceCalls().back().call, "QLIBServicectlStop");
  Given({"/music/a"});
  PrepareServices();
  EXPECT_EQ(platform_.ServiceCalls().back().call, "QLIBServicectlStart");
  testing::WriteFile(RootPath(kFileIndexFoldersCfgPath), "{not json");
  PrepareServices();
  EXPECT_EQ(platform_.ServiceCalls().back().call, "QLIBServicectlStop");
  EXPECT_EQ(LogCount("Cannot load folder list, code=504"), 1u);
}

// The pause of indexing as a whole is saved by root and announced.
TEST_F(ShareOpsTest, IndexingPauseAndResumeAreSavedAndAnnounced) {
  const std::string status_file = RootPath(kFileIndexStatusCfgPath);
  platform_.SetTime(1700000000);
  EXPECT_EQ(StatusMgr().GetPauseInfo(), -1) << "no file: not paused";
  EXPECT_NE(access(status_file.c_str(), F_OK), 0) << "loading must not create the file";
  StatusMgr().Pause(2);
  EXPECT_EQ(StatusMgr().GetPauseInfo(), 1700007200);
  struct stat st;
  ASSERT_EQ(stat(status_file.c_str(), &st), 0);
  EXPECT_EQ(st.st_mode & 07777, 0644u);
  StatusMgr().Resume();
  EXPECT_EQ(StatusMgr().GetPauseInfo(), -1);
  EXPECT_EQ(
      daemon_.Commands(),
      (std::vector<Json::Value>{ParseJson(R"({"type":"pause","data":{"resume_time":1700007200}})"),
                                ParseJson(R"({"type":"resume","data":null})")}));
  EXPECT_EQ(platform_.Resets(), (Strings{"root", "root"})) << "each save runs as root";
}

}  // namespace
}  // namespace vellis::fileindex
