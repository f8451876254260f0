#include "fileindex/queue_mgr.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <sstream>
#include <string>
#include <vector>

#include "common/error.h"
#include "tests/support/fake_platform.h"
#include "tests/support/temp_root.h"

namespace vellis::fileindex {
namespace {

std::string Modify(const std::string& path) { return R"({"event":2,"path":")" + path + R"("})"; }

bool Exists(const std::string& path) {
  struct stat st;
  return lstat(path.c_str(), &st) == 0;
}

class QueueMgrTest : public ::testing::Test {
 protected:
  // Runs one round and returns the printed forms of the delivered operations.
  std::vector<std::string> Round(bool tmp, unsigned* count = nullptr) {
    std::vector<std::string> got;
    unsigned n = mgr_.ProcessOP(
        [&](std::shared_ptr<OP> op) {
          std::ostringstream os;
          os << op;
          got.push_back(os.str());
        },
        tmp);
    if (count) *count = n;
    return got;
  }

  testing::TempRoot root_;
  testing::FakePlatform platform_;
  testing::ScopedPlatform scoped_{&platform_};
  std::string queue_ = root_.Path("/share.queue");
  std::string side_ = queue_ + ".tmp";
  QueueMgr mgr_{queue_};

  // A query over a live queue and a side file (each absent when empty).
  struct QueryCase {
    std::string live;
    std::string side;
    std::string query;
    bool expected;
  };
  template <size_t N>
  void ExpectQuery(const QueryCase (&cases)[N], bool (QueueMgr::*query)(const std::string&) const) {
    for (const auto& c : cases) {
      remove(queue_.c_str());
      remove(side_.c_str());
      if (!c.live.empty()) testing::WriteFile(queue_, c.live + "\n");
      if (!c.side.empty()) testing::WriteFile(side_, c.side + "\n");
      EXPECT_EQ((mgr_.*query)(c.query), c.expected)
          << "live: " << c.live << ", side: " << c.side << ", query: " << c.query;
    }
  }
};

TEST_F(QueueMgrTest, NoQueueAndNoSideFileProcessNothing) {
  unsigned count = 99;
  EXPECT_TRUE(Round(true, &count).empty());
  EXPECT_EQ(count, 0u);
  EXPECT_TRUE(Round(false, &count).empty());
  EXPECT_EQ(count, 0u);
  EXPECT_FALSE(Exists(side_));
}

TEST_F(QueueMgrTest, RoundMovesTheLiveQueueAsideAndKeepsTheSideFile) {
  const std::string text = Modify("/s/a") + "\n" + Modify("/s/b") + "\n";
  testing::WriteFile(queue_, text);
  unsigned count = 0;
  EXPECT_EQ(Round(true, &count), (std::vector<std::string>{"[02] /s/a", "[02] /s/b"}));
  EXPECT_EQ(count, 2u);
  EXPECT_FALSE(Exists(queue_));
  EXPECT_EQ(testing::ReadFile(side_), text);  // deleted only by the caller, after success
  mgr_.DeleteTmp();
  EXPECT_FALSE(Exists(side_));
  mgr_.DeleteTmp();  // a missing side file is no error
}

TEST_F(QueueMgrTest, LeftoverSideFileGoesFirstAndTheLiveQueueWaits) {
  testing::WriteFile(side_, Modify("/s/old") + "\n");
  const std::string live = Modify("/s/new") + "\n";
  testing::WriteFile(queue_, live);
  // The first round fails half-way, as if the process had died.
  EXPECT_THROW(mgr_.ProcessOP([](std::shared_ptr<OP>) { throw Error(kErrBusy, "busy"); }, true),
               Error);
  EXPECT_EQ(Round(true), (std::vector<std::string>{"[02] /s/old"}));
  EXPECT_EQ(testing::ReadFile(queue_), live);
  mgr_.DeleteTmp();
  EXPECT_EQ(Round(true), (std::vector<std::string>{"[02] /s/new"}));
  EXPECT_FALSE(Exists(queue_));
}

TEST_F(QueueMgrTest, WithoutSideFileTheLiveQueueIsReadInPlace) {
  const std::string text = Modify("/s/a");  // the last line needs no newline
  testing::WriteFile(queue_, text);
  EXPECT_EQ(Round(false), (std::vector<std::string>{"[02] /s/a"}));
  EXPECT_EQ(testing::ReadFile(queue_), text);
  EXPECT_FALSE(Exists(side_));
}

TEST_F(QueueMgrTest, PlantedSideFileLinkIsReplacedNeverFollowed) {
  const std::string target = root_.Path("/precious");
  testing::WriteFile(target, "keep me\n");
  ASSERT_EQ(symlink(target.c_str(), side_.c_str()), 0);
  testing::WriteFile(queue_, Modify("/s/a") + "\n");
  EXPECT_EQ(Round(true), (std::vector<std::string>{"[02] /s/a"}));
  EXPECT_EQ(testing::ReadFile(target), "keep me\n");
}

TEST_F(QueueMgrTest, QueueThatIsNotARegularFileIsRefusedWithoutHanging) {
  const std::string target = root_.Path("/target");
  testing::WriteFile(target, Modify("/s/secret") + "\n");
  struct Case {
    const char* what;
    void (*make)(const std::string& path, const std::string& target);
  } cases[] = {
      {"missing", [](const std::string&, const std::string&) {}},
      {"symbolic link", [](const std::string& p,
                           const std::string& t) { ASSERT_EQ(symlink(t.c_str(), p.c_str()), 0); }},
      {"FIFO",
       [](const std::string& p, const std::string&) { ASSERT_EQ(mkfifo(p.c_str(), 0644), 0); }},
      {"directory", [](const std::string& p, const std::string&) { testing::MakeDirs(p); }},
  };
  for (const auto& c : cases) {
    for (bool side : {false, true}) {
      const std::string path = side ? side_ : queue_;
      c.make(path, target);
      try {
        side ? mgr_.GetOPTreeTmp() : mgr_.GetOPTree();
        ADD_FAILURE() << c.what << (side ? " side file" : " queue") << " was read";
      } catch (const Error& e) {
        EXPECT_EQ(e.GetCode(), kErrInternal) << c.what;
        EXPECT_EQ(std::string(e.what()).rfind("Failed to open queue, reason=", 0), 0u)
            << c.what << ": " << e.what();
      }
      // A round skips such a live queue: nothing is read through it, nothing moved.
      if (!side) {
        unsigned count = 99;
        EXPECT_TRUE(Round(true, &count).empty()) << c.what;
        EXPECT_EQ(count, 0u) << c.what;
        EXPECT_EQ(Exists(queue_), std::string(c.what) != "missing") << c.what;
      }
      remove(path.c_str());
    }
  }
  EXPECT_EQ(testing::ReadFile(target), Modify("/s/secret") + "\n");
}

TEST_F(QueueMgrTest, BadLinesAreLoggedAndSkippedAndTheRestIsRead) {
  const std::string mib_line = [] {
    std::string head = R"({"event":2,"path":"/s/big","data":")";
    return head + std::string((1u << 20) - head.size() - 2, 'x') + "\"}";
  }();
  ASSERT_EQ(mib_line.size(), 1u << 20);
  struct Case {
    const char* what;
    std::string line;
    int code;
  } cases[] = {
      {"empty line", "", 906},
      {"not JSON", "not json", 906},
      {"truncated line", R"({"event":2,"pa)", 906},
      {"line of 1 MiB", mib_line, 906},
      {"NUL byte", std::string(R"({"event":2,"path":"/s/n)") + '\0' + R"("})", 906},
      {"invalid UTF-8 in the path", "{\"event\":2,\"path\":\"/s/\xff\xfe\"}", 906},
      {"overlong UTF-8 in the path", "{\"event\":2,\"path\":\"/s/\xc0\xaf\"}", 906},
      {"deeply nested data",
       R"({"event":2,"path":"/s/n","data":)" + std::string(2000, '[') + std::string(2000, ']') +
           "}",
       906},
      {"relative path", Modify("s/a"), 9999},
      {"doubled slash", Modify("/s//a"), 9999},
      {"trailing slash", Modify("/s/a/"), 9999},
      {"dot-dot component", Modify("/s/../etc"), 9999},
      {"event of the wrong type", R"({"event":"2","path":"/s/a"})", 120},
      {"missing path", R"({"event":2})", 120},
  };
  for (const auto& c : cases) {
    testing::WriteFile(queue_, Modify("/s/before") + "\n" + c.line + "\n" + Modify("/s/after"));
    platform_.ClearLogs();
    unsigned count = 0;
    EXPECT_EQ(Round(false, &count), (std::vector<std::string>{"[02] /s/before", "[02] /s/after"}))
        << c.what;
    EXPECT_EQ(count, 2u) << c.what;
    std::vector<std::string> failed = platform_.LogsContaining("InsertEvent failed");
    ASSERT_EQ(failed.size(), 1u) << c.what;
    EXPECT_NE(failed[0].find("code=" + std::to_string(c.code) + ","), std::string::npos)
        << c.what << ": " << failed[0];
  }
}

TEST_F(QueueMgrTest, LineJustUnderOneMebibyteIsRead) {
  std::string head = R"({"event":2,"path":"/s/big","data":")";
  std::string line = head + std::string((1u << 20) - 1 - head.size() - 2, 'x') + "\"}";
  ASSERT_EQ(line.size(), (1u << 20) - 1);
  testing::WriteFile(queue_, line + "\n" + Modify("/s/after") + "\n");
  EXPECT_EQ(Round(false), (std::vector<std::string>{"[02] /s/big", "[02] /s/after"}));
}

TEST_F(QueueMgrTest, FindsAReindexOnThePathOrAnAncestorOnly) {
  const QueryCase cases[] = {
      {R"({"event":65536,"path":"/volume1/s/a"})", "", "/volume1/s/a/b", true},
      {R"({"event":65536,"path":"/volume1/s/a"})", "", "/volume1/s/a", true},
      {R"({"event":65536,"path":"/volume1/s/a"})", "", "/volume1/s", false},
      {R"({"event":65538,"path":"/volume1/s/a"})", "", "/volume1/s/a/b", false},
      {R"({"event":196608,"path":"/volume1/s/a"})", "", "/volume1/s/a/b", false},
      {R"({"event":65536,"path":"/volume1/s/ab"})", "", "/volume1/s/a", false},
      {R"({"event":65536,"path":"/volume1/s/a"})", "", "/volume1/s/ab", false},
      {"not json\n" + Modify("/volume1/s/a"), R"({"event":65536,"path":"/volume1"})",
       "/volume1/s/a/b", true},
      {"", "", "/volume1/s/a", false},
  };
  ExpectQuery(cases, &QueueMgr::IsFullPathHasReindex);
}

TEST_F(QueueMgrTest, FindsPendingWorkAtOrBelowAPathByWholeComponents) {
  const QueryCase cases[] = {
      {Modify("/volume1/s/ab"), "", "/volume1/s/a", false},
      {Modify("/volume1/s/a"), "", "/volume1/s/a", true},
      {Modify("/volume1/s/a/x"), "", "/volume1/s/a", true},
      {Modify("/volume1/s"), "", "/volume1/s/a", false},
      {R"({"event":256,"path":"/volume1/t/y","path_old":"/volume1/s/a/y"})", "", "/volume1/s/a",
       true},
      {R"({"event":256,"path":"/volume1/t/y","path_old":"/volume1/s/ab"})", "", "/volume1/s/a",
       false},
      {"not json", Modify("/volume1/s/a/z"), "/volume1/s/a", true},
      {"not json", "", "/volume1/s/a", false},
  };
  ExpectQuery(cases, &QueueMgr::IsFullPathProcessing);
}

}  // namespace
}  // namespace vellis::fileindex
