#include "common/fs_util.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>

#include "sdk/credentials.h"
#include "tests/support/fake_platform.h"
#include "tests/support/temp_root.h"
#include "tests/support/thrown.h"

namespace vellis {
namespace {

using testing::ReadFile;
using testing::WriteFile;

TEST(PathStringTest, SplitsAtTheLastSlashAndDotAndMatchesWholePrefixes) {
  struct Case {
    std::string path, expected;  // "base|dir|lowered extension"
  } cases[] = {{"a/b/", "|a/b|"},
               {"name", "name|name|"},
               {"/a", "a||"},
               {"/x.d/archive.TAR.Gz", "archive.TAR.Gz|/x.d|gz"},
               {".profile", ".profile|.profile|profile"}};
  for (const auto& c : cases) {
    EXPECT_EQ(Basename(c.path) + "|" + Dirname(c.path) + "|" + GetFileExtension(c.path, true),
              c.expected);
  }
  EXPECT_EQ(GetFileExtension("/x/archive.TAR.GZ", false), "GZ");
  EXPECT_TRUE(StringStartWith("/music2", "/music") && StringStartWith("abc", ""));
  EXPECT_FALSE(StringStartWith("/volume1", "/volume10") || StringStartWith("abc", "b"));
}

// Answers the user, permission and mount queries from a script.
class ScriptedPlatform : public testing::FakePlatform {
 public:
  int QORUUserGet(const std::string& name, sdk::UserInfo* out) override {
    asked_user = name;
    *out = user;
    return user_result;
  }
  int QORUACLPermGet(const std::string&, int* perm) override {
    *perm = granted;
    return acl_result;
  }
  int QORUFSDirIsMntPoint(const std::string&) override { return mount_result; }

  int user_result = -1, acl_result = 0, granted = 0, mount_result = 0;
  sdk::UserInfo user;
  std::string asked_user;
};

class FsUtilTest : public ::testing::Test {
 protected:
  std::string Path(const std::string& rel) const { return root_.Path("/t" + rel); }

  testing::TempRoot root_;
  std::string file_ = Path("/file"), dir_ = Path("/dir");
  ScriptedPlatform platform_;
  testing::ScopedPlatform scoped_{&platform_};
};

TEST_F(FsUtilTest, ClassifiesEntriesWithoutFollowingLinksUnlessAsked) {
  WriteFile(file_, "content");
  testing::MakeDirs(dir_);
  const std::pair<std::string, const char*> links[] = {{file_, "/link-file"},
                                                       {dir_, "/link-dir"},
                                                       {Path("/link-dir"), "/link-link-dir"},
                                                       {Path("/loop-b"), "/loop-a"},
                                                       {Path("/loop-a"), "/loop-b"}};
  for (const auto& [target, link] : links)
    ASSERT_EQ(symlink(target.c_str(), Path(link).c_str()), 0);
  ASSERT_EQ(mkfifo(Path("/fifo").c_str(), 0644), 0);
  struct Case {
    std::string rel;
    bool file, dir, dir_followed;
  } cases[] = {{"/file", true, false, false},          {"/dir", false, true, true},
               {"/link-file", false, false, false},    {"/link-dir", false, false, true},
               {"/link-link-dir", false, false, true}, {"/loop-a", false, false, false},
               {"/fifo", false, false, false},         {"/missing", false, false, false}};
  for (const auto& c : cases) {
    EXPECT_EQ(IsFileExist(Path(c.rel)), c.file) << c.rel;
    EXPECT_EQ(IsDirExist(Path(c.rel), false), c.dir) << c.rel;
    EXPECT_EQ(IsDirExist(Path(c.rel), true), c.dir_followed) << c.rel;
  }
  EXPECT_EQ(RealPath(Path("/link-link-dir")), RealPath(dir_));
  EXPECT_EQ(RealPath(Path("/loop-a")), "");
}

TEST_F(FsUtilTest, UnlinkMoveAndCopyReplaceOnlyTheirTarget) {
  const std::string dest = dir_ + "/dest";
  WriteFile(file_, "content");
  WriteFile(dest, "older and longer");
  ASSERT_EQ(symlink(file_.c_str(), Path("/link").c_str()), 0);
  EXPECT_TRUE(Unlink(Path("/link")) && Unlink(Path("/missing")));
  EXPECT_FALSE(Unlink(dir_));
  ASSERT_TRUE(CPFile(file_, dest));
  EXPECT_EQ(ReadFile(dest) + "|" + ReadFile(file_), "content|content");
  WriteFile(file_, "moved");
  ASSERT_TRUE(MVFile(file_, dest));
  EXPECT_EQ(ReadFile(dest) + "|" + ReadFile(file_), "moved|");
  EXPECT_FALSE(CPFile(Path("/missing"), dest));
}

TEST_F(FsUtilTest, ChownVellisGivesTheFileToTheServiceUser) {
  WriteFile(file_, "content");
  EXPECT_EQ(testing::Thrown([&] { ChownVellis(file_); }), "801 QORUUserGet failed, user=Vellis");
  EXPECT_EQ(platform_.asked_user, "Vellis");
  ASSERT_TRUE(sdk::SDKMutex().TryLock()) << "the SDK mutex stayed held after the error";
  sdk::SDKMutex().Unlock();
  // Without the right to give files away, give the file to ourselves.
  const bool privileged = geteuid() == 0;
  platform_.user_result = 0;
  platform_.user.uid = privileged ? 4321 : geteuid();
  platform_.user.gid = privileged ? 8765 : getegid();
  ASSERT_TRUE(ChownVellis(file_));
  struct stat st;
  ASSERT_EQ(lstat(file_.c_str(), &st), 0);
  EXPECT_EQ(st.st_uid, platform_.user.uid);
  EXPECT_EQ(st.st_gid, platform_.user.gid);
  EXPECT_FALSE(ChownVellis(Path("/missing")));
}

// Any granted bit will do; a platform that cannot say grants nothing, and
// only a definite answer makes a mount point.
TEST_F(FsUtilTest, PermissionAndMountAnswersOfThePlatform) {
  platform_.granted = sdk::kAclWrite;
  EXPECT_TRUE(CheckACLPerm(file_, sdk::kAclRead | sdk::kAclWrite));
  EXPECT_FALSE(CheckACLPerm(file_, sdk::kAclRead));
  platform_.acl_result = -1;
  EXPECT_FALSE(CheckACLPerm(file_, sdk::kAclWrite));
  for (int result : {1, 0, -1}) {
    platform_.mount_result = result;
    EXPECT_EQ(IsMountPoint(dir_), result == 1) << "platform answered " << result;
  }
}

}  // namespace
}  // namespace vellis
