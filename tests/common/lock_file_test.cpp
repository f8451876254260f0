#include "common/lock_file.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <string>
#include <tuple>
#include <vector>

#include "common/root_path.h"
#include "tests/support/fake_platform.h"
#include "tests/support/temp_root.h"
#include "tests/support/thrown.h"

namespace vellis {
namespace {

// Whether a lock of kind `op` could be taken through a second open file
// description of `path` (flock locks through two of them exclude each
// other even inside one process: this stands in for another process).
bool OtherCanLock(const std::string& path, int op) {
  int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC);
  bool ok = fd >= 0 && flock(fd, op | LOCK_NB) == 0;
  if (fd >= 0) close(fd);
  return ok;
}

// The descriptors of this process that refer to `path`.
std::vector<int> DescriptorsOf(const std::string& path) {
  std::vector<int> fds;
  for (const auto& e : std::filesystem::directory_iterator("/proc/self/fd")) {
    std::error_code ec;
    if (std::filesystem::read_symlink(e.path(), ec) == path)
      fds.push_back(std::stoi(e.path().filename()));
  }
  return fds;
}

class LockFileTest : public ::testing::Test {
 protected:
  // "<code> <reason>" of the failure to lock `path`, or "no error".
  std::string Failure(const std::string& path, bool exclusive) {
    return testing::Thrown([&] { LockFile lock(path, exclusive); });
  }

  testing::TempRoot root_;
  testing::FakePlatform platform_;
  testing::ScopedPlatform scoped_{&platform_};
  std::string path_ = RootPath(kFolderCfgLockPath);
};

TEST_F(LockFileTest, CreatesAMissingFileCloseOnExecAndHoldsItUntilReleased) {
  const mode_t old_mask = umask(0);
  {
    LockFile lock(path_, true);
    umask(old_mask);
    EXPECT_FALSE(OtherCanLock(path_, LOCK_SH)) << "the lock was not held";
    const auto fds = DescriptorsOf(path_);
    ASSERT_EQ(fds.size(), 1u);
    EXPECT_TRUE(fcntl(fds[0], F_GETFD) & FD_CLOEXEC);
  }
  struct stat st;
  ASSERT_EQ(lstat(path_.c_str(), &st), 0);
  EXPECT_EQ(st.st_mode & (S_IFMT | 07777), S_IFREG | 0644u);
  EXPECT_TRUE(OtherCanLock(path_, LOCK_EX)) << "the lock outlived its LockFile";
  EXPECT_TRUE(platform_.USleeps().empty());
}

// A lock held elsewhere (shared or exclusive, by the flock kinds) and wanted
// shared or exclusively: only shared with shared combines; the rest retries
// 64 times, each after a random wait of whole tenths below a second.
TEST_F(LockFileTest, SharedLocksCombineAndEverythingElseWaitsThenGivesUp) {
  const std::tuple<int, bool, bool> cases[] = {{LOCK_SH, false, true},
                                               {LOCK_SH, true, false},
                                               {LOCK_EX, false, false},
                                               {LOCK_EX, true, false}};
  for (const auto& [held, exclusive, locks] : cases) {
    int other = open(path_.c_str(), O_RDONLY | O_CREAT | O_CLOEXEC, 0644);
    ASSERT_EQ(flock(other, held | LOCK_NB), 0);
    platform_.SetRandValues({0, 9, 10, 25, 7, 2147483647});
    const size_t sleeps_before = platform_.USleeps().size();
    const std::string context =
        "held " + std::to_string(held) + ", exclusive wanted " + std::to_string(exclusive);
    EXPECT_EQ(Failure(path_, exclusive), locks ? "no error" : "506 Exceed max retry, path=" + path_)
        << context;
    const auto sleeps = platform_.USleeps();
    ASSERT_EQ(sleeps.size() - sleeps_before, locks ? 0u : 64u) << context;
    for (size_t i = sleeps_before; i < sleeps.size(); ++i)
      ASSERT_TRUE(sleeps[i] % 100000 == 0 && sleeps[i] < 1000000) << sleeps[i];
    EXPECT_EQ(DescriptorsOf(path_).size(), 1u) << context << ": a failed attempt leaked";
    close(other);
  }
}

TEST_F(LockFileTest, MissingFolderPlantedLinkOrFifoFailAtOnceUntouched) {
  const std::string target = root_.Path("/tmp/precious"),
                    dangling = root_.Path("/tmp/dangling.lock"),
                    fifo = root_.Path("/tmp/fifo.lock"), missing = root_.Path("/missing/x.lock");
  testing::WriteFile(target, "keep me");
  ASSERT_EQ(chmod(target.c_str(), 0600), 0);
  ASSERT_EQ(symlink(target.c_str(), path_.c_str()), 0);
  ASSERT_EQ(symlink(root_.Path("/tmp/made-through-link").c_str(), dangling.c_str()), 0);
  ASSERT_EQ(mkfifo(fifo.c_str(), 0644), 0);
  EXPECT_EQ(Failure(missing, true),
            "506 open failed, path=" + missing + ", reason=No such file or directory");
  EXPECT_EQ(platform_.LogsContaining("Failed [").size(), 1u);
  for (const std::string& p : {path_, dangling, fifo})
    EXPECT_EQ(Failure(p, true).rfind("506 open failed, path=" + p + ", reason=", 0), 0u) << p;
  EXPECT_TRUE(platform_.USleeps().empty());
  EXPECT_EQ(testing::ReadFile(target), "keep me");
  struct stat st;
  ASSERT_EQ(stat(target.c_str(), &st), 0);
  EXPECT_EQ(st.st_mode & 07777, 0600u);
  EXPECT_NE(lstat(root_.Path("/tmp/made-through-link").c_str(), &st), 0);
  EXPECT_TRUE(OtherCanLock(target, LOCK_EX));
}

}  // namespace
}  // namespace vellis
