// vellis-fileindexd and vellis-searchd stopped in the middle of a round,
// cleanly or not, and started again: the round is carried out again from
// its side file, and the index ends up holding every file once, as it is.
#include <gtest/gtest.h>
#include <signal.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "tests/daemons/fileindexd/fileindexd_fixture.h"

namespace vellis::testing {
namespace {

using fileindex::kEventCreate;
using fileindex::kEventDelete;
using fileindex::kEventModify;
using fileindex::kEventReindex;

class FileindexdCrashTest : public FileindexdTest {
 protected:
  // Small batches and frequent commits: a round of 1,000 files takes long
  // enough to be caught in the middle, and commits along the way.
  std::vector<std::string> DaemonArgs() const override {
    return {"--settle-ms=50", "--batch=5", "--commit-every=100"};
  }

  // A new folder of 1,000 files below the indexed one, reported as the
  // monitor reports a folder that appears; returns once its crawl has
  // looked at some of it (and fails when the round ended first).
  void StartCrawl(const std::string& rel) {
    WriteTree(rel, 4, 250, "original");
    Report(kEventReindex, rel);
    ASSERT_TRUE(WaitFor(
        [&] {
          const Json::Value s = ShareStatus();
          return s["crawl"]["crawled"].asInt() >= 100 || s["last_round"]["upserted"] >= 1000;
        },
        "the crawl runs"));
    const Json::Value s = ShareStatus();
    ASSERT_EQ(s["state"], "crawling") << "the round ended before it was caught: " << s;
  }
  // Changes while a daemon is down, reported as they happen: an edit, a
  // delete, a new file.
  void ChangeWhileDown(const std::string& rel) {
    Write(rel + "/d0/f0.txt", "changed and longer");
    Report(kEventModify, rel + "/d0/f0.txt");
    ASSERT_EQ(unlink((share_ + rel + "/d3/f9.txt").c_str()), 0);
    Report(kEventDelete, rel + "/d3/f9.txt");
    Write(rel + "/new.txt", "changed");
    Report(kEventCreate, rel + "/new.txt");
  }
  void ExpectCaughtUp(const std::string& rel) {
    ASSERT_TRUE(WaitSettled());
    EXPECT_EQ(Diff(Disk("/docs"), Index()), "");
    EXPECT_EQ(Found("changed", rel),
              (std::vector<std::string>{rel + "/d0/f0.txt", rel + "/new.txt"}));
    EXPECT_EQ(Hits("original", rel), 1000 - 2);
  }
};

// The daemon killed, or stopped, during a crawl or while a pause holds it
// between batches; the folder changes while it is down.
TEST_F(FileindexdCrashTest, DaemonStoppedMidRoundCatchesUpAfterARestart) {
  AddFolder("/docs");
  ASSERT_TRUE(WaitSettled());
  const struct {
    const char* what;
    int sig;
    bool paused;  // held by a pause when stopped
    int status;   // its exit status, minus the signal
  } cases[] = {
      {"SIGKILL while crawling", SIGKILL, false, -SIGKILL},
      {"SIGKILL while paused", SIGKILL, true, -SIGKILL},
      {"SIGTERM while crawling", SIGTERM, false, 0},
  };
  int n = 0;
  for (const auto& c : cases) {
    SCOPED_TRACE(c.what);
    const std::string rel = "/docs/t" + std::to_string(n++);
    ASSERT_NO_FATAL_FAILURE(StartCrawl(rel));
    if (c.paused) {
      Json::Value data;
      data["resume_time"] = 0;
      EXPECT_EQ(Command("pause", data)["success"], true);
      ASSERT_TRUE(WaitFor([&] { return ShareStatus()["state"] == "paused"; }, "the worker holds"));
    }
    ASSERT_EQ(daemon_.Stop(c.sig), c.status) << daemon_.LogTail();
    EXPECT_EQ(access((QueuePath() + ".tmp").c_str(), F_OK), 0) << "the side file stays";
    ASSERT_NO_FATAL_FAILURE(ChangeWhileDown(rel));
    ASSERT_TRUE(daemon_.Start(DaemonArgs())) << daemon_.LogTail();
    EXPECT_EQ(Command("status")["data"]["paused"], false) << "a pause lasts while the daemon runs";
    ASSERT_NO_FATAL_FAILURE(ExpectCaughtUp(rel));
  }
}

// The search daemon killed, or stopped, during a crawl and started again:
// the round fails or waits, and is carried out again once it is back.
TEST_F(FileindexdCrashTest, SearchDaemonStoppedMidRoundLosesNothing) {
  AddFolder("/docs");
  ASSERT_TRUE(WaitSettled());
  const struct {
    const char* what;
    int sig;
  } cases[] = {{"SIGKILL", SIGKILL}, {"SIGTERM", SIGTERM}};
  int n = 0;
  for (const auto& c : cases) {
    SCOPED_TRACE(c.what);
    const std::string rel = "/docs/t" + std::to_string(n++);
    ASSERT_NO_FATAL_FAILURE(StartCrawl(rel));
    searchd_.Stop(c.sig);
    if (c.sig == SIGKILL) {  // refused at once: the round fails and waits
      ASSERT_TRUE(WaitFor([&] { return ShareStatus()["state"] == "waiting for the search daemon"; },
                          "the round fails"));
      EXPECT_TRUE(ShareStatus()["documents"].isNull());
    }
    ASSERT_NO_FATAL_FAILURE(ChangeWhileDown(rel));
    ASSERT_TRUE(searchd_.Start());
    ASSERT_NO_FATAL_FAILURE(ExpectCaughtUp(rel));
  }
}

}  // namespace
}  // namespace vellis::testing
