// A share's queue: rounds over the live queue and its side file, bad lines,
// the searches for pending work, the quick "certainly not" filter, and the
// custom events appended to it.
#include "fileindex/queue_mgr.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <map>
#include <sstream>

#include "common/error.h"
#include "common/json_util.h"
#include "fileindex/queue_path_filter.h"
#include "fileindex/status_mgr.h"
#include "fileindex/util.h"
#include "tests/support/folder_env.h"

namespace vellis::fileindex {
namespace {

using Strings = std::vector<std::string>;
using testing::ReadFile;
using testing::WriteFile;

std::string Modify(const std::string& path) { return R"({"event":2,"path":")" + path + R"("})"; }
const std::string kReindexA = R"({"event":65536,"path":"/v/s/a"})";

class QueueMgrTest : public testing::FolderEnvTest {
 protected:
  // The printed operations of one round, then "count=N".
  Strings Round(bool tmp) {
    Strings got;
    unsigned n = mgr_.ProcessOP(
        [&](std::shared_ptr<OP> op) {
          std::ostringstream os;
          os << op;
          got.push_back(os.str());
        },
        tmp);
    got.push_back("count=" + std::to_string(n));
    return got;
  }

  // Writes the live queue and the side file (each absent when empty).
  void Write(const std::string& live, const std::string& side) {
    remove(queue_.c_str());
    remove(side_.c_str());
    if (!live.empty()) WriteFile(queue_, live + "\n");
    if (!side.empty()) WriteFile(side_, side + "\n");
  }

  const std::string share_ = AddShare("s"), queue_ = QueuePath("s"), side_ = queue_ + ".tmp";
  QueueMgr mgr_{queue_};
};

// A side file planted as a link is replaced, never followed. A round that
// fails half-way, as if the process had died, leaves its side file to go
// first, and the live queue waits.
TEST_F(QueueMgrTest, RoundsMoveTheQueueAsideAndFinishALeftoverSideFileFirst) {
  WriteFile(root_.Path("/precious"), "keep me\n");
  ASSERT_EQ(symlink(root_.Path("/precious").c_str(), side_.c_str()), 0);
  WriteFile(queue_, Modify("/s/old") + "\n");
  EXPECT_THROW(mgr_.ProcessOP([](std::shared_ptr<OP>) { throw Error(kErrBusy, "busy"); }, true),
               Error);
  EXPECT_EQ(ReadFile(root_.Path("/precious")), "keep me\n");
  WriteFile(queue_, Modify("/s/new") + "\n");
  EXPECT_EQ(Round(true), (Strings{"[02] /s/old", "count=1"}));
  EXPECT_EQ(ReadFile(queue_), Modify("/s/new") + "\n");
  mgr_.DeleteTmp();
  EXPECT_EQ(Round(true), (Strings{"[02] /s/new", "count=1"}));
  mgr_.DeleteTmp();
  EXPECT_EQ(Round(true), Strings{"count=0"});
}

// Nothing is read through a link, FIFO or directory, nothing hangs, and a
// round leaves such a live queue where it is.
TEST_F(QueueMgrTest, QueueThatIsNotARegularFileIsRefused) {
  WriteFile(root_.Path("/target"), Modify("/s/secret") + "\n");
  for (const std::string kind : {"link", "FIFO", "directory"}) {
    ASSERT_EQ(kind == "link"   ? symlink(root_.Path("/target").c_str(), queue_.c_str())
              : kind == "FIFO" ? mkfifo(queue_.c_str(), 0644)
                               : mkdir(queue_.c_str(), 0755),
              0);
    EXPECT_EQ(testing::Thrown([&] { mgr_.GetOPTree(); }).substr(0, 33),
              "502 Failed to open queue, reason=")
        << kind;
    EXPECT_EQ(Round(true), Strings{"count=0"}) << kind;
    EXPECT_EQ(access(queue_.c_str(), F_OK), 0) << kind;
    remove(queue_.c_str());
  }
}

TEST_F(QueueMgrTest, BadLinesAreLoggedAndSkippedAndTheRestIsRead) {
  const std::string head = R"({"event":2,"path":"/s/big","data":")";
  const std::string mib_line = head + std::string((1u << 20) - head.size() - 2, 'x') + "\"}";
  struct Case {
    std::string line;
    int code;
  } cases[] = {
      {"", 906},
      {R"({"event":2,"pa)", 906},
      {mib_line, 906},
      {"{\"event\":2,\"path\":\"/s/\xff\xfe\"}", 906},
      {R"({"event":2,"path":"/s/n","data":)" + std::string(2000, '[') + std::string(2000, ']') +
           "}",
       906},
      {Modify("s/a"), 9999},
      {Modify("/s/../etc"), 9999},
      {R"({"event":"2","path":"/s/a"})", 120},
  };
  for (const auto& c : cases) {
    WriteFile(queue_, Modify("/s/before") + "\n" + c.line + "\n" + Modify("/s/after"));
    platform_.ClearLogs();
    EXPECT_EQ(Round(false), (Strings{"[02] /s/before", "[02] /s/after", "count=2"})) << c.line;
    const Strings failed = platform_.LogsContaining("InsertEvent failed");
    ASSERT_EQ(failed.size(), 1u) << c.line.substr(0, 40);
    EXPECT_NE(failed[0].find("code=" + std::to_string(c.code) + ","), std::string::npos)
        << failed[0].substr(0, 200);
  }
  // One byte shorter, the line is read.
  WriteFile(queue_, mib_line.substr(0, mib_line.size() - 3) + "\"}\n");
  EXPECT_EQ(Round(false), (Strings{"[02] /s/big", "count=1"}));
}

TEST_F(QueueMgrTest, FindsAReindexOnThePathOrAnAncestorOnly) {
  struct Case {
    std::string live, side, query;
    bool found;
  } cases[] = {
      {kReindexA, "", "/v/s/a/b", true},
      {kReindexA, "", "/v/s/a", true},
      {kReindexA, "", "/v/s", false},
      {kReindexA, "", "/v/s/ab", false},
      {R"({"event":65538,"path":"/v/s/a"})", "", "/v/s/a/b", false},
      {R"({"event":65536,"path":"/v/s/ab"})", "", "/v/s/a", false},
      {"not json\n" + Modify("/v/s/a"), R"({"event":65536,"path":"/v"})", "/v/s/a/b", true},
      {"", "", "/v/s/a", false},
  };
  for (const auto& c : cases) {
    Write(c.live, c.side);
    EXPECT_EQ(mgr_.IsFullPathHasReindex(c.query), c.found) << c.live << c.side << c.query;
  }
}

// Pending work at or below a path, by whole components; the filter never
// says no where the search finds work.
TEST_F(QueueMgrTest, FindsPendingWorkAtOrBelowAPathByWholeComponents) {
  const std::string rename = R"({"event":256,"path":"/v/t/y","path_old":"/v/s/a/y"})";
  struct Case {
    std::string live, side;
    bool found;
  } cases[] = {
      {Modify("/v/s/ab"), "", false},
      {Modify("/v/s/a"), "", true},
      {Modify("/v/s/a/x"), "", true},
      {Modify("/v/s"), "", false},
      {rename, "", true},
      {R"({"event":256,"path":"/v/t/y","path_old":"/v/s/ab"})", "", false},
      {"not json", Modify("/v/s/a/z"), true},
      {R"({"event":2,"path":"\/v\/s\/a\/esc"})", "", true},
      {R"({"event": 64 , "path" : "/v/s/a/spaced" })", "", true},
      {"not json /v/s/a", "", false},
  };
  for (const auto& c : cases) {
    Write(c.live, c.side);
    EXPECT_EQ(mgr_.IsFullPathProcessing("/v/s/a"), c.found) << c.live << c.side;
    EXPECT_TRUE(!c.found || QueueMayHoldPath(queue_, "/v/s/a") || QueueMayHoldPath(side_, "/v/s/a"))
        << c.live << c.side;
  }
  Write(Modify("/v/s/a/file.txt") + "\n" + rename, "");
  for (const char* none : {"/v/s/ab", "/v/s/a/file", "/w", "/v/s/a/y/z"}) {
    EXPECT_FALSE(QueueMayHoldPath(queue_, none)) << none;
  }
}

// The filter's pass is shared while the file stays the same; a changed or
// rotated file is read again.
TEST_F(QueueMgrTest, FilterSeesAppendedLinesAndARotatedQueue) {
  WriteFile(queue_, Modify("/v/s/a/f") + "\n");
  EXPECT_TRUE(QueueMayHoldPath(queue_, "/v/s/a"));
  EXPECT_FALSE(QueueMayHoldPath(queue_, "/v/s/b"));
  WriteFile(queue_, Modify("/v/s/a/f") + "\n" + Modify("/v/s/b/g") + "\n");
  EXPECT_TRUE(QueueMayHoldPath(queue_, "/v/s/b"));
  ASSERT_EQ(rename(queue_.c_str(), side_.c_str()), 0);
  WriteFile(queue_, Modify("/v/s/c/h") + "\n");
  EXPECT_FALSE(QueueMayHoldPath(queue_, "/v/s/b"));
  EXPECT_TRUE(QueueMayHoldPath(side_, "/v/s/b"));
  // Absent, or not a regular file: nothing, as the search says.
  ASSERT_EQ(rename(queue_.c_str(), root_.Path("/elsewhere").c_str()), 0);
  EXPECT_FALSE(QueueMayHoldPath(queue_, "/v/s/c"));
  ASSERT_EQ(symlink(root_.Path("/elsewhere").c_str(), queue_.c_str()), 0);
  EXPECT_FALSE(QueueMayHoldPath(queue_, "/v/s/c"));
}

// A share the platform does not know, or a queue that is a link: logged
// and the share flagged; a path under no share is only logged.
TEST_F(QueueMgrTest, AFailedEventIsLoggedAndFlagsItsShare) {
  WriteFile(root_.Path("/target"), "kept\n");
  ASSERT_EQ(symlink(root_.Path("/target").c_str(), queue_.c_str()), 0);
  AddCustomEvent(0x10000, Volume() + "/nosuch/a", "", Json::Value());
  EXPECT_EQ(access(StatusPath().c_str(), F_OK), -1) << "nothing to flag";
  AddCustomEvent(0x10000, share_ + "/a", "", Json::Value());
  platform_.FailCall("QORUShareGet", ENOENT, "s");
  AddCustomEvent(0x10000, share_ + "/b", "", Json::Value());
  EXPECT_EQ(ReadFile(root_.Path("/target")), "kept\n");
  EXPECT_EQ(platform_.LogsContaining("AddCustomEvent failed, code=502").size(), 2u);
  EXPECT_EQ(platform_.LogsContaining("AddCustomEvent failed, code=800").size(), 1u);
  EXPECT_EQ(StatusMgr().GetShareStatus("s"), kShareStatusNeedReindex);
}

// Writers in separate processes append while the queue is rotated over and
// over; every line turns up exactly once, whole.
TEST_F(QueueMgrTest, ParallelAppendersRacingTheRotationLoseAndTearNothing) {
  constexpr int kWriters = 4, kEventsEach = 200;
  platform_.SetRealUSleep(100);  // lock retries after 0 to 9 ms
  std::vector<pid_t> writers;
  for (int w = 0; w < kWriters; ++w) {
    pid_t pid = fork();
    if (pid == 0) {
      for (int i = 0; i < kEventsEach; ++i) {
        AddCustomEvent(0x10000, share_ + "/w" + std::to_string(w) + "/" + std::to_string(i), "",
                       Json::Value(i));
      }
      _exit(0);
    }
    writers.push_back(pid);
  }
  std::string collected;
  int rounds_with_lines = 0;
  for (bool running = true;;) {  // and one round after the last writer is done
    mgr_.PrepareTmpQueue();
    const std::string side = ReadFile(side_);
    rounds_with_lines += !side.empty();
    collected += side;
    mgr_.DeleteTmp();
    if (!running) break;
    platform_.target()->USleep(2000);
    running = false;
    for (pid_t pid : writers) running = running || waitpid(pid, nullptr, WNOHANG) == 0;
  }
  std::map<std::string, int> seen;
  std::istringstream in(collected + ReadFile(queue_));
  for (std::string line; std::getline(in, line);) {
    Json::Value v;
    ASSERT_TRUE(JsonFromString(v, line)) << "torn line: " << line;
    ++seen[v["path"].asString()];
  }
  EXPECT_EQ(seen.size(), static_cast<size_t>(kWriters * kEventsEach));
  for (const auto& [path, count] : seen) EXPECT_EQ(count, 1) << path;
  EXPECT_GE(rounds_with_lines, 2) << "the queue was never rotated while writers ran";
  EXPECT_EQ(StatusMgr().GetShareStatus("s"), 0) << "a writer failed and flagged the share";
}

}  // namespace
}  // namespace vellis::fileindex
