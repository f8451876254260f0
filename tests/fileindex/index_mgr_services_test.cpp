// The related services, the monitor configuration of a share and the
// removal of a share's local index data.
#include <gtest/gtest.h>

#include <cerrno>
#include <functional>
#include <string>
#include <vector>

#include "common/fs_util.h"
#include "common/root_path.h"
#include "fileindex/index_mgr.h"
#include "fileindex/status_mgr.h"
#include "tests/support/index_mgr_env.h"

namespace vellis::fileindex {
namespace {

using testing::IndexMgrEnv;
using testing::MakeDirs;
using testing::Thrown;
using testing::WriteFile;
using Call = testing::FakeServicesPlatform::ServiceCall;

class ServicesTest : public ::testing::Test {
 protected:
  ServicesTest() {
    env_.AddShare("music");
    env_.AddShare("music2");
    for (const char* dir : {"/music/a", "/music/b", "/music2/c"}) MakeDirs(env_.Volume() + dir);
  }

  IndexMgrEnv env_;
};

TEST_F(ServicesTest, EnablingAndDisablingFollowTheSearchSwitch) {
  struct Case {
    bool enable;
    bool spotlight_on;
    std::vector<Call> calls;
  } cases[] = {
      {true,
       false,
       {{"QORUSMBSetSpotlight", "1"},
        {"QLIBServiceRestart", "samba"},
        {"QLIBServiceStart", "qorucontentextractd"},
        {"QLIBServicectlStart", "pkg-Vellis-fileindexd"}}},
      {true,
       true,
       {{"QLIBServiceStart", "qorucontentextractd"},
        {"QLIBServicectlStart", "pkg-Vellis-fileindexd"}}},
      {false,
       true,
       {{"QORUSMBSetSpotlight", "0"},
        {"QLIBServiceRestart", "samba"},
        {"QLIBServiceStop", "qorucontentextractd"},
        {"QLIBServicectlStop", "pkg-Vellis-fileindexd"}}},
      {false,
       false,
       {{"QLIBServiceStop", "qorucontentextractd"},
        {"QLIBServicectlStop", "pkg-Vellis-fileindexd"}}},
  };
  for (const Case& c : cases) {
    env_.platform().SetSpotlight(c.spotlight_on);
    env_.platform().ClearServiceCalls();
    SetupRelatedServices(c.enable);
    EXPECT_EQ(env_.platform().ServiceCalls(), c.calls) << c.enable << c.spotlight_on;
    EXPECT_EQ(env_.platform().Spotlight(), c.enable) << c.enable << c.spotlight_on;
  }
}

TEST_F(ServicesTest, EveryStepRunsWhateverTheOneBeforeDid) {
  env_.platform().SetErrorSite("smb_conf.cpp", 42);
  for (const char* call : {"QORUSMBSetSpotlight", "QLIBServiceStart", "QLIBServicectlStart",
                           "QLIBServiceStop", "QLIBServicectlStop"}) {
    env_.platform().FailCall(call, ENOENT);
  }
  SetupRelatedServices(true);
  SetupRelatedServices(false);
  // No restart after a failed switch; the daemons are still asked for.
  EXPECT_EQ(env_.platform().ServiceCalls(),
            (std::vector<Call>{{"QORUSMBSetSpotlight", "1"},
                               {"QLIBServiceStart", "qorucontentextractd"},
                               {"QLIBServicectlStart", "pkg-Vellis-fileindexd"},
                               {"QLIBServiceStop", "qorucontentextractd"},
                               {"QLIBServicectlStop", "pkg-Vellis-fileindexd"}}));
  EXPECT_EQ(env_.platform()
                .LogsContaining("QORUSMBSetSpotlight failed: err=[0x0002 smb_conf.cpp:42]")
                .size(),
            1u);
  for (const char* condition :
       {"Failed [0 > QLIBServiceStart(\"qorucontentextractd\", TRUE)]",
        "Failed [0 > QLIBServicectlStart(\"pkg-Vellis-fileindexd\", QLIB_SERVICECTL_UPSTART)]",
        "Failed [0 > QLIBServiceStop(\"qorucontentextractd\", FALSE)]",
        "Failed [0 > QLIBServicectlStop(\"pkg-Vellis-fileindexd\", QLIB_SERVICECTL_UPSTART)]"}) {
    EXPECT_EQ(env_.platform().LogsContaining(condition).size(), 1u) << condition;
  }
}

TEST_F(ServicesTest, PrepareFollowsWhetherAnyFolderIsListed) {
  PrepareServices();
  EXPECT_EQ(env_.platform().ServiceCalls().back(),
            (Call{"QLIBServicectlStop", "pkg-Vellis-fileindexd"}));
  Json::Value list(Json::arrayValue);
  list.append(IndexMgrEnv::FolderJson("/music/a"));
  FolderAdd(list, false);
  env_.platform().ClearServiceCalls();
  PrepareServices();
  EXPECT_EQ(env_.platform().ServiceCalls().back(),
            (Call{"QLIBServicectlStart", "pkg-Vellis-fileindexd"}));

  // A list that cannot be read counts as empty, and is logged.
  WriteFile(RootPath(kFileIndexFoldersCfgPath), "{not json");
  env_.platform().ClearServiceCalls();
  PrepareServices();
  EXPECT_EQ(env_.platform().ServiceCalls().back(),
            (Call{"QLIBServicectlStop", "pkg-Vellis-fileindexd"}));
  EXPECT_EQ(env_.platform().LogsContaining("Cannot load folder list, code=504").size(), 1u);
}

TEST_F(ServicesTest, AShareMonitorConfigurationHoldsExactlyItsFoldersInListOrder) {
  Json::Value list(Json::arrayValue);
  for (const char* path : {"/music/b", "/music2/c", "/music/a"}) {
    list.append(IndexMgrEnv::FolderJson(path));
  }
  FolderAdd(list, false);
  FolderMgr folder_mgr;
  UpsertQORUNotifydCfg("music", folder_mgr);
  Json::Value config = env_.MonitorQueues()[env_.QueuePath("music")]["config"];
  ASSERT_EQ(config.size(), 2u) << config;
  EXPECT_EQ(config[0]["path"], env_.Volume() + "/music/b");
  EXPECT_EQ(config[1]["path"], env_.Volume() + "/music/a");

  // The share's last folder gone: still written, with nothing to watch.
  FolderDelete("/music/a");
  FolderDelete("/music/b");
  UpsertQORUNotifydCfg("music", FolderMgr());
  ASSERT_TRUE(env_.MonitorQueues().isMember(env_.QueuePath("music")));
  EXPECT_EQ(env_.MonitorQueues()[env_.QueuePath("music")]["config"], Json::Value(Json::arrayValue));
  EXPECT_EQ(env_.MonitorQueues()[env_.QueuePath("music2")]["config"].size(), 1u);
}

TEST_F(ServicesTest, MonitorChangesOfUnknownSharesOrRefusedByTheMonitorFail) {
  struct Case {
    const char* what;
    std::function<void()> op;
    std::string error;
  } cases[] = {
      {"upsert of an unknown share", [] { UpsertQORUNotifydCfg("nosuch", FolderMgr()); }, "800 "},
      {"delete of an unknown share", [] { DeleteQORUNotifydCfg("nosuch"); }, "800 "},
      {"upsert refused", [] { UpsertQORUNotifydCfg("music", FolderMgr()); },
       "502 MonitorQueue::Upsert failed, share=music"},
      {"delete refused", [] { DeleteQORUNotifydCfg("music"); },
       "502 MonitorQueue::Delete failed, share=music"},
  };
  env_.platform().FailCall("MonitorQueueUpsert", EIO);
  env_.platform().FailCall("MonitorQueueDelete", EIO);
  for (const Case& c : cases) {
    std::string error = Thrown(c.op);
    EXPECT_EQ(error.substr(0, c.error.size()), c.error) << c.what << ": " << error;
  }
  EXPECT_TRUE(env_.MonitorQueues().isNull());
  EXPECT_EQ(env_.platform()
                .LogsContaining("Failed [!MonitorQueue::Delete(share.GetQueuePath(), kAppName, "
                                "MONITOR_QUEUE_TYPE_APPLICATION)]")
                .size(),
            1u);
}

TEST_F(ServicesTest, CleaningIndexDataRemovesQueuesAndDatabaseAndClearsTheStatus) {
  const std::string share_path = env_.Volume() + "/music";
  StatusMgr().SetShareStatus("music", kShareStatusNeedReindex);
  env_.platform().SetExecResult(0, true);  // really remove
  const std::string data = env_.Volume() + "/@fileindex/music";
  WriteFile(data + "/queue", "x\n");
  WriteFile(data + "/queue.tmp", "y\n");
  WriteFile(data + "/db/segment", "z");
  WriteFile(data + "/keep", "k");
  CleanShareIndexData("music", share_path);
  EXPECT_EQ(env_.platform().Execs().size(), 3u);
  for (const char* gone : {"/queue", "/queue.tmp", "/db"}) {
    EXPECT_FALSE(IsFileExist(data + gone) || IsDirExist(data + gone, false)) << gone;
  }
  EXPECT_TRUE(IsFileExist(data + "/keep"));
  EXPECT_EQ(StatusMgr().GetShareStatus("music"), 0);
}

TEST_F(ServicesTest, CleaningStopsAtAPathThatCannotBeComposed) {
  StatusMgr().SetShareStatus("music", kShareStatusNeedReindex);
  env_.platform().FailCall("FILEIDXQueuePathCompose", EINVAL);
  EXPECT_EQ(Thrown([] { CleanShareIndexData("music", "relative/music"); }),
            "502 FILEIDXQueuePathCompose failed, share_path=relative/music");
  EXPECT_TRUE(env_.platform().Execs().empty());
  EXPECT_EQ(StatusMgr().GetShareStatus("music"), kShareStatusNeedReindex);
}

}  // namespace
}  // namespace vellis::fileindex
