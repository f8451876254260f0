// The daemon as a process: its socket, its framing, crashes and stops.
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <cstring>
#include <thread>

#include "common/json_util.h"
#include "common/root_path.h"
#include "daemons/common/process.h"
#include "fileindex/elastic/comm.h"
#include "sdk/domain_socket.h"
#include "sdk/frame.h"
#include "sdk/socket_io.h"
#include "tests/daemons/searchd/daemon_process.h"
#include "tests/daemons/searchd/searchd_fixture.h"
#include "tests/support/cli_runner.h"
#include "tests/support/temp_root.h"

namespace vellis::searchd::testing {
namespace {

using ::vellis::testing::ReadFile;
using ::vellis::testing::TempRoot;

constexpr char kIndex[] = "fileindex_s";
// Short, so that stalled-peer cases finish quickly.
constexpr int kTestRecvTimeoutMs = 300;

sdk::IoStatus ReadAnswer(int fd, std::string* answer) {
  std::string why;
  return sdk::ReadFrame(fd, answer, sdk::DeadlineAfter(5000), &why).status;
}

class DaemonTest : public ::testing::Test {
 protected:
  void SetUp() override { Start(); }

  void Start() {
    std::string why =
        daemon_.Start(socket_, "--recv-timeout-ms=" + std::to_string(kTestRecvTimeoutMs));
    ASSERT_EQ(why, "");
    pid_ = daemon_.pid();
  }
  int Stop(int sig) {
    pid_ = -1;
    return daemon_.Stop(sig);
  }

  Json::Value Call(const Json::Value& request) { return sdk::Exchange(socket_, request); }
  Json::Value Ok(const Json::Value& request) {
    Json::Value answer = Call(request);
    EXPECT_TRUE(answer["success"].asBool())
        << JsonToString(request).substr(0, 300) << " -> " << JsonToString(answer);
    return answer["data"];
  }
  Json::Value Data() {
    Json::Value d(Json::objectValue);
    d["id"] = kIndex;
    return d;
  }
  int64_t DocumentCount() { return Ok(Request("index_stats", Data()))["documents"].asInt64(); }

  TempRoot root_;
  std::string socket_ = RootPath(kElasticSocketPath);
  DaemonProcess daemon_;
  pid_t pid_ = -1;
};

TEST_F(DaemonTest, WritesItsPidFileAndRefusesASecondInstance) {
  EXPECT_EQ(ReadFile(RootPath(daemon::PidFilePath("vellis-searchd"))), std::to_string(pid_) + "\n");
  pid_t second = fork();
  if (second == 0) {
    execl(DaemonBinary().c_str(), "vellis-searchd", "--foreground", static_cast<char*>(nullptr));
    _exit(127);
  }
  int status = 0;
  waitpid(second, &status, 0);
  EXPECT_TRUE(WIFEXITED(status));
  EXPECT_EQ(WEXITSTATUS(status), 1);
  EXPECT_TRUE(Ok(Request("index_list", Json::Value(Json::objectValue))).isArray())
      << "the first daemon still serves";
}

TEST_F(DaemonTest, BadFramesAreDroppedWithoutAnAnswer) {
  auto frame = [](uint32_t length, const std::string& body) {
    std::string out(reinterpret_cast<const char*>(&length), sizeof(length));
    return out + body;
  };
  uint32_t small = 10;
  uint32_t swapped = __builtin_bswap32(small);  // 167 MiB announced, 10 bytes sent
  struct Case {
    const char* what;
    std::string bytes;
  };
  const Case cases[] = {
      {"length 0", frame(0, "")},
      {"length 0xFFFFFFFF", frame(0xFFFFFFFFu, "{}")},
      {"length above the maximum", frame(sdk::kMaxMessageSize + 1, "{}")},
      {"byte-swapped length", frame(swapped, "{\"a\": 12}")},
      {"truncated frame then end of stream", frame(100, "{\"command\"")},
      {"half a length", std::string("\x05\x00", 2)},
  };
  for (const Case& c : cases) {
    int fd = ConnectTo(socket_);
    ASSERT_GE(fd, 0) << c.what;
    ASSERT_EQ(send(fd, c.bytes.data(), c.bytes.size(), MSG_NOSIGNAL),
              static_cast<ssize_t>(c.bytes.size()))
        << c.what;
    shutdown(fd, SHUT_WR);
    std::string answer;
    auto started = std::chrono::steady_clock::now();
    EXPECT_EQ(ReadAnswer(fd, &answer), sdk::IoStatus::kClosed) << c.what << ": " << answer;
    EXPECT_LT(std::chrono::steady_clock::now() - started, std::chrono::seconds(3)) << c.what;
    close(fd);
  }
  // A peer that stalls mid-frame without closing is dropped at the time-out.
  int fd = ConnectTo(socket_);
  std::string partial = frame(50, "{\"com");
  send(fd, partial.data(), partial.size(), MSG_NOSIGNAL);
  std::string answer;
  EXPECT_EQ(ReadAnswer(fd, &answer), sdk::IoStatus::kClosed);
  close(fd);
  EXPECT_TRUE(Ok(Request("index_list", Json::Value(Json::objectValue))).isArray())
      << "the daemon survived every bad frame";
}

TEST_F(DaemonTest, TextThatIsNotARequestIsAnsweredWithAnError) {
  const std::string texts[] = {"hello", "{\"command\": \"index_list\"} x",
                               "{\"command\": \"index_list\"}\n\n{}",
                               std::string("{\"command\": \"index_list\"}\0", 26), "\xff\xfe{}"};
  for (const std::string& text : texts) {
    Json::Value answer = Parse(sdk::ExchangeText(socket_, text));
    EXPECT_FALSE(answer["success"].asBool()) << text;
    EXPECT_EQ(answer["error"]["code"].asInt(), 1100) << text;
  }
}

TEST_F(DaemonTest, KillAfterCommitLosesNothingCommitted) {
  Ok(CreateRequest(kIndex, root_.Path("/volume1/@qoruindex")));
  Json::Value batch(Json::objectValue);
  for (int i = 0; i < 50; ++i) {
    Json::Value doc = FileDoc("/v/s/kept" + std::to_string(i) + ".txt");
    doc["QORUMDTextContent"] = "durable words";
    batch["compound"].append(UpsertRequest(kIndex, doc));
  }
  EXPECT_FALSE(Call(batch)["has_fail"].asBool());
  Ok(Request("commit", Data()));
  Ok(UpsertRequest(kIndex, FileDoc("/v/s/uncommitted.txt")));
  EXPECT_EQ(DocumentCount(), 51);

  EXPECT_EQ(Stop(SIGKILL), -SIGKILL);
  Start();
  EXPECT_EQ(DocumentCount(), 50);
  Json::Value search = Data();
  search["query"] = "durable";
  EXPECT_EQ(Ok(Request("document_search", search))["total"].asInt(), 50);
  Ok(UpsertRequest(kIndex, FileDoc("/v/s/after.txt")));
  EXPECT_EQ(DocumentCount(), 51) << "the index takes writes again after the crash";
}

TEST_F(DaemonTest, TermStopsCleanlyAndKeepsPendingWrites) {
  Ok(CreateRequest(kIndex, root_.Path("/volume1/@qoruindex")));
  Ok(UpsertRequest(kIndex, FileDoc("/v/s/pending.txt")));
  EXPECT_EQ(Stop(SIGTERM), 0);
  EXPECT_NE(access(socket_.c_str(), F_OK), 0) << "socket file removed";
  EXPECT_NE(access(RootPath(daemon::PidFilePath("vellis-searchd")).c_str(), F_OK), 0)
      << "pid file removed";
  Start();
  EXPECT_EQ(DocumentCount(), 1);
}

TEST_F(DaemonTest, SearchWhileTenThousandDocumentsAreWritten) {
  Ok(CreateRequest(kIndex, root_.Path("/volume1/@qoruindex")));
  for (int i = 0; i < 10; ++i) {
    Json::Value doc = FileDoc("/v/s/seed/needle" + std::to_string(i) + ".txt");
    doc["QORUMDTextContent"] = "needle haystack";
    Ok(UpsertRequest(kIndex, doc));
  }
  Ok(Request("commit", Data()));

  std::atomic<bool> done{false};
  std::thread writer([&] {
    for (int batch = 0; batch < 20; ++batch) {
      Json::Value req(Json::objectValue);
      for (int i = 0; i < 500; ++i) {
        Json::Value doc =
            FileDoc("/v/s/bulk/" + std::to_string(batch) + "/f" + std::to_string(i) + ".txt");
        doc["QORUMDTextContent"] = "haystack straw number " + std::to_string(batch * 500 + i);
        req["compound"].append(UpsertRequest(kIndex, doc));
      }
      EXPECT_FALSE(Call(req)["has_fail"].asBool());
    }
    Ok(Request("commit", Data()));
    done = true;
  });
  int searches = 0;
  int64_t last_haystack = 0;
  while (!done) {
    Json::Value needle = Data();
    needle["query"] = "needle";
    Json::Value found = Ok(Request("document_search", needle));
    EXPECT_EQ(found["total"].asInt(), 10);
    EXPECT_EQ(found["hits"].size(), 10u);
    Json::Value hay = Data();
    hay["query"] = "haystack";
    hay["limit"] = 1;
    int64_t total = Ok(Request("document_search", hay))["total"].asInt64();
    EXPECT_GE(total, last_haystack) << "counts only grow while documents are added";
    last_haystack = total;
    ++searches;
  }
  writer.join();
  EXPECT_GT(searches, 0);
  EXPECT_EQ(DocumentCount(), 10010);
}

TEST_F(DaemonTest, VellisSearchPrintsHitsWithSnippets) {
  Ok(CreateRequest(kIndex, root_.Path("/volume1/@qoruindex")));
  Json::Value pdf = FileDoc("/volume1/s/docs/plan.pdf");
  pdf["QORUMDTextContent"] = "The budget plan for next year";
  Json::Value song = FileDoc("/volume1/s/music/budget.mp3");
  Ok(UpsertRequest(kIndex, pdf));
  Ok(UpsertRequest(kIndex, song));

  ::vellis::testing::CliRun text = ::vellis::testing::Vellis("search budget --category document");
  EXPECT_EQ(text.status, 0) << text.out;
  EXPECT_EQ(text.out,
            "/volume1/s/docs/plan.pdf\n"
            "    The [budget] plan for next year\n"
            "1 hit (1 shown)\n");

  ::vellis::testing::CliRun json =
      ::vellis::testing::Vellis("search budget --json --index " + std::string(kIndex));
  EXPECT_EQ(json.status, 0) << json.out;
  Json::Value answers = Parse(json.out);
  ASSERT_EQ(answers.size(), 1u) << json.out;
  EXPECT_EQ(answers[0]["total"].asInt(), 2);

  ::vellis::testing::CliRun unknown =
      ::vellis::testing::Vellis("search budget --index fileindex_none");
  EXPECT_EQ(unknown.status, 1);
  EXPECT_NE(unknown.out.find("error 1104: No index fileindex_none"), std::string::npos)
      << unknown.out;

  Stop(SIGTERM);
  ::vellis::testing::CliRun down = ::vellis::testing::Vellis("search budget");
  EXPECT_EQ(down.status, 1);
  EXPECT_NE(down.out.find("error 913: Connect failed"), std::string::npos) << down.out;
}

// The stand-in for the indexer's first pass: every indexable file of a real
// share goes in with its text, through the library's own requests, and is
// found by `vellis search`; what the rules refuse stays out.
TEST_F(DaemonTest, VellisIndexLoadFillsTheShareIndexFromItsFiles) {
  using ::vellis::testing::MakeDirs;
  using ::vellis::testing::Vellis;
  using ::vellis::testing::WriteFile;
  const std::string share = root_.Path("/volume1/notes");
  WriteFile(share + "/plans/budget.txt", "The budget plan for next year\n");
  WriteFile(share + "/plans/todo.md", "Nothing about money here\n");
  WriteFile(share + "/#recycle/old-budget.txt", "An old budget, thrown away\n");
  ASSERT_EQ(0, symlink("/etc", (share + "/etc").c_str()));
  ASSERT_EQ(Vellis("share add notes " + share + " --recycle-bin").status, 0);

  ::vellis::testing::CliRun load = Vellis("index load notes");
  EXPECT_EQ(load.status, 0) << load.out;
  // The share's folder, plans/, its two files, #recycle/ and the link: the
  // recycle bin and the link are refused.
  EXPECT_EQ(load.out,
            "loaded 4 documents into fileindex_notes (3 paths refused by the indexing rules, "
            "0 failed)\n")
      << load.out;

  ::vellis::testing::CliRun hits = Vellis("search budget --index fileindex_notes");
  EXPECT_EQ(hits.status, 0) << hits.out;
  EXPECT_NE(hits.out.find(share + "/plans/budget.txt\n"), std::string::npos) << hits.out;
  EXPECT_EQ(hits.out.find("old-budget"), std::string::npos) << hits.out;
  EXPECT_NE(hits.out.find("1 hit"), std::string::npos) << hits.out;

  ::vellis::testing::CliRun unknown = Vellis("index load nosuchshare");
  EXPECT_EQ(unknown.status, 1);
  EXPECT_NE(unknown.out.find("error 800"), std::string::npos) << unknown.out;
}

}  // namespace
}  // namespace vellis::searchd::testing
