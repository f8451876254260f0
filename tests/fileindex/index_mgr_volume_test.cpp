// Pausing, resuming and forgetting the shares of a volume: which folders
// lie on it, how often each share is handled, and the saved list.
#include <gtest/gtest.h>

#include <cerrno>
#include <string>
#include <vector>

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

class VolumeOpsTest : public ::testing::Test {
 protected:
  VolumeOpsTest() {
    env_.AddShare("photo", "volume1");
    env_.AddShare("music", "volume1");
    env_.AddShare("video", "volume10");
    for (const char* dir :
         {"/volume1/photo/a", "/volume1/photo/b", "/volume1/music/x", "/volume10/video/v"}) {
      MakeDirs(env_.root().Path(dir));
    }
    Json::Value list(Json::arrayValue);
    for (const char* path : {"/photo/a", "/video/v", "/photo/b", "/music/x"}) {
      list.append(IndexMgrEnv::FolderJson(path));
    }
    FolderAdd(list, false);
    Reset();
  }

  void Reset() { env_.ForgetSent(); }
  std::vector<std::string> NewSearch() const { return env_.NewSearchCommands(); }
  std::vector<std::string> NewDaemon() const { return env_.NewDaemonCommands(); }

  // "<path> paused=<0|1> volume=<volume_to_be_clean relative to the root>"
  // per folder, in list order.
  std::vector<std::string> Folders() const {
    std::vector<std::string> out;
    for (const Json::Value& f : env_.FoldersFile()) {
      std::string volume = f["volume_to_be_clean"].asString();
      if (volume.rfind(env_.root().path(), 0) == 0)
        volume = volume.substr(env_.root().path().size());
      out.push_back(f["path"].asString() + " paused=" + (f["paused"].asBool() ? "1" : "0") +
                    " volume=" + volume);
    }
    return out;
  }

  std::string V1() const { return env_.Volume("volume1"); }

  IndexMgrEnv env_;
};

TEST_F(VolumeOpsTest, PauseMarksTheVolumesFoldersAndStopsEachShareOnce) {
  VolumePause(V1());
  EXPECT_EQ(Folders(), (std::vector<std::string>{
                           "/photo/a paused=1 volume=/volume1",
                           "/video/v paused=0 volume=", "/photo/b paused=1 volume=/volume1",
                           "/music/x paused=1 volume=/volume1"}));
  EXPECT_EQ(NewDaemon(), (std::vector<std::string>{"worker_delete music", "worker_delete photo"}));
  EXPECT_EQ(NewSearch(), (std::vector<std::string>{"index_pause fileindex_music",
                                                   "index_pause fileindex_photo"}));
  EXPECT_EQ(env_.CallCount("MonitorQueueDelete"), 2u);
  EXPECT_FALSE(env_.MonitorQueues().isMember(env_.QueuePath("photo")));
  EXPECT_TRUE(env_.MonitorQueues().isMember(env_.QueuePath("video")));
}

TEST_F(VolumeOpsTest, PauseSavesTheListBeforeTellingAnyone) {
  env_.daemon().SetAnswerBytes("");
  env_.daemon().SetCloseAfterAnswer(true);
  EXPECT_EQ(Thrown([&] { VolumePause(V1()); }).substr(0, 4), "502 ");
  EXPECT_EQ(Folders()[0], "/photo/a paused=1 volume=/volume1");
  EXPECT_EQ(NewSearch(), std::vector<std::string>{}) << "stopped at the first share";
  EXPECT_EQ(env_.CallCount("MonitorQueueDelete"), 0u);
}

TEST_F(VolumeOpsTest, AFailureLeavesLaterSharesAsTheyWere) {
  // music's index pause fails: photo (after music by name) is not touched.
  env_.search().Push(FakeSearchDaemon::Failure(55, "down"));
  EXPECT_EQ(Thrown([&] { VolumePause(V1()); }), "55 Request failed, msg=down");
  EXPECT_EQ(NewDaemon(), std::vector<std::string>{"worker_delete music"});
  EXPECT_TRUE(env_.MonitorQueues().isMember(env_.QueuePath("photo")));
  EXPECT_FALSE(env_.MonitorQueues().isMember(env_.QueuePath("music")));
}

TEST_F(VolumeOpsTest, ResumeBringsBackPausedFoldersAndKeepsTheVolume) {
  VolumePause(V1());
  Reset();
  VolumeResume(V1());
  EXPECT_EQ(Folders(), (std::vector<std::string>{
                           "/photo/a paused=0 volume=/volume1",
                           "/video/v paused=0 volume=", "/photo/b paused=0 volume=/volume1",
                           "/music/x paused=0 volume=/volume1"}));
  EXPECT_EQ(NewSearch(), (std::vector<std::string>{"index_resume fileindex_music",
                                                   "index_resume fileindex_photo"}));
  EXPECT_EQ(NewDaemon(), (std::vector<std::string>{"worker_create music", "worker_create photo"}));
  EXPECT_EQ(env_.MonitorQueues()[env_.QueuePath("photo")]["config"].size(), 2u);
}

TEST_F(VolumeOpsTest, ResumeRecreatesTheWorkerBeforeTheMonitor) {
  VolumePause(V1());
  Reset();
  env_.platform().FailCall("MonitorQueueUpsert", EIO);
  EXPECT_EQ(Thrown([&] { VolumeResume(V1()); }), "502 MonitorQueue::Upsert failed, share=music");
  EXPECT_EQ(NewSearch(), std::vector<std::string>{"index_resume fileindex_music"});
  EXPECT_EQ(NewDaemon(), std::vector<std::string>{"worker_create music"});
  EXPECT_EQ(Folders()[3], "/music/x paused=0 volume=/volume1") << "saved first";
}

TEST_F(VolumeOpsTest, AVolumeWithoutFoldersSavesTheListAndSendsNothing) {
  env_.MarkFoldersFile();
  for (const std::string& mount : {env_.Volume("volume2"), env_.root().Path("/volume")}) {
    VolumePause(mount);
    VolumeResume(mount);
  }
  EXPECT_TRUE(env_.FoldersFileSaved());
  EXPECT_EQ(Folders()[0], "/photo/a paused=0 volume=");
  EXPECT_EQ(NewSearch(), std::vector<std::string>{});
  EXPECT_EQ(NewDaemon(), std::vector<std::string>{});
  EXPECT_EQ(env_.CallCount("MonitorQueueDelete") + env_.CallCount("MonitorQueueUpsert"), 0u);
}

TEST_F(VolumeOpsTest, AnEmptyMountPointIsRefusedBeforeLoading) {
  env_.MarkFoldersFile();
  for (auto op : {VolumePause, VolumeResume, VolumeClearPaused}) {
    EXPECT_EQ(Thrown([&] { op(""); }), "120 Missing mount point");
  }
  EXPECT_FALSE(env_.FoldersFileSaved());
}

TEST_F(VolumeOpsTest, ClearRemovesTheSharesThePauseMarked) {
  StatusMgr().SetShareStatus("photo", kShareStatusNeedReindex);
  StatusMgr().SetShareStatus("video", kShareStatusNeedReindex);
  VolumePause(V1());
  Reset();
  VolumeClearPaused(V1());
  EXPECT_EQ(Folders(), std::vector<std::string>{"/video/v paused=0 volume="});
  EXPECT_EQ(StatusMgr().GetShareStatus("photo"), 0);
  EXPECT_EQ(StatusMgr().GetShareStatus("video"), kShareStatusNeedReindex);
  EXPECT_EQ(env_.platform().LogsContaining("Remove share music from folder mgr").size(), 1u);
  EXPECT_EQ(env_.platform().LogsContaining("Remove share photo from folder mgr").size(), 1u);
  EXPECT_EQ(NewSearch(), std::vector<std::string>{}) << "the indexes stay";
  EXPECT_EQ(env_.CallCount("MonitorQueueDelete"), 0u);
  EXPECT_TRUE(env_.platform().ServiceCalls().empty()) << "a folder is left";

  VolumePause(env_.Volume("volume10"));
  Reset();
  VolumeClearPaused(env_.Volume("volume10"));
  EXPECT_TRUE(env_.FolderPaths().empty());
  EXPECT_EQ(env_.platform().ServiceCalls(), testing::ServicesStoppedCalls());
}

TEST_F(VolumeOpsTest, ClearAfterResumeOrForAnotherVolumeRemovesNothing) {
  VolumePause(V1());
  VolumeResume(V1());
  VolumeClearPaused(V1());
  EXPECT_EQ(env_.FolderPaths().size(), 4u);
  VolumePause(V1());
  for (const std::string& mount : {env_.Volume("volume10"), V1() + "/", V1() + "0"}) {
    VolumeClearPaused(mount);
    EXPECT_EQ(env_.FolderPaths().size(), 4u) << mount;
  }
}

TEST_F(VolumeOpsTest, AFolderPausedBeforeTheVolumeIsResumedWithIt) {
  SharePause("music");
  VolumePause(V1());
  VolumeResume(V1());
  EXPECT_EQ(Folders()[3], "/music/x paused=0 volume=/volume1");
}

}  // namespace
}  // namespace vellis::fileindex
