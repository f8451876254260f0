// The built vellis-searchd on the test root's socket: one instance, crashes and
// stops, concurrent clients, and `vellis` against it.
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <thread>

#include "common/root_path.h"
#include "daemons/common/process.h"
#include "fileindex/elastic/comm.h"
#include "fileindex/elastic/elastic_control.h"
#include "sdk/domain_socket.h"
#include "sdk/frame.h"
#include "tests/daemons/searchd/searchd_fixture.h"
#include "tests/support/cli_runner.h"
#include "tests/support/fake_platform.h"
#include "tests/support/fake_share_platform.h"
#include "tests/support/searchd_process.h"
#include "tests/support/temp_root.h"
#include "tests/support/thrown.h"

namespace vellis::searchd::testing {
namespace {

using namespace ::vellis::testing;
namespace elastic = ::vellis::fileindex::elastic;

// The daemon of this build, up on the test root's socket.
class DaemonTest : public ::testing::Test {
 protected:
  void SetUp() override { ASSERT_NO_FATAL_FAILURE(Start()); }
  void TearDown() override { EXPECT_TRUE(pid_ <= 0 || Stop(SIGTERM) == 0) << "clean stop"; }
  void Start() {
    ASSERT_TRUE(daemon_.Start()) << "the daemon did not come up";
    pid_ = daemon_.pid();
  }
  int Stop(int sig) {
    pid_ = -1;
    return daemon_.Stop(sig);
  }

  Json::Value Ok(const Json::Value& r) { return DataOf(r, sdk::Exchange(socket_, r)); }
  // Documents of index "s" that the search `data` (JSON text) finds.
  int64_t Count(const std::string& data = "{}") {
    return Ok(Request("document_search", data))["total"].asInt64();
  }

  TempRoot root_;
  SearchdProcess daemon_;
  const std::string bin_ = daemon_.bin();
  const std::string socket_ = daemon_.socket();
  std::string pid_file_ = RootPath(daemon::PidFilePath("vellis-searchd"));
  FakePlatform platform_;
  ScopedPlatform scoped_{&platform_};
  pid_t pid_ = -1;
};

TEST_F(DaemonTest, OneInstanceRunsAndBadInputDoesNotStopIt) {
  EXPECT_EQ(ReadFile(pid_file_), std::to_string(pid_) + "\n");
  EXPECT_EQ(system((bin_ + " -f 2>/dev/null").c_str()), 1 << 8) << "a second daemon exits with 1";
  sdk::DomainSockConnection conn(socket_);
  ASSERT_TRUE(conn.Connect());
  std::string header = sdk::EncodeFrameHeader(sdk::kMaxMessageSize + 1), answer;
  ASSERT_EQ(send(conn.fd(), header.data(), header.size(), MSG_NOSIGNAL), 4);
  EXPECT_FALSE(conn.Recv(answer)) << "a length above the maximum goes unanswered: " << answer;
  const std::string not_requests[] = {"hello", "{\"command\": \"index_list\"} x", "\xff\xfe{}",
                                      std::string("{\"command\": \"index_list\"}\0", 26)};
  for (const std::string& text : not_requests) {
    answer = sdk::ExchangeText(socket_, text);
    EXPECT_EQ(ParseJson(answer)["error"]["code"], 1100) << text << " -> " << answer;
  }
  EXPECT_TRUE(Ok(Request("index_list")).isArray()) << "the first daemon still serves";
}

// Commit is the durability point: kill -9 loses only uncommitted writes; a
// clean stop commits them and removes the socket and pid files.
TEST_F(DaemonTest, CommittedWritesSurviveAKillAndTermKeepsPendingOnes) {
  Ok(CreateRequest("s", root_.Path("/volume1/@qoruindex")));
  const std::string text = R"({"QORUMDTextContent": "durable"})";
  for (int i = 0; i < 50; ++i) Ok(Upsert("/v/" + std::to_string(i), text));
  Ok(Compound({Request("commit"), Upsert("/v/uncommitted")}));
  EXPECT_EQ(Count(), 51);
  EXPECT_EQ(Stop(SIGKILL), -SIGKILL);
  ASSERT_NO_FATAL_FAILURE(Start());
  EXPECT_EQ(Count(), 50);
  EXPECT_EQ(Count(R"({"query": "durable"})"), 50);
  Ok(Upsert("/v/pending"));
  EXPECT_EQ(Stop(SIGTERM), 0);
  EXPECT_FALSE(access(socket_.c_str(), F_OK) == 0 || access(pid_file_.c_str(), F_OK) == 0)
      << "socket and pid files removed";
  ASSERT_NO_FATAL_FAILURE(Start());
  EXPECT_EQ(Count(), 51);
}

// Large compound writes on one connection after another, searches on others
// meanwhile: every search is answered, and sees a consistent index.
TEST_F(DaemonTest, SearchesAreAnsweredWhileTenThousandDocumentsAreWritten) {
  Ok(CreateRequest("s", root_.Path("/volume1/@qoruindex")));
  for (int i = 0; i < 10; ++i)
    Ok(Upsert("/seed/" + std::to_string(i), R"({"QORUMDTextContent": "needle"})"));
  Ok(Request("commit"));
  std::atomic<bool> done{false};
  std::thread writer([&] {
    const std::string hay = R"({"QORUMDTextContent": "haystack straw"})";
    for (int batch = 0; batch < 20; ++batch) {
      std::vector<Json::Value> upserts;
      for (int i = 0; i < 500; ++i)
        upserts.push_back(Upsert("/bulk/" + std::to_string(batch * 500 + i), hay));
      EXPECT_FALSE(Ok(Compound(upserts)).isNull());
    }
    Ok(Request("commit"));
    done = true;
  });
  int searches = 0;
  for (int64_t last = 0; !done; ++searches) {
    EXPECT_EQ(Count(R"({"query": "needle"})"), 10);
    const int64_t hay = Count(R"({"query": "haystack", "limit": 1})");
    EXPECT_GE(hay, last) << "counts only grow while documents are added";
    last = hay;
  }
  writer.join();
  EXPECT_GT(searches, 0);
  EXPECT_EQ(Count(), 10010);
}

// The library's own requests (fileindex/elastic) against the real daemon:
// what the indexer and the management operations send, as they send it.
class LibraryClientTest : public DaemonTest {
 protected:
  LibraryClientTest() { shares_.AddShare({"music", share_}); }
  // The paths below `dir` of the share, as the indexer asks for them.
  std::vector<std::string> Below(const std::string& dir) {
    std::vector<std::string> out;
    elastic::IndexGetByPrefixPath("music", share_ + dir, out);
    for (std::string& p : out) p = p.substr(share_.size());
    std::sort(out.begin(), out.end());
    return out;
  }
  std::string share_ = root_.Path("/volume1/music");
  FakeSharePlatform shares_;
  ScopedPlatform scoped_shares_{&shares_};
};

TEST_F(LibraryClientTest, RequestsKeepTheIndexInStep) {
  elastic::ShareIndexCreate("music");
  elastic::ShareIndexCreate("music");  // again: nothing changes
  ::vellis::testing::MakeDirs(share_ + "/a");
  for (const char* rel : {"/a", "/a/song.txt", "/a/b/deep.txt", "/ab/other.txt"}) {
    if (std::string(rel) != "/a") WriteFile(share_ + rel, "some text");
    elastic::IndexUpsert("music", share_ + rel, true);
  }
  elastic::IndexCommit("music");
  using Paths = std::vector<std::string>;
  EXPECT_EQ(Below("/a"), (Paths{"/a/b/deep.txt", "/a/song.txt"})) << "never /ab";
  elastic::IndexRename("music", share_ + "/z", share_ + "/a");  // the folder, then below it
  EXPECT_EQ(Below("/a"), Paths{});
  EXPECT_EQ(Below("/z"), (Paths{"/z/b/deep.txt", "/z/song.txt"}));
  elastic::IndexDelDir("music", share_ + "/z");
  EXPECT_EQ(Below(""), (Paths{"/ab/other.txt", "/z"})) << "what was below /z, not /z itself";
  elastic::ShareIndexPause("music");
  EXPECT_EQ(Thrown([&] { elastic::IndexDel("music", share_ + "/ab/other.txt"); }).rfind("1106 ", 0),
            0u)
      << "a paused index takes no write";
  elastic::ShareIndexResume("music");
  elastic::ShareIndexRename("music", "music2", root_.Path("/volume2/@fileindex/music2/db"));
  EXPECT_EQ(Ok(Request("index_list")).size(), 1u);
  elastic::ShareIndexDelete("music2");
  EXPECT_EQ(Ok(Request("index_list")).size(), 0u);
}

// The stand-in for the indexer's first pass: every indexable file of a real
// share goes in with its text and is found by `vellis search`; what the
// indexing rules refuse stays out.
TEST_F(DaemonTest, VellisIndexLoadFillsAShareIndexThatVellisSearchFinds) {
  const std::string share = root_.Path("/volume1/notes");
  WriteFile(share + "/plans/budget.txt", "The budget plan for next year");
  WriteFile(share + "/plans/budget.mp3", "");
  WriteFile(share + "/#recycle/old-budget.txt", "An old budget, thrown away");
  ASSERT_EQ(0, symlink("/etc", (share + "/etc").c_str()));
  ExpectRuns({
      {"share add notes " + share + " --recycle-bin", 0, "..."},
      // In: the share's folder, plans/, its two files. Out: #recycle/, its file, the link.
      {"index load notes", 0,
       "loaded 4 documents into fileindex_notes (3 paths refused by the indexing rules, "
       "0 failed)\n"},
      {"index load nosuchshare", 1, "error 800: ..."},
      {"search budget --category document", 0,
       share + "/plans/budget.txt\n    The [budget] plan for next year\n1 hit (1 shown)\n"},
      {"search budget --json --index fileindex_notes", 0, "...\"total\":2}]\n"},  // and the mp3
      {"search budget --index fileindex_none", 1, "error 1104: No index fileindex_none..."},
  });
  EXPECT_EQ(Stop(SIGTERM), 0);
  ExpectRuns({{"search budget", 1, "error 913: Connect failed..."}});
}

}  // namespace
}  // namespace vellis::searchd::testing
