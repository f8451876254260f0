#include "daemons/monitord/fanotify_watcher.h"

#include <errno.h>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <limits.h>
#include <poll.h>
#include <stdlib.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <cstring>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "tests/support/temp_root.h"

namespace vellis::monitord {
namespace {

// A fresh folder under `base` holding the roots a/ and b/ and, beside them,
// out/ and a2/ (a name that begins like a root's), removed afterwards.
class Tree {
 public:
  explicit Tree(const std::string& base) {
    std::string pattern = base + "/monitord-fan-XXXXXX";
    if (mkdtemp(pattern.data()) == nullptr) return;
    char real[PATH_MAX];
    if (realpath(pattern.c_str(), real) == nullptr) return;
    path_ = real;
    for (const char* dir : {"/a", "/b", "/out", "/a2"}) mkdir((path_ + dir).c_str(), 0755);
  }
  ~Tree() {
    if (!path_.empty()) system(("rm -rf '" + path_ + "'").c_str());
  }
  bool ok() const { return !path_.empty(); }
  const std::string& path() const { return path_; }
  std::string operator/(const std::string& rel) const { return path_ + "/" + rel; }

 private:
  std::string path_;
};

void Touch(const std::string& path) {
  int fd = open(path.c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0644);
  ASSERT_GE(fd, 0) << path << ": " << strerror(errno);
  close(fd);
}
void Append(const std::string& path) {
  int fd = open(path.c_str(), O_WRONLY | O_APPEND | O_CLOEXEC);
  ASSERT_GE(fd, 0) << path << ": " << strerror(errno);
  ASSERT_EQ(write(fd, "x", 1), 1);
  close(fd);
}
void Check(int rc, const std::string& what) { ASSERT_EQ(rc, 0) << what << ": " << strerror(errno); }

const char* KindName(FsEventKind kind) {
  switch (kind) {
    case FsEventKind::kCreate:
      return "create";
    case FsEventKind::kModify:
      return "modify";
    case FsEventKind::kCloseWrite:
      return "close_write";
    case FsEventKind::kAttrib:
      return "attrib";
    case FsEventKind::kDelete:
      return "delete";
    case FsEventKind::kMovedFrom:
      return "moved_from";
    case FsEventKind::kMovedTo:
      return "moved_to";
    case FsEventKind::kOverflow:
      return "overflow";
  }
  return "?";
}

// What is queued once something came or `first_ms` passed. The kernel
// queues events as the calls make the changes, so everything the test did is
// there by then; the descriptor alone tells nothing, since every change on
// the file system wakes it, under the roots or not.
std::vector<FsEvent> Collect(Watcher* w, int first_ms = 500) {
  using Clock = std::chrono::steady_clock;
  std::vector<FsEvent> got;
  const auto until = Clock::now() + std::chrono::milliseconds(first_ms);
  for (;;) {
    w->Read(&got);
    auto wait = std::chrono::duration_cast<std::chrono::milliseconds>(until - Clock::now());
    if (!got.empty() || wait.count() <= 0) break;
    struct pollfd p = {w->fd(), POLLIN, 0};
    poll(&p, 1, static_cast<int>(wait.count()));
  }
  usleep(20 * 1000);
  w->Read(&got);
  return got;
}

// "kind rel/path" ("/" after a folder), paths relative to `tree`.
std::vector<std::string> Describe(const std::vector<FsEvent>& events, const std::string& tree) {
  std::vector<std::string> lines;
  for (const FsEvent& e : events) {
    std::string path = e.path;
    if (path.compare(0, tree.size() + 1, tree + "/") == 0) path = path.substr(tree.size() + 1);
    lines.push_back(std::string(KindName(e.kind)) + " " + path + (e.is_dir ? "/" : ""));
  }
  return lines;
}

// The file systems the temporary folders may live on; the tests run on each
// one that takes the mark (here: ext4 under /tmp and /var/tmp, tmpfs at
// /dev/shm).
std::vector<std::string> Bases() {
  std::vector<std::string> bases;
  const char* tmpdir = getenv("TMPDIR");
  if (tmpdir != nullptr && *tmpdir != '\0') bases.push_back(tmpdir);
  for (const char* b : {"/tmp", "/var/tmp", "/dev/shm"}) bases.push_back(b);
  return bases;
}

struct Case {
  const char* name;
  bool before_mark;  // setup runs before AddTree (its folders never seen created)
  std::function<void(const Tree&)> setup;
  std::function<void(const Tree&)> action;
  std::vector<std::string> expected;
};

const std::vector<Case>& Cases() {
  static const std::vector<Case> cases = {
      {"create file",
       false,
       nullptr,
       [](const Tree& t) { Touch(t / "a/f"); },
       {"create a/f", "close_write a/f"}},
      {"write and close",
       false,
       [](const Tree& t) { Touch(t / "a/f"); },
       [](const Tree& t) { Append(t / "a/f"); },
       {"modify a/f", "close_write a/f"}},
      {"chmod file",
       false,
       [](const Tree& t) { Touch(t / "a/f"); },
       [](const Tree& t) { Check(chmod((t / "a/f").c_str(), 0600), "chmod"); },
       {"attrib a/f"}},
      {"chmod folder",
       false,
       [](const Tree& t) { Check(mkdir((t / "a/d").c_str(), 0755), "mkdir"); },
       [](const Tree& t) { Check(chmod((t / "a/d").c_str(), 0700), "chmod"); },
       {"attrib a/d/"}},
      {"delete",
       true,
       [](const Tree& t) { Touch(t / "a/f"); },
       [](const Tree& t) { Check(unlink((t / "a/f").c_str()), "unlink"); },
       {"delete a/f"}},
      {"rename in place",
       false,
       [](const Tree& t) { Touch(t / "a/f"); },
       [](const Tree& t) { Check(rename((t / "a/f").c_str(), (t / "a/g").c_str()), "rename"); },
       {"moved_from a/f", "moved_to a/g"}},
      {"move between roots",
       true,
       [](const Tree& t) { Check(mkdir((t / "a/d").c_str(), 0755), "mkdir"); },
       [](const Tree& t) { Check(rename((t / "a/d").c_str(), (t / "b/d").c_str()), "rename"); },
       {"moved_from a/d/", "moved_to b/d/"}},
      {"move out of a root",
       false,
       [](const Tree& t) { Touch(t / "a/f"); },
       [](const Tree& t) { Check(rename((t / "a/f").c_str(), (t / "out/f").c_str()), "rename"); },
       {"moved_from a/f"}},
      {"move into a root",
       false,
       [](const Tree& t) { Touch(t / "out/f"); },
       [](const Tree& t) { Check(rename((t / "out/f").c_str(), (t / "a/f").c_str()), "rename"); },
       {"moved_to a/f"}},
      {"outside the roots",
       false,
       nullptr,
       [](const Tree& t) {
         Touch(t / "out/f");
         Touch(t / "a2/f");
         Check(rename((t / "a2/f").c_str(), (t / "out/g").c_str()), "rename");
         Check(unlink((t / "out/g").c_str()), "unlink");
       },
       {}},
      {"deep folders then files",
       false,
       nullptr,
       [](const Tree& t) {
         testing::MakeDirs(t / "a/x/y/z");
         Touch(t / "a/x/y/z/f");
         Touch(t / "a/x/g");
       },
       {"create a/x/", "create a/x/y/", "create a/x/y/z/", "create a/x/y/z/f",
        "close_write a/x/y/z/f", "create a/x/g", "close_write a/x/g"}},
      // The folder's later name is not known yet when its earlier events are
      // read: they keep the name of their moment.
      {"folder renamed after its events",
       false,
       nullptr,
       [](const Tree& t) {
         Check(mkdir((t / "a/d").c_str(), 0755), "mkdir");
         Touch(t / "a/d/f");
         Check(rename((t / "a/d").c_str(), (t / "a/e").c_str()), "rename");
         Touch(t / "a/e/g");
       },
       {"create a/d/", "create a/d/f", "close_write a/d/f", "moved_from a/d/", "moved_to a/e/",
        "create a/e/g", "close_write a/e/g"}},
      {"remove a tree seen created",
       false,
       [](const Tree& t) { testing::WriteFile(t / "a/t/u/f", ""); },
       [](const Tree& t) { Check(system(("rm -rf '" + (t / "a/t") + "'").c_str()), "rm -rf"); },
       {"delete a/t/u/f", "delete a/t/u/", "delete a/t/"}},
      // Its inner folders are gone before they could be looked up: the top
      // folder's deletion stands for everything below.
      {"remove a tree older than the mark",
       true,
       [](const Tree& t) { testing::WriteFile(t / "a/t/u/f", ""); },
       [](const Tree& t) { Check(system(("rm -rf '" + (t / "a/t") + "'").c_str()), "rm -rf"); },
       {"delete a/t/"}},
  };
  return cases;
}

std::unique_ptr<FanotifyWatcher> MakeWatcher(std::string* why) {
  return FanotifyWatcher::Create(why);
}

TEST(FanotifyWatcherTest, ReportsChangesUnderTheRootsOnly) {
  std::string why;
  if (!MakeWatcher(&why)) GTEST_SKIP() << "no fanotify here: " << why;
  int file_systems = 0;
  for (const std::string& base : Bases()) {
    bool marked = false;
    for (const Case& c : Cases()) {
      SCOPED_TRACE(base + ": " + c.name);
      Tree tree(base);
      if (!tree.ok()) break;
      auto w = MakeWatcher(&why);
      ASSERT_NE(w, nullptr) << why;
      if (c.before_mark && c.setup) c.setup(tree);
      if (!w->AddTree(tree / "a")) {
        EXPECT_NE(errno, 0);
        break;  // this file system refuses the mark
      }
      marked = true;
      ASSERT_TRUE(w->AddTree(tree / "b")) << strerror(errno);
      if (!c.before_mark && c.setup) c.setup(tree);
      Collect(w.get(), 100);
      c.action(tree);
      std::vector<FsEvent> got = Collect(w.get());
      EXPECT_EQ(Describe(got, tree.path()), c.expected);
      // The halves of a rename share a cookie that no other rename has.
      uint32_t last_cookie = 0;
      for (size_t i = 0; i < got.size(); ++i) {
        bool from = got[i].kind == FsEventKind::kMovedFrom;
        bool to = got[i].kind == FsEventKind::kMovedTo;
        if (!from && !to) {
          EXPECT_EQ(got[i].cookie, 0u) << got[i].path;
          continue;
        }
        EXPECT_NE(got[i].cookie, 0u) << got[i].path;
        EXPECT_NE(got[i].cookie, last_cookie) << got[i].path;
        if (from && i + 1 < got.size() && got[i + 1].kind == FsEventKind::kMovedTo) {
          EXPECT_EQ(got[i + 1].cookie, got[i].cookie) << got[i].path;
          ++i;
        }
        last_cookie = got[i].cookie;
      }
    }
    if (marked) {
      ++file_systems;
      std::printf("[   INFO   ] %s takes the file-system mark\n", base.c_str());
    } else {
      std::printf("[   INFO   ] %s refuses the file-system mark\n", base.c_str());
    }
  }
  if (file_systems == 0) GTEST_SKIP() << "no file system here takes a file-system mark";
}

// A usable root on a file system that takes the mark, or "" (and why).
std::string MarkableBase(std::string* why) {
  for (const std::string& base : Bases()) {
    Tree probe(base);
    auto w = MakeWatcher(why);
    if (!w) return "";
    if (probe.ok() && w->AddTree(probe / "a")) return base;
    *why = base + ": " + strerror(errno);
  }
  return "";
}

TEST(FanotifyWatcherTest, OneMarkPerFileSystemUntilItsLastRootGoes) {
  std::string why;
  std::string base = MarkableBase(&why);
  if (base.empty()) GTEST_SKIP() << why;
  Tree tree(base);
  auto w = MakeWatcher(&why);
  ASSERT_NE(w, nullptr) << why;
  EXPECT_EQ(w->stats().watches, 0u);
  ASSERT_TRUE(w->AddTree(tree / "a")) << strerror(errno);
  ASSERT_TRUE(w->AddTree(tree / "b")) << strerror(errno);
  ASSERT_TRUE(w->AddTree(tree / "a")) << strerror(errno);  // again: nothing new
  EXPECT_EQ(w->stats().watches, 1u);
  EXPECT_EQ(w->stats().watch_limit, 0u);

  w->RemoveTree(tree / "a");
  EXPECT_EQ(w->stats().watches, 1u);
  Touch(tree / "a/f");
  Touch(tree / "b/f");
  EXPECT_EQ(Describe(Collect(w.get()), tree.path()),
            (std::vector<std::string>{"create b/f", "close_write b/f"}));

  Check(mkdir((tree / "b/d").c_str(), 0755), "mkdir");
  Touch(tree / "b/d/x");
  EXPECT_EQ(Describe(Collect(w.get()), tree.path()),
            (std::vector<std::string>{"create b/d/", "create b/d/x", "close_write b/d/x"}));

  w->RemoveTree(tree / "b");
  EXPECT_EQ(w->stats().watches, 0u);
  Touch(tree / "b/g");
  EXPECT_EQ(Describe(Collect(w.get()), tree.path()), std::vector<std::string>{});

  // Marked again: what was learnt of b/d before the unmark is not trusted,
  // since it was renamed unseen.
  Check(rename((tree / "b/d").c_str(), (tree / "b/e").c_str()), "rename");
  ASSERT_TRUE(w->AddTree(tree / "b")) << strerror(errno);
  EXPECT_EQ(w->stats().watches, 1u);
  Touch(tree / "b/e/y");
  EXPECT_EQ(Describe(Collect(w.get()), tree.path()),
            (std::vector<std::string>{"create b/e/y", "close_write b/e/y"}));
}

TEST(FanotifyWatcherTest, TheRootItselfIsUnderTheRoot) {
  std::string why;
  std::string base = MarkableBase(&why);
  if (base.empty()) GTEST_SKIP() << why;
  Tree tree(base);
  auto w = MakeWatcher(&why);
  ASSERT_NE(w, nullptr) << why;
  ASSERT_TRUE(w->AddTree(tree / "a")) << strerror(errno);
  Check(chmod((tree / "a").c_str(), 0700), "chmod");
  Check(rename((tree / "a").c_str(), (tree / "c").c_str()), "rename");
  EXPECT_EQ(Describe(Collect(w.get()), tree.path()),
            (std::vector<std::string>{"attrib a/", "moved_from a/"}));
}

TEST(FanotifyWatcherTest, AddTreeFailsWithErrno) {
  std::string why;
  auto w = MakeWatcher(&why);
  if (!w) GTEST_SKIP() << "no fanotify here: " << why;
  const struct {
    const char* root;
    int error;
  } cases[] = {
      {"/nonexistent-monitord-root", ENOENT},
      {"/proc", EOPNOTSUPP},  // no file handles
      {"/etc/hostname", ENOTDIR},
  };
  for (const auto& c : cases) {
    errno = 0;
    EXPECT_FALSE(w->AddTree(c.root)) << c.root;
    EXPECT_EQ(errno, c.error) << c.root << ": " << strerror(errno);
  }
  EXPECT_EQ(w->stats().watches, 0u);
}

TEST(FolderPathCacheTest, FollowsRenamesAndDeletions) {
  FolderPathCache cache(100);
  cache.Put("k-a", "/r/a");
  cache.Put("k-ab", "/r/a/b");
  cache.Put("k-abc", "/r/a/b/c");
  cache.Put("k-a2", "/r/a2");  // begins like /r/a, is not below it
  cache.Move("/r/a", "/r/z");
  const struct {
    const char* key;
    const char* path;  // null: forgotten
  } after_move[] = {{"k-a", "/r/z"}, {"k-ab", "/r/z/b"}, {"k-abc", "/r/z/b/c"}, {"k-a2", "/r/a2"}};
  for (const auto& c : after_move) {
    const std::string* path = cache.Find(c.key);
    ASSERT_NE(path, nullptr) << c.key;
    EXPECT_EQ(*path, c.path) << c.key;
  }

  cache.ErasePath("/r/z/b");
  EXPECT_EQ(cache.Find("k-ab"), nullptr);
  EXPECT_EQ(cache.Find("k-abc"), nullptr);
  ASSERT_NE(cache.Find("k-a"), nullptr);
  EXPECT_EQ(cache.size(), 2u);

  // A rename over a folder replaces it; a new key at a known path replaces
  // the old key.
  cache.Put("k-y", "/r/y");
  cache.Move("/r/a2", "/r/y");
  EXPECT_EQ(cache.Find("k-y"), nullptr);
  EXPECT_EQ(*cache.Find("k-a2"), "/r/y");
  cache.Put("k-new", "/r/y");
  EXPECT_EQ(cache.Find("k-a2"), nullptr);
  EXPECT_EQ(*cache.Find("k-new"), "/r/y");
}

TEST(FolderPathCacheTest, KeepsTheMostRecentlyUsed) {
  FolderPathCache cache(2);
  cache.Put("k1", "/1");
  cache.Put("k2", "/2");
  ASSERT_NE(cache.Find("k1"), nullptr);  // k2 is now the oldest
  cache.Put("k3", "/3");
  EXPECT_EQ(cache.size(), 2u);
  EXPECT_NE(cache.Find("k1"), nullptr);
  EXPECT_EQ(cache.Find("k2"), nullptr);
  EXPECT_NE(cache.Find("k3"), nullptr);
  // A moved folder whose new path is already known keeps one entry.
  cache.Move("/1", "/3");
  EXPECT_EQ(cache.size(), 1u);
  EXPECT_EQ(*cache.Find("k1"), "/3");
}

TEST(FolderPathCacheTest, ForgetsOneFileSystem) {
  FolderPathCache cache(10);
  const std::string fs1(8, '\1'), fs2(8, '\2');
  cache.Put(fs1 + "h1", "/x/1");
  cache.Put(fs1 + "h2", "/x/2");
  cache.Put(fs2 + "h1", "/y/1");
  cache.EraseFileSystem(fs1);
  EXPECT_EQ(cache.size(), 1u);
  EXPECT_NE(cache.Find(fs2 + "h1"), nullptr);
  cache.Clear();
  EXPECT_EQ(cache.size(), 0u);
  EXPECT_EQ(cache.Find(fs2 + "h1"), nullptr);
}

}  // namespace
}  // namespace vellis::monitord
