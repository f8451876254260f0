// The Linux platform's own answers: file-system types, the process runner,
// free space, users and groups, and text comparison.
#include "sdk/linux/linux_platform.h"

#include <fcntl.h>
#include <grp.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <string>
#include <thread>

#include "sdk/linux/file_systems.h"
#include "sdk/linux/process.h"
#include "sdk/linux/users.h"
#include "tests/support/temp_root.h"

namespace vellis::sdk {
namespace {

class LinuxPlatformTest : public ::testing::Test {
 protected:
  LinuxPlatform platform_;
  testing::TempRoot root_;
};

TEST(FsTypeFromMagicTest, MapsMagicNumbersAndSystemTmpfs) {
  struct Case {
    uint64_t magic;
    std::string path;
    int type;
  } cases[] = {
      {0xEF53, "/volume1", kFsExt},
      {0xFFFFFFFF9123683EULL, "/volume1", kFsBtrfs},  // sign-extended f_type
      {0x01021994, "/tmp", kFsTmpfs},
      {0x01021994, "/volume1/ram", kFsTmpfs},
      {0x01021994, "/run", kFsPseudo},
      {0x01021994, "/run/user/0", kFsPseudo},
      {0x01021994, "/dev", kFsPseudo},
      {0x01021994, "/dev/shm", kFsPseudo},
      {0x01021994, "/sys/fs/cgroup", kFsPseudo},
      {0x01021994, "/running", kFsTmpfs},  // a sibling of /run, not below it
      {0x9FA0, "/proc", kFsPseudo},
      {0x62656572, "/sys", kFsPseudo},
      {0x27E0EB, "/sys/fs/cgroup/cpu", kFsPseudo},
      {0x6969, "/mnt/nfs", kFsNfs},
      {0xFE534D42, "/mnt/smb", kFsCifs},
      {0x65735546, "/mnt/sshfs", kFsFuse},
      {0x01021997, "/mnt/9p", kFs9p},
      {0x9660, "/media/cdrom", kFsIso9660},
      {0x73717368, "/snap/core", kFsSquashfs},
      {0xE0F5E1E2, "/mnt/erofs", kFsErofs},
      {0x12345678, "/mnt/odd", kFsOther},
  };
  for (const Case& c : cases) {
    EXPECT_EQ(FsTypeFromMagic(c.magic, c.path), c.type) << std::hex << c.magic << " " << c.path;
  }
}

TEST(FsTypeFromMagicTest, RemoteAndImageRangesDoNotOverlap) {
  for (int type = -1; type < 50; ++type) {
    EXPECT_FALSE(IsRemoteFsType(type) && IsImageFsType(type)) << type;
    if (type == kFsPseudo || type == kFsTmpfs || type == kFsExt) {
      EXPECT_FALSE(IsRemoteFsType(type) || IsImageFsType(type)) << type;
    }
  }
  EXPECT_TRUE(IsRemoteFsType(kFsNfs) && IsRemoteFsType(kFsFuse) && IsRemoteFsType(kFsCoda));
  EXPECT_TRUE(IsImageFsType(kFsIso9660) && IsImageFsType(kFsUdf) && IsImageFsType(kFsRomfs));
}

TEST_F(LinuxPlatformTest, FileSystemTypesOfThisMachine) {
  EXPECT_EQ(platform_.QORUGetFSType("/proc", 0), kFsPseudo);
  EXPECT_EQ(platform_.QORUGetFSType("/proc/self/status", 0), kFsPseudo);
  EXPECT_EQ(platform_.QORUGetFSType("/sys", 0), kFsPseudo);
  int here = platform_.QORUGetFSType(root_.path(), 0);
  EXPECT_GE(here, 0);
  EXPECT_NE(here, kFsPseudo);
  EXPECT_LT(platform_.QORUGetFSType(root_.Path("/missing"), 0), 0);
  EXPECT_EQ(platform_.QLIBCErrGet(), ENOENT);
}

TEST_F(LinuxPlatformTest, RunnerPassesArgumentsVerbatimAndReportsTheStatus) {
  struct Case {
    std::vector<std::string> args;
    int status;
  } cases[] = {
      {{"-c", "exit 3"}, 3},        {{"-c", "test \"$1\" = 'a b;c $HOME'", "sh", "a b;c $HOME"}, 0},
      {{"-c", "test $# -eq 0"}, 0}, {{"-c", "read line"}, 1},  // standard input is /dev/null
      {{"-c", "kill -9 $$"}, -1},
  };
  for (const Case& c : cases) {
    EXPECT_EQ(platform_.QLIBCExec("/bin/sh", c.args), c.status) << c.args.back();
  }
  EXPECT_LT(platform_.QLIBCExec(root_.Path("/no/program"), {}), 0);
  EXPECT_EQ(platform_.QLIBCErrGet(), ENOENT);
  EXPECT_LT(platform_.QLIBCExec("sh", {"-c", "exit 0"}), 0) << "no search of PATH";
}

TEST_F(LinuxPlatformTest, RunnerLeaksNoDescriptor) {
  int fd = open("/dev/null", O_RDONLY);  // deliberately without O_CLOEXEC
  ASSERT_GE(fd, 3);
  std::string probe = "test -e /proc/self/fd/" + std::to_string(fd);
  EXPECT_EQ(platform_.QLIBCExec("/bin/sh", {"-c", probe}), 1);
  EXPECT_EQ(platform_.QLIBCExecl("/bin/sh", kExecStdoutToNull | kExecStderrToNull,
                                 {"-c", "echo hidden; " + probe}),
            1);
  close(fd);
}

TEST_F(LinuxPlatformTest, NotifierIsFoundByEnvironmentOrBesideTheProgram) {
  EXPECT_EQ(MapProgram("/bin/rm"), "/bin/rm");
  setenv(kNotifierEnv, "/opt/x/notify", 1);
  EXPECT_EQ(MapProgram(kHmxNotifyProgram), "/opt/x/notify");
  unsetenv(kNotifierEnv);
  char exe[4096];
  ssize_t n = readlink("/proc/self/exe", exe, sizeof(exe) - 1);
  ASSERT_GT(n, 0);
  std::string self(exe, static_cast<size_t>(n));
  EXPECT_EQ(MapProgram(kHmxNotifyProgram), self.substr(0, self.rfind('/')) + "/vellis-notify");
}

TEST_F(LinuxPlatformTest, QuotaReportsNoSpaceByItsOwnError) {
  EXPECT_EQ(platform_.QORUQuotaIsEnough(0, root_.path(), 1, 0), 1);
  EXPECT_EQ(platform_.QORUQuotaIsEnough(0, root_.path(), 1ULL << 62, 0), 0);
  EXPECT_EQ(platform_.QLIBCErrGet(), kPlatformErrNoSpace);
  EXPECT_EQ(platform_.QORUQuotaIsEnough(0, root_.Path("/missing"), 1, 0), 0);
  EXPECT_EQ(platform_.QLIBCErrGet(), ENOENT);
}

TEST_F(LinuxPlatformTest, CaseInsensitiveUtf8Comparison) {
  struct Case {
    std::string a, b;
    int sign;
  } cases[] = {
      {"photo", "PHOTO", 0},
      {"Stra\xC3\x9F"
       "e",
       "STRASSE", 0},
      {"\xC3\x89t\xC3\xA9", "\xC3\xA9T\xC3\x89", 0},
      {"a", "B", -1},
      {"b", "A", 1},
      {"photo", "photo2", -1},
      {"bad\xFF", "BAD\xFF", 1},  // not UTF-8: bytes
  };
  for (const Case& c : cases) {
    int got = platform_.QLIBCUnicodeUTF8StrCaseCmp(c.a, c.b);
    EXPECT_EQ((got > 0) - (got < 0), c.sign) << c.a << " vs " << c.b;
  }
}

TEST_F(LinuxPlatformTest, UsersAndTheAdministratorsGroup) {
  UserInfo root;
  ASSERT_EQ(platform_.QORUUserGetByUID(0, &root), 0);
  EXPECT_EQ(root.name, "root");
  EXPECT_LT(platform_.QORUUserGetByUID(3999999999u, &root), 0);

  setenv(kAdminGroupEnv, "root", 1);
  EXPECT_EQ(platform_.QLIBGroupIsAdminGroupMem("root", 0), 1);
  EXPECT_EQ(platform_.QLIBGroupIsAdminGroupMem("nobody", 0), 0);
  EXPECT_LT(platform_.QLIBGroupIsAdminGroupMem("no-such-user-vellis", 0), 0);
  setenv(kAdminGroupEnv, "no-such-group-vellis", 1);
  EXPECT_LT(platform_.QLIBGroupIsAdminGroupMem("root", 0), 0);
  unsetenv(kAdminGroupEnv);
  std::string group = AdminGroupName();
  EXPECT_TRUE(group == kDefaultAdminGroup || group == kFallbackAdminGroup) << group;
  if (getgrnam(kDefaultAdminGroup) == nullptr) {
    EXPECT_EQ(group, kFallbackAdminGroup);
  }
}

TEST_F(LinuxPlatformTest, LastErrorBelongsToTheThread) {
  EXPECT_LT(platform_.QORUGetFSType(root_.Path("/missing"), 0), 0);
  std::thread other([this] {
    EXPECT_EQ(platform_.QLIBCErrGet(), 0);
    EXPECT_EQ(platform_.QORUQuotaIsEnough(0, root_.path(), 1ULL << 62, 0), 0);
    EXPECT_EQ(platform_.QLIBCErrGet(), kPlatformErrNoSpace);
  });
  other.join();
  EXPECT_EQ(platform_.QLIBCErrGet(), ENOENT);
}

TEST_F(LinuxPlatformTest, UserPrivilegeFollowsTheShareFolderBits) {
  if (geteuid() != 0) GTEST_SKIP() << "needs root to own the folders";
  struct Case {
    mode_t mode;
    std::string user;
    int priv;
  } cases[] = {
      {0700, "nobody", kSharePrivNoAccess}, {0755, "nobody", kSharePrivReadOnly},
      {0751, "nobody", kSharePrivNoAccess}, {0777, "nobody", kSharePrivReadWrite},
      {0700, "root", kSharePrivReadWrite},
  };
  for (const Case& c : cases) {
    ShareInfo share;
    share.szName = "s" + std::to_string(c.mode);
    share.szPath = root_.Path("/volume1/" + share.szName);
    testing::MakeDirs(share.szPath);
    ASSERT_EQ(0, chmod(share.szPath.c_str(), c.mode));
    EXPECT_EQ(platform_.QORUShareUserPrivGet(c.user, share), c.priv)
        << std::oct << c.mode << " " << c.user;
  }
  ShareInfo share;
  share.szPath = root_.path();
  EXPECT_LT(platform_.QORUShareUserPrivGet("no-such-user-vellis", share), 0);
}

TEST_F(LinuxPlatformTest, ProcessThatIsNotRootMayNotSwitch) {
  if (geteuid() != 0) GTEST_SKIP() << "needs root to give up root";
  UserInfo nobody;
  ASSERT_EQ(platform_.QORUUserGet("nobody", &nobody), 0);
  pid_t pid = fork();
  ASSERT_GE(pid, 0);
  if (pid == 0) {
    // The child gives up root for good, then asks to become another user.
    if (setgroups(0, nullptr) != 0 || setresgid(nobody.gid, nobody.gid, nobody.gid) != 0 ||
        setresuid(nobody.uid, nobody.uid, nobody.uid) != 0) {
      _exit(10);
    }
    LinuxPlatform child_platform;
    if (child_platform.ResetCredentialsByName("daemon", 1)) _exit(11);
    if (child_platform.QLIBCErrGet() != EPERM) _exit(12);
    if (geteuid() != nobody.uid || getegid() != nobody.gid) _exit(13);
    _exit(0);
  }
  int status = 0;
  ASSERT_EQ(waitpid(pid, &status, 0), pid);
  ASSERT_TRUE(WIFEXITED(status));
  EXPECT_EQ(WEXITSTATUS(status), 0) << "10 setup, 11 switched, 12 wrong error, 13 ids changed";
}

}  // namespace
}  // namespace vellis::sdk
