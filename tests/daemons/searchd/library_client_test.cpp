// The library's own search-engine client (fileindex/elastic) against the
// real daemon: the requests that the indexer and the management operations
// send, as they send them.
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstring>
#include <thread>

#include "common/root_path.h"
#include "daemons/common/process.h"
#include "fileindex/elastic/comm.h"
#include "fileindex/elastic/elastic_control.h"
#include "sdk/domain_socket.h"
#include "sdk/socket_io.h"
#include "tests/daemons/searchd/daemon_process.h"
#include "tests/daemons/searchd/searchd_fixture.h"
#include "tests/support/fake_share_platform.h"
#include "tests/support/temp_root.h"

namespace vellis::searchd::testing {
namespace {

namespace elastic = ::vellis::fileindex::elastic;
using ::vellis::testing::FakeSharePlatform;
using ::vellis::testing::ScopedPlatform;
using ::vellis::testing::TempRoot;
using ::vellis::testing::WriteFile;
using Paths = std::vector<std::string>;

class LibraryClientTest : public ::testing::Test {
 protected:
  LibraryClientTest() {
    sdk::ShareInfo music;
    music.szName = "music";
    music.szPath = share_;
    platform_.AddShare(music);
  }

  void SetUp() override { ASSERT_EQ(daemon_.Start(RootPath(kElasticSocketPath)), ""); }

  void TearDown() override { EXPECT_EQ(daemon_.Stop(SIGTERM), 0) << "clean stop"; }

  // Creates the file and indexes it as the indexer does.
  void AddFile(const std::string& rel, const std::string& text) {
    WriteFile(share_ + rel, text);
    elastic::IndexUpsert("music", share_ + rel, true);
  }

  Paths Below(const std::string& dir) {
    Paths out;
    elastic::IndexGetByPrefixPath("music", share_ + dir, out);
    for (std::string& p : out) p = p.substr(share_.size());
    std::sort(out.begin(), out.end());
    return out;
  }

  Json::Value Search(const std::string& id, const std::string& query) {
    Json::Value d(Json::objectValue);
    d["id"] = id;
    d["query"] = query;
    Json::Value answer = sdk::Exchange(RootPath(kElasticSocketPath), Request("document_search", d));
    EXPECT_TRUE(answer["success"].asBool()) << JsonToString(answer);
    return answer["data"];
  }

  TempRoot root_;
  std::string share_ = root_.Path("/volume1/music");
  FakeSharePlatform platform_;
  ScopedPlatform scoped_{&platform_};
  DaemonProcess daemon_;
};

TEST_F(LibraryClientTest, IndexerRequestsKeepTheIndexInStep) {
  elastic::ShareIndexCreate("music");
  elastic::ShareIndexCreate("music");  // again: nothing changes
  ::vellis::testing::MakeDirs(share_ + "/a");
  elastic::IndexUpsert("music", share_ + "/a", true);  // the folder itself
  AddFile("/a/song.txt", "lyrics of a quiet song");
  AddFile("/a/b/deep.txt", "words deep down");
  AddFile("/ab/other.txt", "a sibling folder");
  elastic::IndexCommit("music");
  EXPECT_EQ(Below("/a"), (Paths{"/a/b/deep.txt", "/a/song.txt"}));
  EXPECT_EQ(Search("fileindex_music", "quiet")["hits"][0]["id"].asString(), share_ + "/a/song.txt");

  // A folder moved: the folder's document, then everything below it.
  elastic::IndexRename("music", share_ + "/z", share_ + "/a");
  EXPECT_EQ(Below("/a"), Paths{});
  EXPECT_EQ(Below("/z"), (Paths{"/z/b/deep.txt", "/z/song.txt"}));
  EXPECT_EQ(Search("fileindex_music", "deep")["hits"][0]["id"].asString(),
            share_ + "/z/b/deep.txt");

  elastic::UpdateTermSuggestion("fileindex_music", {share_ + "/z/song.txt"});
  elastic::IndexDelDir("music", share_ + "/z");
  elastic::IndexDel("music", share_ + "/ab/other.txt");
  elastic::IndexCommit("music");
  EXPECT_EQ(Below("/z"), Paths{});
  EXPECT_EQ(Below("/ab"), Paths{});
  EXPECT_EQ(Search("fileindex_music", "")["total"].asInt(), 1) << "the moved folder's own document";
}

TEST_F(LibraryClientTest, ShareLifecycleRequests) {
  elastic::ShareIndexCreate("music");
  AddFile("/kept.txt", "kept through every move");
  elastic::ShareIndexPause("music");
  try {
    elastic::IndexDel("music", share_ + "/kept.txt");
    ADD_FAILURE() << "a paused index took a write";
  } catch (const Error& e) {
    EXPECT_EQ(e.GetCode(), 1106) << e.what();
  }
  elastic::ShareIndexResume("music");
  elastic::ShareIndexMigrate("music", root_.Path("/volume2/@fileindex/music/db"));
  elastic::ShareIndexRename("music", "music2", root_.Path("/volume2/@fileindex/music2/db"));
  EXPECT_EQ(Search("fileindex_music2", "kept")["total"].asInt(), 1);
  elastic::ShareIndexDelete("music2");
  Json::Value list = sdk::Exchange(RootPath(kElasticSocketPath),
                                   Request("index_list", Json::Value(Json::objectValue)));
  EXPECT_EQ(list["data"].size(), 0u) << JsonToString(list);
}

}  // namespace
}  // namespace vellis::searchd::testing
