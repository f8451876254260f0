#include "common/fs_util.h"

#include <sys/stat.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <string>

#include "common/error.h"
#include "sdk/credentials.h"
#include "tests/support/fake_platform.h"
#include "tests/support/temp_root.h"

namespace vellis {
namespace {

using testing::FakePlatform;
using testing::ReadFile;
using testing::ScopedPlatform;
using testing::TempRoot;
using testing::WriteFile;

TEST(PathStringTest, SplitsPathsAtTheLastSlash) {
  struct Case {
    std::string path, base, dir;
  } cases[] = {
      {"a/b/", "", "a/b"},  {"name", "name", "name"}, {"/a", "a", ""},
      {"/x/y.txt", "y.txt", "/x"}, {"", "", ""},   {"/", "", ""},
      {"a//b", "b", "a/"},
  };
  for (const auto& c : cases) {
    EXPECT_EQ(Basename(c.path), c.base) << c.path;
    EXPECT_EQ(Dirname(c.path), c.dir) << c.path;
  }
}

TEST(PathStringTest, ExtensionOfTheBasename) {
  struct Case {
    std::string path;
    bool lower;
    std::string ext;
  } cases[] = {
      {"/x/archive.TAR.GZ", true, "gz"}, {"/x/archive.TAR.GZ", false, "GZ"},
      {"/x.d/readme", true, ""},          {".profile", false, "profile"},
      {"/a/b.", false, ""},               {"/a/dir.d/", false, ""},
      {"name.\xc3\x89X", true, "\xc3\x89x"},
  };
  for (const auto& c : cases) EXPECT_EQ(GetFileExtension(c.path, c.lower), c.ext) << c.path;
}

TEST(PathStringTest, StringStartWith) {
  struct Case {
    std::string s, prefix;
    bool expected;
  } cases[] = {
      {"", "", true},           {"abc", "", true},           {"abc", "abc", true},
      {"abc", "abcd", false},   {"/music2", "/music", true}, {"/volume1", "/volume10", false},
      {"abc", "b", false},
  };
  for (const auto& c : cases) {
    EXPECT_EQ(StringStartWith(c.s, c.prefix), c.expected) << c.s << " / " << c.prefix;
  }
}

class FsUtilTest : public ::testing::Test {
 protected:
  void SetUp() override {
    WriteFile(file_, "content");
    testing::MakeDirs(dir_);
    ASSERT_EQ(symlink(file_.c_str(), Path("/link-file").c_str()), 0);
    ASSERT_EQ(symlink(dir_.c_str(), Path("/link-dir").c_str()), 0);
    ASSERT_EQ(symlink(Path("/link-dir").c_str(), Path("/link-link-dir").c_str()), 0);
    ASSERT_EQ(symlink(Path("/loop-b").c_str(), Path("/loop-a").c_str()), 0);
    ASSERT_EQ(symlink(Path("/loop-a").c_str(), Path("/loop-b").c_str()), 0);
    ASSERT_EQ(mkfifo(Path("/fifo").c_str(), 0644), 0);
  }
  std::string Path(const std::string& rel) const { return root_.Path("/t" + rel); }

  TempRoot root_;
  std::string file_ = Path("/file");
  std::string dir_ = Path("/dir");
};

TEST_F(FsUtilTest, ClassifiesEntriesWithoutFollowingLinksUnlessAsked) {
  struct Case {
    std::string rel;
    bool file, dir, dir_followed;
  } cases[] = {
      {"/file", true, false, false},          {"/dir", false, true, true},
      {"/link-file", false, false, false},    {"/link-dir", false, false, true},
      {"/link-link-dir", false, false, true}, {"/loop-a", false, false, false},
      {"/fifo", false, false, false},         {"/missing", false, false, false},
  };
  for (const auto& c : cases) {
    EXPECT_EQ(IsFileExist(Path(c.rel)), c.file) << c.rel;
    EXPECT_EQ(IsDirExist(Path(c.rel), false), c.dir) << c.rel;
    EXPECT_EQ(IsDirExist(Path(c.rel), true), c.dir_followed) << c.rel;
  }
}

TEST_F(FsUtilTest, UnlinkAndRealPath) {
  EXPECT_TRUE(Unlink(Path("/missing")));
  EXPECT_TRUE(Unlink(Path("/link-file")));
  EXPECT_EQ(ReadFile(file_), "content") << "unlinking a link removed its target";
  EXPECT_FALSE(Unlink(dir_));
  EXPECT_TRUE(IsDirExist(dir_, false));
  EXPECT_EQ(RealPath(Path("/link-link-dir")), RealPath(dir_));
  EXPECT_EQ(RealPath(Path("/loop-a")), "");
}

TEST_F(FsUtilTest, MoveAndCopyReplaceTheDestination) {
  const std::string dest = dir_ + "/dest";
  WriteFile(dest, "older and longer");
  ASSERT_TRUE(CPFile(file_, dest));
  EXPECT_EQ(ReadFile(dest), "content");
  EXPECT_EQ(ReadFile(file_), "content");
  WriteFile(file_, "moved");
  ASSERT_TRUE(MVFile(file_, dest));
  EXPECT_EQ(ReadFile(dest), "moved");
  EXPECT_FALSE(IsFileExist(file_));
  EXPECT_FALSE(CPFile(Path("/missing"), dest));
}

// Answers the user and file-system calls from a script.
class ScriptedPlatform : public FakePlatform {
 public:
  int QORUUserGet(const std::string& name, sdk::UserInfo* out) override {
    asked_user = name;
    if (user_result == 0) *out = user;
    return user_result;
  }
  int QORUACLPermGet(const std::string&, int* perm) override {
    *perm = granted;
    return acl_result;
  }
  int QORUFSDirIsMntPoint(const std::string&) override { return mount_result; }

  int user_result = -1;
  sdk::UserInfo user;
  std::string asked_user;
  int acl_result = 0;
  int granted = 0;
  int mount_result = 0;
};

TEST_F(FsUtilTest, ChownVellisThrowsWhenTheServiceUserIsUnknown) {
  ScriptedPlatform platform;
  ScopedPlatform scoped(&platform);
  try {
    ChownVellis(file_);
    ADD_FAILURE() << "no error for an unknown service user";
  } catch (const Error& e) {
    EXPECT_EQ(e.GetCode(), kErrServiceUser);
  }
  EXPECT_EQ(platform.asked_user, "Vellis");
  EXPECT_TRUE(sdk::SDKMutex().TryLock()) << "the SDK mutex stayed held after the error";
  sdk::SDKMutex().Unlock();
}

TEST_F(FsUtilTest, ChownVellisGivesTheFileToTheServiceUser) {
  ScriptedPlatform platform;
  ScopedPlatform scoped(&platform);
  // Without the right to give files away, give the file to ourselves.
  const bool privileged = geteuid() == 0;
  platform.user_result = 0;
  platform.user.uid = privileged ? 4321 : geteuid();
  platform.user.gid = privileged ? 8765 : getegid();
  ASSERT_TRUE(ChownVellis(file_));
  struct stat st;
  ASSERT_EQ(lstat(file_.c_str(), &st), 0);
  EXPECT_EQ(st.st_uid, platform.user.uid);
  EXPECT_EQ(st.st_gid, platform.user.gid);
  EXPECT_FALSE(ChownVellis(Path("/missing")));
}

TEST_F(FsUtilTest, PermissionAndMountAnswersOfThePlatform) {
  ScriptedPlatform platform;
  ScopedPlatform scoped(&platform);
  struct Case {
    int acl_result, granted, wanted;
    bool allowed;
  } acl[] = {
      {0, sdk::kAclWrite, sdk::kAclRead | sdk::kAclWrite, true},
      {0, sdk::kAclRead, sdk::kAclWrite, false},
      {0, 0, sdk::kAclRead, false},
      {-1, sdk::kAclRead, sdk::kAclRead, false},
  };
  for (const auto& c : acl) {
    platform.acl_result = c.acl_result;
    platform.granted = c.granted;
    EXPECT_EQ(CheckACLPerm(file_, c.wanted), c.allowed)
        << "result=" << c.acl_result << " granted=" << c.granted << " wanted=" << c.wanted;
  }
  for (int result : {1, 0, -1}) {
    platform.mount_result = result;
    EXPECT_EQ(IsMountPoint(dir_), result == 1) << "platform answered " << result;
  }
}

}  // namespace
}  // namespace vellis
