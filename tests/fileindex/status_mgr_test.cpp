#include "fileindex/status_mgr.h"

#include <dirent.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <functional>
#include <memory>

#include "common/json_util.h"
#include "common/lock_file.h"
#include "common/root_path.h"
#include "fileindex/elastic/communication.h"
#include "tests/support/fake_index_daemon.h"
#include "tests/support/fake_share_platform.h"
#include "tests/support/parse_json.h"
#include "tests/support/temp_root.h"
#include "tests/support/thrown.h"

namespace vellis::fileindex {
namespace {

using testing::Thrown;

using testing::ReadFile;
using testing::WriteFile;

using testing::ParseJson;

class StatusMgrTest : public ::testing::Test {
 protected:
  StatusMgrTest() { platform_.SetTime(1700000000); }

  std::string StatusPath() const { return RootPath(kFileIndexStatusCfgPath); }
  Json::Value StatusFile() const { return ParseJson(ReadFile(StatusPath())); }

  testing::TempRoot root_;
  testing::FakeSharePlatform platform_;
  testing::ScopedPlatform scoped_{&platform_};
  testing::FakeIndexDaemon daemon_{RootPath(kFileIndexDaemonSocketPath)};
};

TEST_F(StatusMgrTest, WithoutAFileNothingIsPausedOrFlagged) {
  StatusMgr mgr;
  EXPECT_EQ(mgr.GetPauseInfo(), -1);
  EXPECT_EQ(mgr.GetShareStatus("music"), 0);
  EXPECT_EQ(mgr.GetShareStatus(""), 0);
  struct stat st;
  EXPECT_NE(lstat(StatusPath().c_str(), &st), 0) << "loading must not create the file";
}

TEST_F(StatusMgrTest, PauseAndResumeAreSavedAndAnnounced) {
  StatusMgr().Pause(2);
  EXPECT_EQ(StatusFile()["resume_time"], Json::Int64(1700007200));
  EXPECT_EQ(StatusMgr().GetPauseInfo(), 1700007200);
  struct stat st;
  ASSERT_EQ(stat(StatusPath().c_str(), &st), 0);
  EXPECT_EQ(st.st_mode & 07777, 0644u);

  StatusMgr().Pause(0);
  EXPECT_EQ(StatusMgr().GetPauseInfo(), 1700000000) << "a pause that ends at once";
  StatusMgr().Resume();
  EXPECT_EQ(StatusMgr().GetPauseInfo(), -1);

  auto commands = daemon_.Commands();
  ASSERT_EQ(commands.size(), 3u);
  EXPECT_EQ(commands[0], ParseJson(R"({"type":"pause","data":{"resume_time":1700007200}})"));
  EXPECT_EQ(commands[2], ParseJson(R"({"type":"resume","data":null})"));
  EXPECT_EQ(platform_.Resets(), (std::vector<std::string>{"root", "root", "root"}))
      << "each save runs as root";
}

TEST_F(StatusMgrTest, ShareBitsAreSetUnsetAndCleared) {
  struct Step {
    std::function<void(StatusMgr&)> change;
    int music;
    bool has_member;
  } steps[] = {
      {[](StatusMgr& m) { m.SetShareStatus("music", 1); }, 1, true},
      {[](StatusMgr& m) { m.SetShareStatus("music", 1); }, 1, true},
      {[](StatusMgr& m) { m.SetShareStatus("music", 4); }, 5, true},
      {[](StatusMgr& m) { m.UnsetShareStatus("music", 1); }, 4, true},
      {[](StatusMgr& m) { m.UnsetShareStatus("music", 4); }, 0, true},
      {[](StatusMgr& m) { m.ClearShareStatus("music"); }, 0, false},
      {[](StatusMgr& m) { m.ClearShareStatus("music"); }, 0, false},
  };
  StatusMgr().SetShareStatus("music2", 2);
  int i = 0;
  for (const auto& step : steps) {
    StatusMgr mgr;
    step.change(mgr);
    EXPECT_EQ(mgr.GetShareStatus("music"), step.music) << "step " << i;
    EXPECT_EQ(StatusMgr().GetShareStatus("music"), step.music) << "step " << i << " reloaded";
    EXPECT_EQ(StatusFile()["share"].isMember("music"), step.has_member) << "step " << i;
    EXPECT_EQ(StatusMgr().GetShareStatus("music2"), 2) << "step " << i;
    ++i;
  }
  EXPECT_TRUE(daemon_.Commands().empty()) << "status bits are not announced";
}

TEST_F(StatusMgrTest, NegativePauseIsRefusedAfterTakingTheLock) {
  StatusMgr().SetShareStatus("music", 1);
  const std::string before = ReadFile(StatusPath());
  EXPECT_EQ(Thrown([] { StatusMgr().Pause(-1); }), "120 Pause length should NOT be negative");
  {
    LockFile held(RootPath(kStatusCfgLockPath), true);
    // The lock comes first: while it is held, the length is not even looked at.
    EXPECT_EQ(Thrown([] { StatusMgr().Pause(-1); }).substr(0, 4), "506 ");
  }
  EXPECT_EQ(ReadFile(StatusPath()), before);
  EXPECT_TRUE(daemon_.Commands().empty());
}

TEST_F(StatusMgrTest, CorruptFileIsALoadErrorAndLeftAsItWas) {
  for (const std::string content :
       {"not json", "{\"resume_time\": 1", "[1]", "5", "{\"share\": 5}", "", "{} {}"}) {
    WriteFile(StatusPath(), content);
    EXPECT_EQ(Thrown([] { StatusMgr(); }), "504 Cannot load json: " + StatusPath()) << content;
    EXPECT_EQ(ReadFile(StatusPath()), content);
  }
  // Wrongly typed members that the accessors can skip are read as absent.
  WriteFile(StatusPath(), R"({"resume_time":"soon","share":{"music":"x","photo":3}})");
  StatusMgr mgr;
  EXPECT_EQ(mgr.GetPauseInfo(), -1);
  EXPECT_EQ(mgr.GetShareStatus("music"), 0);
  EXPECT_EQ(mgr.GetShareStatus("photo"), 3);
}

TEST_F(StatusMgrTest, FailedSaveKeepsTheOldFileAndLeavesNoTemporaryFile) {
  // A directory where the file should be cannot be replaced by a file.
  ASSERT_EQ(mkdir(StatusPath().c_str(), 0755), 0);
  EXPECT_EQ(Thrown([] { StatusMgr().SetShareStatus("music", 1); }),
            "505 Failed to save json: " + StatusPath());
  struct stat st;
  ASSERT_EQ(lstat(StatusPath().c_str(), &st), 0);
  EXPECT_TRUE(S_ISDIR(st.st_mode));
  std::unique_ptr<DIR, int (*)(DIR*)> dir(opendir(RootPath("/var/packages/Vellis/etc").c_str()),
                                          closedir);
  ASSERT_TRUE(dir);
  std::vector<std::string> names;
  while (dirent* e = readdir(dir.get())) names.push_back(e->d_name);
  EXPECT_EQ(names.size(), 3u) << "only ., .. and the status path";
}

TEST_F(StatusMgrTest, UnreachableDaemonFailsPauseAfterTheStateIsSaved) {
  daemon_.Stop();
  unlink(RootPath(kFileIndexDaemonSocketPath).c_str());
  EXPECT_EQ(Thrown([] { StatusMgr().Pause(1); }).substr(0, 4), "502 ");
  EXPECT_EQ(StatusMgr().GetPauseInfo(), 1700003600);
}

}  // namespace
}  // namespace vellis::fileindex
