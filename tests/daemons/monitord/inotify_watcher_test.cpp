// The inotify watcher and the router on real kernel events: each change
// made under a temporary tree must come out as the queue lines that the
// indexer expects, no more and no less.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <functional>
#include <string>
#include <vector>

#include "tests/daemons/monitord/watch_harness.h"
#include "tests/support/temp_root.h"

namespace vellis::monitord {
namespace {

using testing::Line;
using testing::WatchHarness;
using vellis::testing::MakeDirs;
using vellis::testing::TempRoot;
using vellis::testing::WriteFile;

// A, B: watched, their lines going to queues "qa" and "qb"; out: not watched.
struct Tree {
  std::string root, a, b, out;
};

// "qa 0x40 d /A/x" or "qa 0x100 f /A/y <- /A/x", paths below the tree's root.
std::string Show(const Tree& t, const Line& l) {
  auto rel = [&t](const std::string& p) {
    return p.compare(0, t.root.size(), t.root) == 0 ? p.substr(t.root.size()) : p;
  };
  char bits[16];
  snprintf(bits, sizeof(bits), "0x%x", l.event);
  std::string s = l.queue + " " + bits + " " + (l.is_dir ? "d " : "f ") + rel(l.path);
  if (!l.path_old.empty()) s += " <- " + rel(l.path_old);
  return s;
}

std::vector<std::string> Shown(const Tree& t, const std::vector<Line>& lines) {
  std::vector<std::string> out;
  for (const Line& l : lines) out.push_back(Show(t, l));
  std::sort(out.begin(), out.end());
  return out;
}

bool HasAll(const std::vector<std::string>& have, std::vector<std::string> want) {
  for (const std::string& w : want) {
    if (std::find(have.begin(), have.end(), w) == have.end()) return false;
  }
  return true;
}

void Append(const std::string& path, const std::string& text) {
  const int fd = open(path.c_str(), O_WRONLY | O_APPEND);
  ASSERT_GE(fd, 0) << path;
  ASSERT_EQ(write(fd, text.data(), text.size()), static_cast<ssize_t>(text.size()));
  close(fd);
}

void Run(const std::string& command) { ASSERT_EQ(system(command.c_str()), 0) << command; }

struct Case {
  const char* name;
  std::function<void(const Tree&)> before;  // made before the watch starts
  std::function<void(const Tree&)> act;
  std::vector<std::string> expect;  // sorted or not; compared as multisets
  bool exact;                       // false: these lines at least (a scan may repeat some)
};

class WatcherCaseTest : public ::testing::TestWithParam<Case> {};

TEST_P(WatcherCaseTest, MakesTheQueueLines) {
  const Case& c = GetParam();
  TempRoot tmp;
  Tree t{tmp.path(), tmp.Path("/A"), tmp.Path("/B"), tmp.Path("/out")};
  MakeDirs(t.a);
  MakeDirs(t.b);
  MakeDirs(t.out);
  if (c.before) c.before(t);
  WatchHarness h;
  h.Watch(t.a, "qa");
  h.Watch(t.b, "qb");
  ASSERT_TRUE(h.Settle());
  ASSERT_TRUE(h.lines().empty()) << Shown(t, h.lines())[0];

  c.act(t);
  std::vector<std::string> want = c.expect;
  std::sort(want.begin(), want.end());
  EXPECT_TRUE(h.WaitFor([&] { return HasAll(Shown(t, h.lines()), want); }))
      << ::testing::PrintToString(Shown(t, h.lines()));
  ASSERT_TRUE(h.Settle(60));
  const std::vector<std::string> got = Shown(t, h.lines());
  if (c.exact) {
    EXPECT_EQ(got, want);
  } else {
    EXPECT_TRUE(HasAll(got, want)) << ::testing::PrintToString(got);
    for (const std::string& g : got) {  // nothing but creates of what is there
      EXPECT_EQ(g.find("qa 0x40 "), 0u) << g;
    }
  }
}

const Case kCases[] = {
    {"CreateFileWithContent",
     nullptr,
     [](const Tree& t) { WriteFile(t.a + "/new.txt", "hello"); },
     {"qa 0x40 f /A/new.txt", "qa 0x2 f /A/new.txt"},
     true},
    {"CreateFolder",
     nullptr,
     [](const Tree& t) { ASSERT_EQ(mkdir((t.b + "/d").c_str(), 0755), 0); },
     {"qb 0x40 d /B/d"},
     true},
    {"WritesThenCloseMakeOneModify",
     [](const Tree& t) { WriteFile(t.a + "/log", ""); },
     [](const Tree& t) {
       const int fd = open((t.a + "/log").c_str(), O_WRONLY | O_APPEND);
       ASSERT_GE(fd, 0);
       for (int i = 0; i < 5; ++i) ASSERT_EQ(write(fd, "line\n", 5), 5);
       close(fd);
     },
     {"qa 0x2 f /A/log"},
     true},
    {"ChmodFile",
     [](const Tree& t) { WriteFile(t.a + "/f", "x"); },
     [](const Tree& t) { ASSERT_EQ(chmod((t.a + "/f").c_str(), 0600), 0); },
     {"qa 0x4 f /A/f"},
     true},
    {"ChmodFolder",
     [](const Tree& t) { MakeDirs(t.a + "/d"); },
     [](const Tree& t) { ASSERT_EQ(chmod((t.a + "/d").c_str(), 0700), 0); },
     {"qa 0x4 d /A/d"},
     true},
    {"ChmodWatchedFolderItself",
     nullptr,
     [](const Tree& t) { ASSERT_EQ(chmod(t.a.c_str(), 0700), 0); },
     {"qa 0x4 d /A"},
     true},
    {"DeleteFile",
     [](const Tree& t) { WriteFile(t.b + "/sub/f", "x"); },
     [](const Tree& t) { ASSERT_EQ(unlink((t.b + "/sub/f").c_str()), 0); },
     {"qb 0x80 f /B/sub/f"},
     true},
    {"RenameFileInPlace",
     [](const Tree& t) { WriteFile(t.a + "/old", "x"); },
     [](const Tree& t) { ASSERT_EQ(rename((t.a + "/old").c_str(), (t.a + "/new").c_str()), 0); },
     {"qa 0x100 f /A/new <- /A/old"},
     true},
    {"RenameFolderInPlace",
     [](const Tree& t) { WriteFile(t.a + "/d/f", "x"); },
     [](const Tree& t) { ASSERT_EQ(rename((t.a + "/d").c_str(), (t.a + "/e").c_str()), 0); },
     {"qa 0x100 d /A/e <- /A/d"},
     true},
    {"MoveFileBetweenQueues",
     [](const Tree& t) { WriteFile(t.a + "/f", "x"); },
     [](const Tree& t) { ASSERT_EQ(rename((t.a + "/f").c_str(), (t.b + "/g").c_str()), 0); },
     {"qa 0x80 f /A/f", "qb 0x40 f /B/g"},
     true},
    {"MoveFolderBetweenQueues",
     [](const Tree& t) { WriteFile(t.b + "/d/f", "x"); },
     [](const Tree& t) { ASSERT_EQ(rename((t.b + "/d").c_str(), (t.a + "/d").c_str()), 0); },
     // A created folder is crawled by the indexer: its content needs no lines.
     {"qb 0x80 d /B/d", "qa 0x40 d /A/d"},
     true},
    {"MoveFileOut",
     [](const Tree& t) { WriteFile(t.a + "/f", "x"); },
     [](const Tree& t) { ASSERT_EQ(rename((t.a + "/f").c_str(), (t.out + "/f").c_str()), 0); },
     {"qa 0x80 f /A/f"},
     true},
    {"MoveFolderOut",
     [](const Tree& t) { WriteFile(t.a + "/d/f", "x"); },
     [](const Tree& t) { ASSERT_EQ(rename((t.a + "/d").c_str(), (t.out + "/d").c_str()), 0); },
     {"qa 0x80 d /A/d"},
     true},
    {"MoveFileIn",
     [](const Tree& t) { WriteFile(t.out + "/f", "x"); },
     [](const Tree& t) { ASSERT_EQ(rename((t.out + "/f").c_str(), (t.b + "/f").c_str()), 0); },
     {"qb 0x40 f /B/f"},
     true},
    {"MoveFolderInWithFiles",
     [](const Tree& t) {
       WriteFile(t.out + "/d/f1", "1");
       WriteFile(t.out + "/d/sub/f2", "2");
       MakeDirs(t.out + "/d/empty");
     },
     [](const Tree& t) { ASSERT_EQ(rename((t.out + "/d").c_str(), (t.a + "/d").c_str()), 0); },
     {"qa 0x40 d /A/d", "qa 0x40 f /A/d/f1", "qa 0x40 d /A/d/sub", "qa 0x40 f /A/d/sub/f2",
      "qa 0x40 d /A/d/empty"},
     true},
    {"MkdirDeepThenFilesAtOnce",
     nullptr,
     [](const Tree& t) {
       // No pause between the folders and the files: each file is reported
       // by the kernel or by the read that follows the folder's watch.
       MakeDirs(t.a + "/p/q/r/s/t");
       for (const char* f : {"/p/1", "/p/q/2", "/p/q/r/3", "/p/q/r/s/4", "/p/q/r/s/t/5"}) {
         const int fd = open((t.a + f).c_str(), O_CREAT | O_WRONLY | O_EXCL, 0644);
         ASSERT_GE(fd, 0) << f;
         close(fd);
       }
     },
     {"qa 0x40 d /A/p", "qa 0x40 d /A/p/q", "qa 0x40 d /A/p/q/r", "qa 0x40 d /A/p/q/r/s",
      "qa 0x40 d /A/p/q/r/s/t", "qa 0x40 f /A/p/1", "qa 0x40 f /A/p/q/2", "qa 0x40 f /A/p/q/r/3",
      "qa 0x40 f /A/p/q/r/s/4", "qa 0x40 f /A/p/q/r/s/t/5"},
     false},
    {"RemoveTree",
     [](const Tree& t) {
       WriteFile(t.b + "/t/f1", "1");
       WriteFile(t.b + "/t/u/f2", "2");
       MakeDirs(t.b + "/t/u/v");
     },
     [](const Tree& t) { Run("rm -rf '" + t.b + "/t'"); },
     {"qb 0x80 d /B/t", "qb 0x80 f /B/t/f1", "qb 0x80 d /B/t/u", "qb 0x80 f /B/t/u/f2",
      "qb 0x80 d /B/t/u/v"},
     true},
    {"RenamedFolderReportsUnderItsNewName",
     [](const Tree& t) {
       WriteFile(t.a + "/d/f", "x");
       WriteFile(t.a + "/d/sub/g", "y");
     },
     [](const Tree& t) {
       ASSERT_EQ(rename((t.a + "/d").c_str(), (t.a + "/e").c_str()), 0);
       Append(t.a + "/e/f", "more");
       WriteFile(t.a + "/e/sub/h", "");
       ASSERT_EQ(unlink((t.a + "/e/sub/g").c_str()), 0);
     },
     {"qa 0x100 d /A/e <- /A/d", "qa 0x2 f /A/e/f", "qa 0x40 f /A/e/sub/h", "qa 0x2 f /A/e/sub/h",
      "qa 0x80 f /A/e/sub/g"},
     true},
    {"FolderMovedBetweenQueuesReportsUnderItsNewName",
     [](const Tree& t) { WriteFile(t.a + "/d/sub/f", "x"); },
     [](const Tree& t) {
       ASSERT_EQ(rename((t.a + "/d").c_str(), (t.b + "/d").c_str()), 0);
       Append(t.b + "/d/sub/f", "more");
     },
     {"qa 0x80 d /A/d", "qb 0x40 d /B/d", "qb 0x2 f /B/d/sub/f"},
     true},
};

INSTANTIATE_TEST_SUITE_P(Kernel, WatcherCaseTest, ::testing::ValuesIn(kCases),
                         [](const auto& info) { return std::string(info.param.name); });

// A folder renamed twice, the second time after the first was taken, and a
// change made in it after each: the watch paths follow every rename.
TEST(InotifyWatcherTest, WatchPathsFollowSuccessiveRenames) {
  TempRoot tmp;
  const std::string a = tmp.Path("/A");
  WriteFile(a + "/d/sub/f", "x");
  WatchHarness h;
  h.Watch(a, "qa");
  ASSERT_TRUE(h.Settle());
  ASSERT_EQ(rename((a + "/d").c_str(), (a + "/e").c_str()), 0);
  ASSERT_TRUE(h.Settle());
  ASSERT_EQ(rename((a + "/e/sub").c_str(), (a + "/e/s2").c_str()), 0);
  ASSERT_TRUE(h.Settle());
  h.Clear();
  Append(a + "/e/s2/f", "y");
  ASSERT_TRUE(h.Settle(60));
  ASSERT_EQ(h.lines().size(), 1u);
  EXPECT_EQ(h.lines()[0].event, 0x2u);
  EXPECT_EQ(h.lines()[0].path, a + "/e/s2/f");
}

// A folder moved out stops being watched: what changes in it afterwards,
// out of the watched tree, makes no line.
TEST(InotifyWatcherTest, FolderMovedOutIsForgotten) {
  TempRoot tmp;
  const std::string a = tmp.Path("/A"), out = tmp.Path("/out");
  WriteFile(a + "/d/f", "x");
  MakeDirs(out);
  WatchHarness h;
  h.Watch(a, "qa");
  ASSERT_TRUE(h.Settle());
  ASSERT_EQ(rename((a + "/d").c_str(), (out + "/d").c_str()), 0);
  ASSERT_TRUE(h.Settle(60));
  const uint64_t watches = h.watcher().stats().watches;
  EXPECT_EQ(watches, 1u);  // the root alone
  h.Clear();
  Append(out + "/d/f", "y");
  WriteFile(out + "/d/g", "z");
  ASSERT_TRUE(h.Settle(60));
  EXPECT_TRUE(h.lines().empty()) << h.lines()[0].path;
}

}  // namespace
}  // namespace vellis::monitord
