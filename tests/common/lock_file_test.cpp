#include "common/lock_file.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <cstdlib>
#include <string>
#include <vector>

#include "common/error.h"
#include "common/root_path.h"
#include "tests/support/fake_platform.h"
#include "tests/support/temp_root.h"

namespace vellis {
namespace {

using testing::FakePlatform;
using testing::ScopedPlatform;
using testing::TempRoot;

// flock locks taken through two open file descriptions exclude each other,
// even inside one process: this stands in for another process's lock.
class OtherHolder {
 public:
  explicit OtherHolder(const std::string& path) : fd_(open(path.c_str(), O_RDONLY | O_CREAT, 0644)) {}
  ~OtherHolder() {
    if (fd_ >= 0) close(fd_);
  }
  bool TryLock(int op) { return fd_ >= 0 && flock(fd_, op | LOCK_NB) == 0; }
  void Unlock() { flock(fd_, LOCK_UN); }

 private:
  int fd_;
};

std::string LinkTarget(const std::string& link) {
  char buf[4096];
  ssize_t n = readlink(link.c_str(), buf, sizeof(buf));
  return n > 0 ? std::string(buf, static_cast<size_t>(n)) : std::string();
}

// The descriptors of this process that refer to `path`.
std::vector<int> DescriptorsOf(const std::string& path) {
  std::vector<int> fds;
  DIR* d = opendir("/proc/self/fd");
  if (d == nullptr) return fds;
  while (dirent* e = readdir(d)) {
    if (e->d_name[0] == '.') continue;
    if (LinkTarget(std::string("/proc/self/fd/") + e->d_name) == path) fds.push_back(atoi(e->d_name));
  }
  closedir(d);
  return fds;
}

// The reason of the Error 506 thrown by LockFile, or "" when it locked.
std::string LockFailure(const std::string& path, bool exclusive) {
  try {
    LockFile lock(path, exclusive);
  } catch (const Error& e) {
    EXPECT_EQ(e.GetCode(), kErrLock) << path;
    return e.what();
  }
  return "";
}

class LockFileTest : public ::testing::Test {
 protected:
  TempRoot root_;
  FakePlatform platform_;
  ScopedPlatform scoped_{&platform_};
  std::string path_ = RootPath(kFolderCfgLockPath);
};

TEST_F(LockFileTest, CreatesAMissingFileHoldsItAndKeepsItAfterRelease) {
  const mode_t old_mask = umask(0);
  {
    LockFile lock(path_, true);
    umask(old_mask);
    OtherHolder other(path_);
    EXPECT_FALSE(other.TryLock(LOCK_SH)) << "the lock was not held";
  }
  struct stat st;
  ASSERT_EQ(lstat(path_.c_str(), &st), 0);
  EXPECT_TRUE(S_ISREG(st.st_mode));
  EXPECT_EQ(st.st_mode & 07777, 0644u);
  EXPECT_TRUE(platform_.USleeps().empty());
  OtherHolder other(path_);
  EXPECT_TRUE(other.TryLock(LOCK_EX)) << "the lock outlived its LockFile";
}

TEST_F(LockFileTest, SharedAndExclusiveModesCombine) {
  struct Case {
    int held;
    bool exclusive;
    bool locks;
  } cases[] = {
      {LOCK_SH, false, true},
      {LOCK_SH, true, false},
      {LOCK_EX, false, false},
      {LOCK_EX, true, false},
  };
  for (const auto& c : cases) {
    OtherHolder other(path_);
    ASSERT_TRUE(other.TryLock(c.held));
    platform_.SetRandValues({3});
    const std::string failure = LockFailure(path_, c.exclusive);
    const std::string context =
        std::string(c.held == LOCK_SH ? "held shared" : "held exclusive") +
        (c.exclusive ? ", exclusive wanted" : ", shared wanted");
    EXPECT_EQ(failure.empty(), c.locks) << context << ": " << failure;
  }
}

TEST_F(LockFileTest, GivesUpAfter64BusyAttempts) {
  OtherHolder other(path_);
  ASSERT_TRUE(other.TryLock(LOCK_EX));
  platform_.SetRandValues({0, 9, 10, 25, 7, 2147483647});
  const size_t fds_before = DescriptorsOf(path_).size();
  EXPECT_EQ(LockFailure(path_, true), "Exceed max retry, path=" + path_);
  const auto sleeps = platform_.USleeps();
  ASSERT_EQ(sleeps.size(), 64u);
  for (uint64_t us : sleeps) {
    EXPECT_EQ(us % 100000, 0u) << us;
    EXPECT_LT(us, 1000000u);
  }
  EXPECT_EQ(DescriptorsOf(path_).size(), fds_before) << "a failed attempt leaked its descriptor";
}

TEST_F(LockFileTest, MissingFolderFailsAtOnce) {
  const std::string path = root_.Path("/missing/x.lock");
  EXPECT_EQ(LockFailure(path, true),
            "open failed, path=" + path + ", reason=No such file or directory");
  EXPECT_TRUE(platform_.USleeps().empty());
  EXPECT_EQ(platform_.LogsContaining("Failed [").size(), 1u);
}

TEST_F(LockFileTest, RefusesAPlantedLinkOrFifoWithoutTouchingIt) {
  const std::string target = root_.Path("/tmp/precious");
  testing::WriteFile(target, "keep me");
  ASSERT_EQ(chmod(target.c_str(), 0600), 0);
  ASSERT_EQ(symlink(target.c_str(), path_.c_str()), 0);
  const std::string dangling = root_.Path("/tmp/dangling.lock");
  ASSERT_EQ(symlink(root_.Path("/tmp/created-through-link").c_str(), dangling.c_str()), 0);
  const std::string fifo = root_.Path("/tmp/fifo.lock");
  ASSERT_EQ(mkfifo(fifo.c_str(), 0644), 0);
  for (const std::string& p : {path_, dangling, fifo}) {
    EXPECT_EQ(LockFailure(p, true).rfind("open failed, path=" + p + ", reason=", 0), 0u) << p;
  }
  EXPECT_TRUE(platform_.USleeps().empty());
  EXPECT_EQ(testing::ReadFile(target), "keep me");
  struct stat st;
  ASSERT_EQ(stat(target.c_str(), &st), 0);
  EXPECT_EQ(st.st_mode & 07777, 0600u);
  EXPECT_NE(lstat(root_.Path("/tmp/created-through-link").c_str(), &st), 0);
  OtherHolder other(target);
  EXPECT_TRUE(other.TryLock(LOCK_EX));
}

TEST_F(LockFileTest, DescriptorIsClosedOnExec) {
  LockFile lock(path_, true);
  const auto fds = DescriptorsOf(path_);
  ASSERT_EQ(fds.size(), 1u);
  const int flags = fcntl(fds[0], F_GETFD);
  ASSERT_GE(flags, 0);
  EXPECT_TRUE(flags & FD_CLOEXEC);
}

}  // namespace
}  // namespace vellis
