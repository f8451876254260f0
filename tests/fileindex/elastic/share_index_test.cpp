// The requests that need the share's platform record: index creation and
// the commit with its space check.
#include <gtest/gtest.h>

#include "common/json_util.h"
#include "common/root_path.h"
#include "fileindex/elastic/comm.h"
#include "fileindex/elastic/elastic_control.h"
#include "fileindex/status_mgr.h"
#include "sdk/share.h"
#include "tests/support/fake_search_daemon.h"
#include "tests/support/fake_share_platform.h"
#include "tests/support/temp_root.h"

namespace vellis::fileindex::elastic {
namespace {

using testing::FakeSearchDaemon;

class ShareIndexTest : public ::testing::Test {
 protected:
  ShareIndexTest() {
    sdk::ShareInfo music;
    music.szName = "music";
    music.szPath = "/volume1/music";
    platform_.AddShare(music);
  }

  // "<code> <reason>" of the Error that `fn` throws.
  template <typename Fn>
  std::string Thrown(Fn fn) {
    try {
      fn();
    } catch (const Error& e) {
      return std::to_string(e.GetCode()) + " " + e.what();
    }
    return "no error";
  }

  testing::TempRoot root_;
  testing::FakeSharePlatform platform_;
  testing::ScopedPlatform scoped_{&platform_};
  FakeSearchDaemon daemon_{RootPath(kElasticSocketPath)};
};

TEST_F(ShareIndexTest, CreateSendsTheSchemaAndTheSharesDatabasePath) {
  ShareIndexCreate("music");
  ASSERT_EQ(daemon_.Requests().size(), 1u);
  const Json::Value req = daemon_.Requests()[0];
  EXPECT_EQ(req["command"], "index_create");
  EXPECT_EQ(req["data"]["id"], "fileindex_music");
  EXPECT_EQ(req["data"]["path"], sdk::SDKShare("music").GetDBPath());
  EXPECT_FALSE(req["data"]["path"].asString().empty());
  EXPECT_EQ(req["data"]["settings"], GetFileIndexSettings());
  EXPECT_EQ(req["data"]["mappings"], GetFileIndexMappings());
  EXPECT_EQ(req["data"]["event_handler"], GetFileIndexEventHandler());
}

TEST_F(ShareIndexTest, CreateForAnUnknownShareSendsNothing) {
  EXPECT_EQ(Thrown([] { ShareIndexCreate("nosuch"); }).substr(0, 4), "800 ");
  EXPECT_TRUE(daemon_.Requests().empty());
}

TEST_F(ShareIndexTest, FailedCommitOnAFullVolumeFlagsTheShare) {
  struct Case {
    bool space_enough;
    std::string thrown;
    int bits;
  } cases[] = {
      {true, "7 Request failed, msg=disk error", 0},
      {false, "1003 Share (music) space not enough", kShareStatusNeedReindex},
  };
  for (const auto& c : cases) {
    platform_.SetQuota(c.space_enough, sdk::kPlatformErrNoSpace);
    daemon_.Push(FakeSearchDaemon::Failure(7, "disk error"));
    EXPECT_EQ(Thrown([] { IndexCommit("music"); }), c.thrown);
    EXPECT_EQ(StatusMgr().GetShareStatus("music"), c.bits) << c.thrown;
  }
  // A commit that succeeds asks nothing about space.
  platform_.ClearCalls();
  IndexCommit("music");
  for (const auto& call : platform_.Calls()) EXPECT_NE(call, "QORUQuotaIsEnough");
  EXPECT_EQ(daemon_.Requests().back(), daemon_.Requests().front())
      << "the same commit request every time";
}

}  // namespace
}  // namespace vellis::fileindex::elastic
