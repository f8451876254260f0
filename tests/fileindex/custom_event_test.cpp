// Custom events: the line written into the share's queue, failures turned
// into the share's need-reindex bit, and appenders racing the rotation.
#include "fileindex/util.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <map>
#include <sstream>
#include <string>
#include <vector>

#include "common/json_util.h"
#include "fileindex/optree.h"
#include "fileindex/queue_mgr.h"
#include "fileindex/status_mgr.h"
#include "tests/support/folder_env.h"

namespace vellis::fileindex {
namespace {

using testing::FolderEnv;
using testing::ParseJson;
using testing::ReadFile;
using testing::WriteFile;

std::vector<std::string> Lines(const std::string& text) {
  std::vector<std::string> lines;
  std::istringstream in(text);
  for (std::string line; std::getline(in, line);) lines.push_back(line);
  return lines;
}

class CustomEventTest : public ::testing::Test {
 protected:
  CustomEventTest() : share_(env_.AddShare("s")), queue_(env_.QueuePath("s")) {}

  // The share's bits in the status file, as a fresh StatusMgr reads them.
  int ShareStatus(const std::string& share) { return StatusMgr().GetShareStatus(share); }

  FolderEnv env_;
  std::string share_;
  std::string queue_;
};

TEST_F(CustomEventTest, RenameIsOneLineWithTheNewPathAsPath) {
  AddCustomEvent(256, share_ + "/b", share_ + "/a", Json::Value());
  std::string text = ReadFile(queue_);
  ASSERT_EQ(Lines(text).size(), 1u) << text;
  EXPECT_EQ(text.back(), '\n');
  // The JSON writer orders object members by key, so the raw text reads
  // {"data":null,"event":256,"path":...,"path_old":...}; the members, not
  // their order, are what the queue's reader depends on.
  Json::Value expected(Json::objectValue);
  expected["event"] = 256;
  expected["path"] = share_ + "/b";
  expected["path_old"] = share_ + "/a";
  expected["data"] = Json::Value();
  EXPECT_EQ(ParseJson(Lines(text)[0]), expected);
  Event event(Lines(text)[0]);
  EXPECT_EQ(event.event, 256u);
  EXPECT_EQ(event.path, share_ + "/b");
  EXPECT_EQ(event.path_old, share_ + "/a");
}

TEST_F(CustomEventTest, EventsAreAppendedAfterWhatTheQueueHolds) {
  const std::string monitor_line = R"({"event":2,"path":")" + share_ + R"(/x"})";
  WriteFile(queue_, monitor_line + "\n");
  Json::Value cfg = ParseJson(R"({"document":true,"audio":false,"video":false,"photo":true})");
  AddCustomEvent(0x20000, share_ + "/dir", "", cfg);
  AddCustomEvent(0x10000, share_ + "/new\nline", "", Json::Value());
  std::vector<std::string> lines = Lines(ReadFile(queue_));
  ASSERT_EQ(lines.size(), 3u) << ReadFile(queue_);
  EXPECT_EQ(lines[0], monitor_line);
  EXPECT_EQ(Event(lines[1]).event, 0x20000u);
  EXPECT_EQ(Event(lines[1]).data, cfg);
  EXPECT_EQ(Event(lines[2]).path, share_ + "/new\nline") << "a newline in a path stays escaped";
  EXPECT_EQ(ShareStatus("s"), 0);
}

TEST_F(CustomEventTest, ShareThatDoesNotExistWritesNothingAndFlagsTheShare) {
  // The path lies in the share's folder, but the platform has no record of
  // the share (QORUShareGet fails).
  env_.platform().FailCall("QORUShareGet", ENOENT, "s");
  AddCustomEvent(0x10000, share_ + "/a", "", Json::Value());
  struct stat st;
  EXPECT_NE(lstat(queue_.c_str(), &st), 0) << "the queue was created";
  EXPECT_EQ(env_.platform().LogsContaining("AddCustomEvent failed, code=800").size(), 1u);
  EXPECT_EQ(env_.platform().LogsContaining("Set [s] need reindex").size(), 1u);
  EXPECT_EQ(ShareStatus("s"), kShareStatusNeedReindex);
}

TEST_F(CustomEventTest, QueueThatIsNotARegularFileIsNotFollowed) {
  const std::string target = env_.root().Path("/target");
  WriteFile(target, "kept\n");
  ASSERT_EQ(symlink(target.c_str(), queue_.c_str()), 0);
  AddCustomEvent(0x10000, share_ + "/a", "", Json::Value());
  EXPECT_EQ(ReadFile(target), "kept\n");
  EXPECT_EQ(env_.platform().LogsContaining("AddCustomEvent failed, code=502").size(), 1u);
  EXPECT_EQ(ShareStatus("s"), kShareStatusNeedReindex);
}

TEST_F(CustomEventTest, PathUnderNoShareIsOnlyLogged) {
  AddCustomEvent(0x10000, env_.Volume() + "/nosuch/a", "", Json::Value());
  EXPECT_EQ(env_.platform().LogsContaining("AddCustomEvent failed, code=502").size(), 1u);
  Json::Value status;
  EXPECT_FALSE(JsonFromFile(status, env_.StatusFile())) << "nothing to flag, nothing written";
}

// Writers in separate processes append while the queue is rotated over and
// over; every line must turn up exactly once, whole, in some side file or
// in the live queue at the end.
TEST_F(CustomEventTest, ParallelAppendersRacingTheRotationLoseAndTearNothing) {
  constexpr int kWriters = 4;
  constexpr int kEventsEach = 200;
  env_.platform().SetUSleepDivisor(100);  // lock retries after 0 to 9 ms
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
  QueueMgr queue(queue_);
  std::string collected;
  int rounds_with_lines = 0;
  auto rotate = [&] {
    queue.PrepareTmpQueue();
    std::string side = ReadFile(queue.queue_path_tmp());
    if (!side.empty()) ++rounds_with_lines;
    collected += side;
    queue.DeleteTmp();
  };
  int running = kWriters;
  while (running > 0) {
    rotate();
    env_.platform().target()->USleep(2000);
    running = 0;
    for (pid_t& pid : writers) {
      if (pid > 0 && waitpid(pid, nullptr, WNOHANG) == 0) ++running;
    }
  }
  rotate();
  collected += ReadFile(queue_);

  std::map<std::string, int> seen;
  for (const std::string& line : Lines(collected)) {
    Json::Value v;
    ASSERT_TRUE(JsonFromString(v, line)) << "torn line: " << line;
    ++seen[v["path"].asString()];
  }
  EXPECT_EQ(seen.size(), static_cast<size_t>(kWriters * kEventsEach));
  for (const auto& [path, count] : seen) EXPECT_EQ(count, 1) << path;
  EXPECT_GE(rounds_with_lines, 2) << "the queue was never rotated while writers ran";
  EXPECT_EQ(ShareStatus("s"), 0) << "a writer failed and flagged the share";
}

}  // namespace
}  // namespace vellis::fileindex
