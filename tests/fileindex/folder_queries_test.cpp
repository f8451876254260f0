// Which configured folder covers and governs a full path.
#include <gtest/gtest.h>

#include <memory>
#include <set>
#include <string>

#include "fileindex/folder_mgr.h"
#include "tests/support/folder_env.h"

namespace vellis::fileindex {
namespace {

using testing::FolderEnv;
using testing::MakeFolder;

class FolderQueriesTest : public ::testing::Test {
 protected:
  FolderQueriesTest() {
    for (const char* share : {"music", "musicbox", "photo"}) env_.AddShare(share);
    Add("/music", "music");
    Add("/music/live", "live");
    Add("/photo/2019", "first");
    Add("/photo/2019", "replaced");  // Upsert keeps one entry per path
    v_ = env_.Volume();
  }

  void Add(const std::string& path, const std::string& name) {
    std::shared_ptr<Folder> changed;
    mgr_.Upsert(changed, MakeFolder(path, name));
  }

  // The governing folder's name, or "none".
  std::string Governing(const std::string& full_path) {
    std::shared_ptr<Folder> cfg = mgr_.GetMostSuitableCfg(full_path);
    return cfg ? cfg->GetName() : "none";
  }

  FolderEnv env_;
  FolderMgr mgr_;
  std::string v_;
};

TEST_F(FolderQueriesTest, TheDeepestCoveringFolderGoverns) {
  struct Case {
    std::string full_path;
    std::string expected;
  } cases[] = {
      {"/music/live/a.mp3", "live"},    {"/music/live", "live"},
      {"/music/studio/b.mp3", "music"}, {"/music", "music"},
      {"/musicbox/c.mp3", "none"},  // a sibling whose name extends the folder's
      {"/music/liveX/a.mp3", "music"},  {"/photo/2019/x.jpg", "replaced"},
      {"/photo/2020/x.jpg", "none"},    {"/MUSIC/a.mp3", "none"},  // byte-exact
  };
  for (const Case& c : cases) EXPECT_EQ(Governing(v_ + c.full_path), c.expected) << c.full_path;
  EXPECT_EQ(Governing("/volume9/music/a.mp3"), "none");
}

TEST_F(FolderQueriesTest, IndexedCoversTheFolderItselfOwnCfgOnlyTheFolder) {
  struct Case {
    std::string full_path;
    bool indexed;
    bool own_cfg;
  } cases[] = {
      {"/music", true, true},      {"/music/live", true, true}, {"/music/live/a.mp3", true, false},
      {"/musicbox", false, false}, {"/photo", false, false},    {"/photo/2019/", true, false},
  };
  for (const Case& c : cases) {
    EXPECT_EQ(mgr_.IsFullPathIndexed(v_ + c.full_path), c.indexed) << c.full_path;
    EXPECT_EQ(mgr_.IsFullPathHasOwnCfg(v_ + c.full_path), c.own_cfg) << c.full_path;
  }
}

TEST_F(FolderQueriesTest, SharePathAndShareQueriesCompareWholeNames) {
  EXPECT_TRUE(mgr_.HasFolder("/music/live"));
  EXPECT_FALSE(mgr_.HasFolder("/music/live/"));
  EXPECT_FALSE(mgr_.HasFolder("/musicbox"));
  EXPECT_TRUE(mgr_.IsShareIndexed("photo"));
  EXPECT_FALSE(mgr_.IsShareIndexed("musicbox"));
  EXPECT_FALSE(mgr_.IsShareIndexed("mus"));
  EXPECT_EQ(mgr_.GetIndexedShares(), (std::set<std::string>{"music", "photo"}));
}

TEST_F(FolderQueriesTest, NeedMetaFollowsTheGoverningFoldersFlagForTheFileType) {
  std::shared_ptr<Folder> changed;
  mgr_.Upsert(changed, MakeFolder("/music/live/docs", "docs", true, false, false, false));
  mgr_.Upsert(changed, MakeFolder("/music/live/media", "media", false, true, true, true));
  mgr_.Upsert(changed, MakeFolder("/music/live/none", "none", false, false, false, false));
  struct Case {
    std::string full_path;
    bool expected;
  } cases[] = {
      {"/music/live/docs/a.PDF", true},   {"/music/live/docs/a.mp3", false},
      {"/music/live/docs/README", true},  {"/music/live/media/a.pdf", false},
      {"/music/live/media/a.flac", true}, {"/music/live/media/a.mkv", true},
      {"/music/live/media/a.jpg", true},  {"/music/live/none/a.jpg", false},
      {"/music/live/none/a.exe", true},  // outside the four categories
      {"/musicbox/a.exe", false},        // under no folder
  };
  for (const Case& c : cases) {
    EXPECT_EQ(mgr_.IsFullPathNeedMeta(v_ + c.full_path), c.expected) << c.full_path;
  }
}

TEST_F(FolderQueriesTest, EarlierOfTwoEntriesWithTheSameFullPathGoverns) {
  // Upsert keeps paths unique, but a file written by hand may repeat one.
  testing::WriteFile(env_.FoldersFile(),
                     R"([{"path":"/photo","name":"first","document":true,"audio":true,)"
                     R"("video":true,"photo":true},)"
                     R"({"path":"/photo","name":"second","document":true,"audio":true,)"
                     R"("video":true,"photo":true}])");
  FolderMgr loaded;
  std::shared_ptr<Folder> cfg = loaded.GetMostSuitableCfg(v_ + "/photo/a.jpg");
  ASSERT_TRUE(cfg);
  EXPECT_EQ(cfg->GetName(), "first");
}

}  // namespace
}  // namespace vellis::fileindex
