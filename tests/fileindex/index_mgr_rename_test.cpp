// User and share renames, and the recycle-bin reindex triggers: which
// folders move, and the events queued.
#include <gtest/gtest.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <functional>
#include <string>
#include <vector>

#include "fileindex/index_mgr.h"
#include "fileindex/status_mgr.h"
#include "sdk/platform.h"
#include "tests/support/index_mgr_env.h"

namespace vellis::fileindex {
namespace {

using testing::IndexMgrEnv;
using testing::MakeDirs;
using testing::Thrown;

class RenameOpsTest : public ::testing::Test {
 protected:
  RenameOpsTest() {
    homes_ = env_.AddShare("homes");
    for (const char* dir : {"/homes/alice/docs", "/homes/alice2/docs", "/homes/bob"}) {
      MakeDirs(env_.Volume() + dir);
    }
  }

  void Add(const std::vector<std::string>& paths) {
    Json::Value list(Json::arrayValue);
    for (const std::string& p : paths) list.append(IndexMgrEnv::FolderJson(p));
    FolderAdd(list, false);
  }

  // The events queued after the set-up's configuration updates.
  std::vector<Json::Value> EventsOf(const std::string& share, size_t skip) const {
    std::vector<Json::Value> all = env_.QueueEvents(share);
    if (all.size() <= skip) return {};
    return {all.begin() + static_cast<long>(skip), all.end()};
  }

  IndexMgrEnv env_;
  std::string homes_;
};

TEST_F(RenameOpsTest, UserRenameMovesTheHomeAndWhatIsInsideItOnly) {
  Add({"/homes/alice/docs", "/homes/alice", "/homes/alice2/docs"});
  UserRename("alice", "bob");
  EXPECT_EQ(env_.FolderPaths(),
            (std::vector<std::string>{"/homes/bob/docs", "/homes/bob", "/homes/alice2/docs"}));
  EXPECT_EQ(env_.platform()
                .LogsContaining("Update homes rule: [/homes/alice/docs] -> [/homes/bob/docs]")
                .size(),
            1u);
  EXPECT_EQ(env_.platform().LogsContaining("Update homes rule: [").size(), 2u);
  std::vector<Json::Value> events = EventsOf("homes", 3);
  ASSERT_EQ(events.size(), 1u);
  EXPECT_EQ(events[0]["event"], 0x100);
  EXPECT_EQ(events[0]["path"], homes_ + "/bob");
  EXPECT_EQ(events[0]["path_old"], homes_ + "/alice");
  EXPECT_TRUE(events[0]["data"].isNull());
}

TEST_F(RenameOpsTest, UserRenameWithoutFoldersSavesAndQueuesAllTheSame) {
  Add({"/homes/alice2/docs"});
  env_.MarkFoldersFile();
  UserRename("alice", "carol");
  EXPECT_TRUE(env_.FoldersFileSaved());
  EXPECT_EQ(env_.FolderPaths(), std::vector<std::string>{"/homes/alice2/docs"});
  std::vector<Json::Value> events = EventsOf("homes", 1);
  ASSERT_EQ(events.size(), 1u);
  EXPECT_EQ(events[0]["path"], homes_ + "/carol");
}

TEST_F(RenameOpsTest, MissingNamesAreRefusedBeforeAnythingIsLoaded) {
  Add({"/homes/alice"});
  env_.MarkFoldersFile();
  struct Case {
    std::function<void()> op;
    std::string error;
  } cases[] = {
      {[] { UserRename("", "bob"); }, "120 Missing user_from"},
      {[] { UserRename("alice", ""); }, "120 Missing user_to"},
      {[] { ShareRename("", "x"); }, "120 Missing share_from"},
      {[] { ShareRename("homes", ""); }, "120 Missing share_to"},
  };
  for (const Case& c : cases) EXPECT_EQ(Thrown(c.op), c.error);
  EXPECT_FALSE(env_.FoldersFileSaved());
  EXPECT_EQ(env_.QueueEvents("homes").size(), 1u);
}

TEST_F(RenameOpsTest, ShareRenameMovesTheSharesFoldersIndexAndDocuments) {
  env_.AddShare("photo");
  env_.AddShare("photo2");
  env_.AddShare("music");
  for (const char* dir : {"/photo/a", "/photo/b", "/photo2/c", "/music/m"}) {
    MakeDirs(env_.Volume() + dir);
  }
  Add({"/photo/a", "/music/m", "/photo2/c", "/photo/b"});
  const size_t search_before = env_.SearchCommands().size();
  // The share has been renamed on the platform before the hook runs.
  ASSERT_EQ(rename((env_.Volume() + "/photo").c_str(), (env_.Volume() + "/pictures").c_str()), 0);
  env_.platform().RemoveShare("photo");
  const std::string pictures = env_.AddShare("pictures");

  ShareRename("photo", "pictures");
  EXPECT_EQ(env_.FolderPaths(),
            (std::vector<std::string>{"/pictures/a", "/music/m", "/photo2/c", "/pictures/b"}));
  std::vector<Json::Value> requests = env_.search().Requests();
  ASSERT_EQ(requests.size(), search_before + 1);
  EXPECT_EQ(requests.back()["command"], "index_config_set");
  EXPECT_EQ(requests.back()["data"]["id"], "fileindex_photo");
  EXPECT_EQ(requests.back()["data"]["data"]["id"], "fileindex_pictures");
  EXPECT_EQ(requests.back()["data"]["data"]["path"], env_.Volume() + "/@fileindex/pictures/db");
  std::vector<Json::Value> events = env_.QueueEvents("pictures");
  ASSERT_EQ(events.size(), 1u);
  EXPECT_EQ(events[0]["event"], 0x100);
  EXPECT_EQ(events[0]["path"], pictures);
  EXPECT_EQ(events[0]["path_old"], env_.Volume() + "/photo");
}

TEST_F(RenameOpsTest, ShareRenameWithoutFoldersStillRenamesTheIndexAndQueues) {
  const std::string pictures = env_.AddShare("pictures");
  ShareRename("photo", "pictures");
  EXPECT_EQ(env_.SearchCommands(), std::vector<std::string>{"index_config_set fileindex_photo"});
  ASSERT_EQ(env_.QueueEvents("pictures").size(), 1u);
  EXPECT_EQ(env_.QueueEvents("pictures")[0]["path_old"], env_.Volume() + "/photo");
}

TEST_F(RenameOpsTest, ShareRenameToAShareThatDoesNotExistFailsAfterSaving) {
  Add({"/homes/alice"});
  env_.MarkFoldersFile();
  EXPECT_EQ(Thrown([] { ShareRename("homes", "nosuch"); }).substr(0, 4), "800 ");
  EXPECT_TRUE(env_.FoldersFileSaved());
  EXPECT_EQ(env_.FolderPaths(), std::vector<std::string>{"/nosuch/alice"});
  EXPECT_EQ(env_.SearchCommands(), std::vector<std::string>{"index_create fileindex_homes"});
}

TEST_F(RenameOpsTest, HomeTriggersQueueOneReindexPerRecycleBinInOrder) {
  const std::vector<std::string> bins = {homes_ + "/bob/#recycle", homes_ + "/alice/#recycle",
                                         homes_ + "/alice2/#recycle"};
  env_.platform().SetHomeRecyclePaths(bins);
  HomeEnable(sdk::kAuthLdap);
  HomeDisable(sdk::kAuthDomain);
  std::vector<Json::Value> events = env_.QueueEvents("homes");
  ASSERT_EQ(events.size(), 6u);
  for (size_t i = 0; i < events.size(); ++i) {
    EXPECT_EQ(events[i]["event"], 0x10000) << i;
    EXPECT_EQ(events[i]["path"], bins[i % 3]) << i;
    EXPECT_EQ(events[i]["path_old"], "") << i;
    EXPECT_TRUE(events[i]["data"].isNull()) << i;
  }
  EXPECT_EQ(env_.platform().AuthTypes(), std::vector<int>{sdk::kAuthLdap})
      << "disable enumerates every home";
}

TEST_F(RenameOpsTest, HomeTriggersWithNothingOrAFailingEnumerationQueueNothing) {
  HomeEnable(sdk::kAuthLocal);
  HomeDisable(sdk::kAuthLocal);
  env_.platform().SetHomeRecyclePaths({homes_ + "/bob/#recycle"});
  env_.platform().FailCall("QORURecycleHomeEnumRecyclePathForAuthType", ENOENT);
  env_.platform().FailCall("QORURecycleHomeEnumRecyclePath", ENOENT);
  HomeEnable(sdk::kAuthLocal);
  HomeDisable(sdk::kAuthDomain);
  EXPECT_TRUE(env_.QueueEvents("homes").empty());
  EXPECT_EQ(env_.platform()
                .LogsContaining("QORURecycleHomeEnumRecyclePathForAuthType failed. auth: 1")
                .size(),
            1u);
  EXPECT_EQ(env_.platform().LogsContaining("QORURecycleHomeEnumRecyclePath failed. auth: 2").size(),
            1u);
}

TEST_F(RenameOpsTest, AHomeBinOutsideEveryShareIsLoggedAndTheOthersQueued) {
  env_.platform().SetHomeRecyclePaths({"/nowhere/x/#recycle", homes_ + "/bob/#recycle"});
  HomeEnable(sdk::kAuthLocal);
  ASSERT_EQ(env_.QueueEvents("homes").size(), 1u);
  EXPECT_EQ(env_.QueueEvents("homes")[0]["path"], homes_ + "/bob/#recycle");
  EXPECT_EQ(env_.platform().LogsContaining("AddCustomEvent failed").size(), 1u);
}

TEST_F(RenameOpsTest, ShareRecycleCheckQueuesOnlyForARealDirectory) {
  const std::string photo = env_.AddShare("photo");
  ShareCheckRecycle("photo");
  ASSERT_EQ(env_.QueueEvents("photo").size(), 1u);
  EXPECT_EQ(env_.QueueEvents("photo")[0]["event"], 0x10000);
  EXPECT_EQ(env_.QueueEvents("photo")[0]["path"], photo + "/#recycle");

  // The share's path replaced by a link to a directory, or missing: nothing.
  const std::string elsewhere = env_.root().Path("/elsewhere");
  MakeDirs(elsewhere);
  ASSERT_EQ(rename(photo.c_str(), (photo + ".old").c_str()), 0);
  ShareCheckRecycle("photo");
  ASSERT_EQ(symlink(elsewhere.c_str(), photo.c_str()), 0);
  ShareCheckRecycle("photo");
  EXPECT_EQ(env_.QueueEvents("photo").size(), 1u);
  EXPECT_EQ(Thrown([] { ShareCheckRecycle("nosuch"); }).substr(0, 4), "800 ");
}

}  // namespace
}  // namespace vellis::fileindex
