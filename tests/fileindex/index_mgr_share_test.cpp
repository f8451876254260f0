// Pausing, resuming, forgetting and migrating shares: the order of the
// steps, exact share names, and what a failure leaves done.
#include <gtest/gtest.h>

#include <cerrno>
#include <functional>
#include <string>
#include <vector>

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
using testing::WriteFile;
using Call = testing::FakeServicesPlatform::ServiceCall;

class ShareOpsTest : public ::testing::Test {
 protected:
  ShareOpsTest() {
    env_.AddShare("music");
    env_.AddShare("music2");
    env_.AddShare("photo");
    for (const char* dir : {"/music/a", "/music/b", "/music2/c", "/photo/d"}) {
      MakeDirs(env_.Volume() + dir);
    }
    Json::Value list(Json::arrayValue);
    for (const char* path : {"/music/a", "/music2/c", "/music/b"}) {
      list.append(IndexMgrEnv::FolderJson(path));
    }
    FolderAdd(list, false);
    Reset();
  }

  void Reset() { env_.ForgetSent(); }

  // Everything that the operation did, in order of the pieces: daemon
  // commands, then search requests, then monitor calls.
  std::vector<std::string> Sent() const {
    std::vector<std::string> out;
    std::vector<std::string> daemon = env_.NewDaemonCommands();
    out.insert(out.end(), daemon.begin(), daemon.end());
    std::vector<std::string> search = env_.NewSearchCommands();
    out.insert(out.end(), search.begin(), search.end());
    for (const std::string& call : env_.platform().Calls()) {
      if (call.rfind("MonitorQueue", 0) == 0) out.push_back(call);
    }
    return out;
  }

  // The paused flag of each folder, in list order.
  std::vector<bool> Paused() const {
    std::vector<bool> out;
    for (const Json::Value& f : env_.FoldersFile()) out.push_back(f["paused"].asBool());
    return out;
  }

  IndexMgrEnv env_;
};

TEST_F(ShareOpsTest, PauseMarksOnlyTheSharesFoldersAndDropsItsMonitorQueue) {
  env_.MarkFoldersFile();
  SharePause("music");
  EXPECT_EQ(Sent(), (std::vector<std::string>{"worker_delete music", "index_pause fileindex_music",
                                              "MonitorQueueDelete"}));
  EXPECT_EQ(Paused(), (std::vector<bool>{true, false, true})) << "music2 is another share";
  EXPECT_TRUE(env_.FoldersFileSaved());
  EXPECT_FALSE(env_.MonitorQueues().isMember(env_.QueuePath("music")));
  EXPECT_TRUE(env_.MonitorQueues().isMember(env_.QueuePath("music2")));
  EXPECT_EQ(env_.QueueEvents("music").size(), 2u) << "the queue is not touched";
}

TEST_F(ShareOpsTest, PauseIsOrderedDaemonMonitorIndex) {
  // A failure at each step shows which steps came before it.
  struct Case {
    const char* what;
    std::function<void()> inject;
    std::vector<std::string> sent;
    bool monitor_removed;
  } cases[] = {
      {"daemon fails",
       [&] {
         env_.daemon().SetAnswerBytes("");
         env_.daemon().SetCloseAfterAnswer(true);
       },
       {"worker_delete music"},
       false},
      {"monitor fails",
       [&] { env_.platform().FailCall("MonitorQueueDelete", EIO); },
       {"worker_delete music", "MonitorQueueDelete"},
       false},
      {"index fails",
       [&] { env_.search().Push(FakeSearchDaemon::Failure(77, "no")); },
       {"worker_delete music", "index_pause fileindex_music", "MonitorQueueDelete"},
       true},
  };
  for (const Case& c : cases) {
    Reset();
    c.inject();
    EXPECT_NE(Thrown([] { SharePause("music"); }), "no error") << c.what;
    EXPECT_EQ(Sent(), c.sent) << c.what;
    EXPECT_EQ(env_.MonitorQueues().isMember(env_.QueuePath("music")), !c.monitor_removed) << c.what;
    EXPECT_EQ(Paused(), (std::vector<bool>{false, false, false})) << c.what << ": list saved";
    env_.daemon().SetAnswerBytes(std::string("\x10\0\0\0{\"success\":true}", 20));
    env_.daemon().SetCloseAfterAnswer(false);
    env_.platform().ClearFailures();
    // Calling again completes the pause.
    ShareResume("music");
  }
  Reset();
  SharePause("music");
  EXPECT_EQ(Paused(), (std::vector<bool>{true, false, true}));
}

TEST_F(ShareOpsTest, ResumeGoesIndexMonitorWorkerAndClearsTheFlags) {
  SharePause("music");
  Reset();
  ShareResume("music");
  EXPECT_EQ(Sent(), (std::vector<std::string>{"worker_create music", "index_resume fileindex_music",
                                              "MonitorQueueUpsert"}));
  EXPECT_EQ(Paused(), (std::vector<bool>{false, false, false}));
  Json::Value config = env_.MonitorQueues()[env_.QueuePath("music")]["config"];
  ASSERT_EQ(config.size(), 2u);
  EXPECT_EQ(config[0]["path"], env_.Volume() + "/music/a");
  EXPECT_EQ(config[1]["path"], env_.Volume() + "/music/b");

  // Resume is the mirror image: a failing monitor update means the daemon
  // never got its worker back.
  SharePause("music");
  Reset();
  env_.platform().FailCall("MonitorQueueUpsert", EIO);
  EXPECT_EQ(Thrown([] { ShareResume("music"); }), "502 MonitorQueue::Upsert failed, share=music");
  EXPECT_EQ(Sent(),
            (std::vector<std::string>{"index_resume fileindex_music", "MonitorQueueUpsert"}));
  EXPECT_EQ(Paused(), (std::vector<bool>{true, false, true}));
}

TEST_F(ShareOpsTest, PausingAPausedShareRepeatsEveryStep) {
  SharePause("music");
  Reset();
  SharePause("music");
  EXPECT_EQ(Sent(), (std::vector<std::string>{"worker_delete music", "index_pause fileindex_music",
                                              "MonitorQueueDelete"}));
  EXPECT_EQ(Paused(), (std::vector<bool>{true, false, true}));
}

TEST_F(ShareOpsTest, ASharesWithoutFoldersOrWithoutANameAreLeftAlone) {
  env_.MarkFoldersFile();
  struct Case {
    const char* what;
    std::function<void()> op;
    std::string error;
  } cases[] = {
      {"pause of an unindexed share", [] { SharePause("photo"); }, "no error"},
      {"resume of an unindexed share", [] { ShareResume("photo"); }, "no error"},
      {"pause of a share that does not exist", [] { SharePause("nosuch"); }, "no error"},
      {"pause of a prefix of a share", [] { SharePause("mus"); }, "no error"},
      {"pause without a name", [] { SharePause(""); }, "120 Missing share name"},
      {"resume without a name", [] { ShareResume(""); }, "120 Missing share name"},
      {"clean-up without a name", [] { ShareClearPaused("", "/volume1/music"); },
       "120 Missing share name"},
      {"clean-up without a path", [] { ShareClearPaused("music", ""); }, "120 Missing share path"},
      {"migrate without a name", [] { ShareMigrate("", "/volume9/music"); },
       "120 Missing share name"},
      {"migrate without the old path", [] { ShareMigrate("music", ""); }, "120 Missing share path"},
      {"migrate of an unindexed share", [] { ShareMigrate("photo", "/volume9/photo"); },
       "no error"},
  };
  for (const Case& c : cases) {
    EXPECT_EQ(Thrown(c.op), c.error) << c.what;
    EXPECT_EQ(Sent(), std::vector<std::string>{}) << c.what;
    EXPECT_FALSE(env_.FoldersFileSaved()) << c.what;
  }
  EXPECT_TRUE(env_.platform().ServiceCalls().empty());
  EXPECT_TRUE(env_.platform().Execs().empty());
}

TEST_F(ShareOpsTest, ClearingAShareRemovesItsDataIndexFoldersAndStatus) {
  StatusMgr().SetShareStatus("music", kShareStatusNeedReindex);
  StatusMgr().SetShareStatus("music2", kShareStatusNeedReindex);
  const std::string share_path = env_.Volume() + "/music";
  ShareClearPaused("music", share_path);

  std::vector<std::string> removed;
  for (const auto& exec : env_.platform().Execs()) {
    EXPECT_EQ(exec.program, "/bin/rm");
    ASSERT_EQ(exec.args.size(), 2u);
    EXPECT_EQ(exec.args[0], "-rf");
    removed.push_back(exec.args[1]);
  }
  const std::string data = env_.Volume() + "/@fileindex/music";
  EXPECT_EQ(removed,
            (std::vector<std::string>{data + "/queue", data + "/queue.tmp", data + "/db"}));
  EXPECT_EQ(Sent(), std::vector<std::string>{"index_delete fileindex_music"});
  EXPECT_EQ(env_.FolderPaths(), std::vector<std::string>{"/music2/c"});
  EXPECT_EQ(StatusMgr().GetShareStatus("music"), 0);
  EXPECT_EQ(StatusMgr().GetShareStatus("music2"), kShareStatusNeedReindex);
  EXPECT_TRUE(env_.platform().ServiceCalls().empty()) << "folders are left";

  // The last share: the services stop.
  ShareClearPaused("music2", env_.Volume() + "/music2");
  EXPECT_TRUE(env_.FolderPaths().empty());
  EXPECT_EQ(env_.platform().ServiceCalls(), testing::ServicesStoppedCalls());
}

TEST_F(ShareOpsTest, AShareGoneFromThePlatformIsClearedAllTheSame) {
  env_.platform().RemoveShare("music");
  EXPECT_EQ(Thrown([] { FolderDelete("/music/a"); }).substr(0, 4), "800 ");
  ShareClearPaused("music", env_.Volume() + "/music");
  EXPECT_EQ(env_.FolderPaths(), std::vector<std::string>{"/music2/c"});
  EXPECT_EQ(Sent(), std::vector<std::string>{"index_delete fileindex_music"});
}

TEST_F(ShareOpsTest, AClearThatCannotComposeItsPathsStopsThere) {
  const std::string share_path = env_.Volume() + "/music";
  env_.platform().FailCall("FILEIDXDBPathCompose", EINVAL, share_path);
  EXPECT_EQ(Thrown([&] { ShareClearPaused("music", share_path); }),
            "502 FILEIDXDBPathCompose failed, share_path=" + share_path);
  EXPECT_EQ(env_.platform().Execs().size(), 2u) << "the queues are removed already";
  EXPECT_EQ(Sent(), std::vector<std::string>{});
  EXPECT_EQ(env_.FolderPaths().size(), 3u);
}

TEST_F(ShareOpsTest, MigrationMovesTheIndexAndTheMonitorAndQueuesTheMove) {
  // The share now lives on volume2; the platform reports its new path.
  const std::string old_path = env_.Volume() + "/music";
  const std::string new_path = env_.AddShare("music", "volume2");
  MakeDirs(new_path + "/a");
  MakeDirs(new_path + "/b");
  const Json::Value monitor_before = env_.MonitorQueues();
  const std::string old_queue = env_.Volume() + "/@fileindex/music/queue";
  ASSERT_TRUE(monitor_before.isMember(old_queue));

  ShareMigrate("music", old_path);
  EXPECT_EQ(Sent(), (std::vector<std::string>{"worker_delete music", "worker_create music",
                                              "index_config_set fileindex_music",
                                              "MonitorQueueDelete", "MonitorQueueUpsert"}));
  const Json::Value migrate = env_.search().Requests().back();
  EXPECT_EQ(migrate["data"]["data"]["path"], env_.Volume("volume2") + "/@fileindex/music/db")
      << migrate;
  Json::Value monitor = env_.MonitorQueues();
  EXPECT_FALSE(monitor.isMember(old_queue));
  Json::Value config = monitor[env_.QueuePath("music")]["config"];
  ASSERT_EQ(config.size(), 2u) << monitor;
  EXPECT_EQ(config[0]["path"], new_path + "/a");

  std::vector<Json::Value> events = env_.QueueEvents("music");
  ASSERT_EQ(events.size(), 3u);
  EXPECT_EQ(events[0]["event"], 0x100);
  EXPECT_EQ(events[0]["path"], new_path);
  EXPECT_EQ(events[0]["path_old"], old_path);
  EXPECT_EQ(events[1]["event"], 0x10000);
  EXPECT_EQ(events[1]["path"], new_path + "/a");
  EXPECT_EQ(events[2]["path"], new_path + "/b");
}

}  // namespace
}  // namespace vellis::fileindex
