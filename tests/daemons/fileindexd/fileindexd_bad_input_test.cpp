// vellis-fileindexd against what it should not trip over: bad commands and
// garbage on its socket, changes asked for by an ordinary user, a share
// folder that goes away during a crawl, files that vanish between the crawl
// and their upsert, and names with a newline or that are not UTF-8.
#include <grp.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdio>
#include <filesystem>
#include <sstream>
#include <string>
#include <vector>

#include "sdk/frame.h"
#include "tests/daemons/fileindexd/fileindexd_fixture.h"

namespace vellis::testing {
namespace {

using fileindex::kEventCreate;
using fileindex::kEventDelete;
using fileindex::kEventReindex;

class FileindexdBadInputTest : public FileindexdTest {
 protected:
  // Small batches: a crawl of 1,000 files can be caught in the middle.
  std::vector<std::string> DaemonArgs() const override {
    return {"--settle-ms=50", "--batch=5", "--commit-every=100"};
  }
};

std::string Frame(const std::string& text) { return sdk::EncodeFrameHeader(text.size()) + text; }

// Frames that are not commands and commands that are wrong: each gets its
// error or a closed connection, and the daemon goes on answering others,
// even while a half-sent frame is still open.
TEST_F(FileindexdBadInputTest, BadCommandsAndGarbageLeaveTheDaemonServing) {
  AddFolder("/docs");
  ASSERT_TRUE(WaitSettled());
  const int kClosed = -1;  // no answer: the connection is closed
  const int kOpen = -2;    // no answer yet: the daemon waits for the rest
  const struct {
    const char* what;
    std::string bytes;
    int code;  // the answer's error code, 0 for success
    const char* msg;
  } cases[] = {
      {"length 0", sdk::EncodeFrameHeader(0), kClosed, ""},
      {"length above the largest message", sdk::EncodeFrameHeader(sdk::kMaxMessageSize + 1),
       kClosed, ""},
      {"half a header", std::string("\x05\x00", 2), kOpen, ""},
      {"a frame cut short", sdk::EncodeFrameHeader(100) + R"({"type": "pa)", kOpen, ""},
      {"not JSON", Frame("hello"), 120, "a command is"},
      {"bytes after the JSON", Frame(R"({"type": "status"} x)"), 120, "a command is"},
      {"not UTF-8", Frame("{\"type\": \"st\xff\"}"), 120, "a command is"},
      {"a NUL inside", Frame(std::string("{\"type\": \"status\"}\0", 19)), 120, "a command is"},
      {"not an object", Frame(R"(["status"])"), 120, "a command is"},
      {"no type", Frame(R"({"data": {"share_name": "s"}})"), 120, "a command is"},
      {"type not a string", Frame(R"({"type": 7})"), 120, "a command is"},
      {"unknown command", Frame(R"({"type": "reboot", "data": null})"), 120,
       "unknown command: reboot"},
      {"pause without data", Frame(R"({"type": "pause"})"), 120,
       "data.resume_time must be an integer"},
      {"pause with a text", Frame(R"({"type": "pause", "data": {"resume_time": "0"}})"), 120,
       "data.resume_time must be an integer"},
      {"pause with a fraction", Frame(R"({"type": "pause", "data": {"resume_time": 1.5}})"), 120,
       "data.resume_time must be an integer"},
      {"pause with an array", Frame(R"({"type": "pause", "data": [0]})"), 120,
       "data.resume_time must be an integer"},
      {"worker without a share", Frame(R"({"type": "worker_create", "data": {}})"), 120,
       "data.share_name must be a string"},
      {"share name a number", Frame(R"({"type": "worker_delete", "data": {"share_name": 1}})"), 120,
       "data.share_name must be a string"},
      {"share name a path", Frame(R"({"type": "worker_delete", "data": {"share_name": "s/x"}})"),
       120, "not a share name"},
      {"share name empty", Frame(R"({"type": "worker_create", "data": {"share_name": ""}})"), 120,
       "not a share name"},
      {"no such share", Frame(R"({"type": "worker_create", "data": {"share_name": "nosuch"}})"),
       800, ""},
      {"is_upsert not a bool",
       Frame(R"({"type": "notify_setting_changed", "data": {"share_name": "s", "is_upsert": 1}})"),
       120, "data.is_upsert must be a bool"},
      {"status with any data", Frame(R"({"type": "status", "data": [1, 2]})"), 0, ""},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.what);
    sdk::DomainSockConnection conn(daemon_.socket());
    ASSERT_TRUE(conn.Connect());
    conn.SetTimeouts(2000, 5000);
    ASSERT_EQ(send(conn.fd(), c.bytes.data(), c.bytes.size(), MSG_NOSIGNAL),
              static_cast<ssize_t>(c.bytes.size()));
    if (c.code != kOpen) {
      std::string answer;
      const bool answered = conn.Recv(answer);
      if (c.code == kClosed) {
        EXPECT_FALSE(answered) << answer;
      } else {
        ASSERT_TRUE(answered);
        Json::Value a;
        ASSERT_TRUE(JsonFromString(a, answer)) << answer;
        EXPECT_EQ(a["success"], c.code == 0) << answer;
        if (c.code != 0) {
          EXPECT_EQ(a["error"]["code"], c.code) << answer;
          EXPECT_NE(a["error"]["msg"].asString().find(c.msg), std::string::npos) << answer;
        }
      }
    }
    // Another client meanwhile, the garbage's connection still open.
    const Json::Value status = Command("status");
    EXPECT_EQ(status["success"], true) << JsonToString(status);
    EXPECT_EQ(status["data"]["paused"], false);
    EXPECT_EQ(status["data"]["shares"]["s"]["state"], "idle");
  }
  EXPECT_TRUE(daemon_.Running());
  // Still at work on the share.
  Write("/docs/a.txt");
  Report(kEventCreate, "/docs/a.txt");
  ASSERT_TRUE(WaitSettled());
  EXPECT_EQ(Index().count("/docs/a.txt"), 1u);
}

// An ordinary user may ask for the status and nothing else.
TEST_F(FileindexdBadInputTest, AnOrdinaryUserMayOnlyAskForTheStatus) {
  if (geteuid() != 0) GTEST_SKIP() << "needs root, to connect as another user";
  AddFolder("/docs");
  ASSERT_TRUE(WaitSettled());
  ASSERT_EQ(chmod(root_.path().c_str(), 0755), 0);  // the socket's folders, for the user
  const uid_t kUser = 65534;
  const std::vector<std::string> commands = {
      R"({"type": "pause", "data": {"resume_time": 0}})",
      R"({"type": "worker_delete", "data": {"share_name": "s"}})",
      R"({"type": "notify_setting_changed", "data": {"share_name": "s", "is_upsert": false}})",
      R"({"type": "status"})",
  };
  int out[2];
  ASSERT_EQ(pipe(out), 0);
  const pid_t child = fork();
  ASSERT_GE(child, 0);
  if (child == 0) {
    close(out[0]);
    if (setgroups(0, nullptr) != 0 || setresgid(kUser, kUser, kUser) != 0 ||
        setresuid(kUser, kUser, kUser) != 0) {
      _exit(2);
    }
    std::string answers;
    for (const std::string& c : commands) {
      try {
        answers += sdk::ExchangeText(daemon_.socket(), c, 5000) + "\n";
      } catch (...) {
        answers += "no answer\n";
      }
    }
    _exit(write(out[1], answers.data(), answers.size()) == static_cast<ssize_t>(answers.size())
              ? 0
              : 3);
  }
  close(out[1]);
  std::string answers;
  char buf[4096];
  for (ssize_t n; (n = read(out[0], buf, sizeof(buf))) > 0;) answers.append(buf, n);
  close(out[0]);
  int status = 0;
  ASSERT_EQ(waitpid(child, &status, 0), child);
  ASSERT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0) << status;

  std::istringstream lines(answers);
  std::string line;
  for (size_t i = 0; i < commands.size(); ++i) {
    SCOPED_TRACE(commands[i]);
    ASSERT_TRUE(std::getline(lines, line));
    Json::Value a;
    ASSERT_TRUE(JsonFromString(a, line)) << line;
    if (i + 1 < commands.size()) {
      EXPECT_EQ(a["error"]["code"], 503) << line;
      EXPECT_NE(line.find("not uid 65534"), std::string::npos) << line;
    } else {
      EXPECT_EQ(a["success"], true) << line;
      EXPECT_EQ(a["data"]["shares"]["s"]["state"], "idle") << line;
    }
  }
  // Nothing changed: not paused, and the worker still runs.
  EXPECT_EQ(Command("status")["data"]["paused"], false);
  Write("/docs/a.txt");
  Report(kEventCreate, "/docs/a.txt");
  ASSERT_TRUE(WaitSettled());
  EXPECT_EQ(Index().count("/docs/a.txt"), 1u);
}

// The share's folder removed while its worker crawls: the round ends
// without failing; the monitor's report of the removal clears the
// documents, and the folder is indexed again once it is back.
TEST_F(FileindexdBadInputTest, ShareFolderRemovedDuringACrawl) {
  AddFolder("/docs");
  ASSERT_TRUE(WaitSettled());
  WriteTree("/docs/t", 4, 250, "word");
  Report(kEventReindex, "/docs/t");
  ASSERT_TRUE(
      WaitFor([&] { return ShareStatus()["crawl"]["crawled"].asInt() >= 50; }, "the crawl runs"));
  std::filesystem::remove_all(share_);
  ASSERT_TRUE(WaitSettled());
  EXPECT_EQ(ShareStatus()["errors"], Json::Value(Json::arrayValue)) << "no round failed";

  Report(kEventDelete, "/docs");
  ASSERT_TRUE(WaitSettled());
  EXPECT_EQ(Diff({}, Index()), "");

  Write("/docs/back.txt", "back");
  Report(kEventReindex, "/docs");
  ASSERT_TRUE(WaitSettled());
  EXPECT_EQ(Diff(Disk("/docs"), Index()), "");
  EXPECT_TRUE(daemon_.Running());
}

// Files that the crawl listed vanish before it reaches them: their old
// documents go, though nobody reports the removal.
TEST_F(FileindexdBadInputTest, FilesThatVanishBeforeTheirUpsertLeaveTheIndex) {
  AddFolder("/docs");
  ASSERT_TRUE(WaitSettled());
  auto name = [](int i) {
    char buf[32];
    snprintf(buf, sizeof(buf), "/docs/t/f%04d.txt", i);
    return std::string(buf);
  };
  for (int i = 0; i < 1000; ++i) Write(name(i), "one");
  Report(kEventReindex, "/docs/t");
  ASSERT_TRUE(WaitSettled());
  ASSERT_EQ(Diff(Disk("/docs"), Index()), "");

  // Every file changes, so that a crawl reads each one again.
  for (int i = 0; i < 1000; ++i) Write(name(i), "version two");
  Report(kEventReindex, "/docs/t");
  ASSERT_TRUE(
      WaitFor([&] { return ShareStatus()["crawl"]["crawled"].asInt() >= 50; }, "the crawl runs"));
  Json::Value data;
  data["resume_time"] = 0;
  EXPECT_EQ(Command("pause", data)["success"], true);
  ASSERT_TRUE(WaitFor([&] { return ShareStatus()["state"] == "paused"; }, "the worker holds"));
  // The directory was listed whole when the crawl entered it; the files
  // after those it has sent are not read yet.
  const int sent = ShareStatus()["last_round"]["upserted"].asInt();
  ASSERT_LT(sent + 10, 1000) << "the crawl is nearly done";
  for (int i = sent + 10; i < 1000; ++i) ASSERT_EQ(unlink((share_ + name(i)).c_str()), 0);
  EXPECT_EQ(Command("resume")["success"], true);
  ASSERT_TRUE(WaitSettled());
  EXPECT_EQ(Diff(Disk("/docs"), Index()), "");
  EXPECT_EQ(ShareStatus()["errors"], Json::Value(Json::arrayValue)) << "no round failed";
}

// A newline is a name's byte like any other. A name that is not UTF-8
// cannot be sent to the search daemon: the crawl leaves it out and says so,
// and the share goes on being indexed.
TEST_F(FileindexdBadInputTest, NamesWithANewlineOrNotUtf8) {
  AddFolder("/docs");
  ASSERT_TRUE(WaitSettled());
  const std::string newline = "/docs/two\nlines.txt";
  Write(newline, "newline");
  Report(kEventCreate, newline);
  ASSERT_TRUE(WaitSettled());
  EXPECT_EQ(Found("newline"), (std::vector<std::string>{newline}));

  const std::string latin = "/docs/caf\xe9.txt";  // ISO 8859-1
  Write(latin, "latin");
  Write("/docs/d\xe9j\xe0/inner.txt", "inner");
  Write("/docs/fine.txt", "fine");
  Report(kEventCreate, latin);  // the queue line itself is not UTF-8
  Report(kEventReindex, "/docs");
  ASSERT_TRUE(WaitSettled());
  Docs want = Disk("/docs");
  for (const std::string& rel :
       {latin, std::string("/docs/d\xe9j\xe0"), std::string("/docs/d\xe9j\xe0/inner.txt")}) {
    ASSERT_EQ(want.erase(rel), 1u) << rel;
  }
  EXPECT_EQ(Diff(want, Index()), "");
  const Json::Value errors = ShareStatus()["errors"];
  ASSERT_EQ(errors.size(), 2u) << errors;
  EXPECT_EQ(errors[0], share_ + "/docs/caf\\xE9.txt: name is not UTF-8; not indexed");
  EXPECT_EQ(errors[1], share_ + "/docs/d\\xE9j\\xE0: name is not UTF-8; not indexed");

  // The share is not held up by them.
  ASSERT_EQ(unlink((share_ + newline).c_str()), 0);
  Report(kEventDelete, newline);
  Write("/docs/after.txt", "after");
  Report(kEventCreate, "/docs/after.txt");
  ASSERT_TRUE(WaitSettled());
  want = Disk("/docs");
  for (const std::string& rel :
       {latin, std::string("/docs/d\xe9j\xe0"), std::string("/docs/d\xe9j\xe0/inner.txt")}) {
    want.erase(rel);
  }
  EXPECT_EQ(Diff(want, Index()), "");
  EXPECT_EQ(Found("newline"), std::vector<std::string>{});
}

}  // namespace
}  // namespace vellis::testing
