#include "sdk/linux/linux_platform.h"

#include <fcntl.h>
#include <grp.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <filesystem>
#include <string>
#include <thread>
#include <tuple>
#include <utility>
#include <vector>

#include "sdk/linux/file_systems.h"
#include "sdk/linux/process.h"
#include "sdk/linux/users.h"
#include "tests/support/temp_root.h"

namespace vellis::sdk {
namespace {

TEST(FsTypeFromMagicTest, MapsMagicNumbersAndSystemTmpfs) {
  // The magic number, the path, the type and its kind: l(ocal), r(emote), i(mage).
  const std::tuple<uint64_t, const char*, int, char> cases[] = {
      {0xEF53, "/volume1", kFsExt, 'l'},
      {0xFFFFFFFF9123683EULL, "/volume1", kFsBtrfs, 'l'},  // sign-extended f_type
      {0x01021994, "/tmp", kFsTmpfs, 'l'},
      {0x01021994, "/run", kFsPseudo, 'l'},
      {0x01021994, "/dev/shm", kFsPseudo, 'l'},
      {0x01021994, "/sys/fs/cgroup", kFsPseudo, 'l'},
      {0x01021994, "/running", kFsTmpfs, 'l'},  // a sibling of /run, not below it
      {0x9FA0, "/proc", kFsPseudo, 'l'},
      {0x6969, "/mnt/nfs", kFsNfs, 'r'},
      {0x73757245, "/mnt/coda", kFsCoda, 'r'},
      {0x9660, "/media/cdrom", kFsIso9660, 'i'},
      {0x7275, "/mnt/romfs", kFsRomfs, 'i'},
      {0x12345678, "/mnt/odd", kFsOther, 'l'}};
  for (const auto& [magic, path, type, kind] : cases) {
    const int got = FsTypeFromMagic(magic, path);
    EXPECT_EQ(got, type) << std::hex << magic << " " << path;
    EXPECT_EQ(IsRemoteFsType(got), kind == 'r') << path;
    EXPECT_EQ(IsImageFsType(got), kind == 'i') << path;
  }
}

class LinuxPlatformTest : public ::testing::Test {
 protected:
  LinuxPlatform platform_;
  testing::TempRoot root_;
};

TEST_F(LinuxPlatformTest, FileSystemTypesAndFreeSpaceOfThisMachine) {
  EXPECT_EQ(platform_.QORUGetFSType("/proc/self/status", 0), kFsPseudo);
  const int here = platform_.QORUGetFSType(root_.path(), 0);
  EXPECT_TRUE(here >= 0 && here != kFsPseudo) << here;
  EXPECT_EQ(platform_.QORUQuotaIsEnough(0, root_.path(), 1, 0), 1);
  for (const std::string& path : {root_.path(), root_.Path("/missing")}) {
    EXPECT_EQ(platform_.QORUQuotaIsEnough(0, path, 1ULL << 62, 0), 0);
    EXPECT_EQ(platform_.QLIBCErrGet(), path == root_.path() ? kPlatformErrNoSpace : ENOENT);
  }
  // The last error belongs to the thread.
  EXPECT_LT(platform_.QORUGetFSType(root_.Path("/missing"), 0), 0);
  std::thread([this] {
    EXPECT_EQ(platform_.QLIBCErrGet(), 0);
    EXPECT_EQ(platform_.QORUQuotaIsEnough(0, root_.path(), 1ULL << 62, 0), 0);
  }).join();
  EXPECT_EQ(platform_.QLIBCErrGet(), ENOENT);
}

TEST_F(LinuxPlatformTest, RunnerPassesArgumentsVerbatimAndLeaksNoDescriptor) {
  int fd = open("/dev/null", O_RDONLY);  // deliberately without O_CLOEXEC
  ASSERT_GE(fd, 3);
  const std::string probe = "test -e /proc/self/fd/" + std::to_string(fd);
  const std::pair<std::vector<std::string>, int> cases[] = {
      {{"-c", "exit 3"}, 3},        {{"-c", "test \"$1\" = 'a b;c $HOME'", "sh", "a b;c $HOME"}, 0},
      {{"-c", "test $# -eq 0"}, 0}, {{"-c", "read line"}, 1},  // standard input is /dev/null
      {{"-c", "kill -9 $$"}, -1},   {{"-c", probe}, 1}};
  for (const auto& [args, status] : cases)
    EXPECT_EQ(platform_.QLIBCExec("/bin/sh", args), status) << args.back();
  EXPECT_EQ(platform_.QLIBCExecl("/bin/sh", kExecStdoutToNull | kExecStderrToNull,
                                 {"-c", "echo hidden; " + probe}),
            1);
  close(fd);
  EXPECT_LT(platform_.QLIBCExec(root_.Path("/no/program"), {}), 0);
  EXPECT_EQ(platform_.QLIBCErrGet(), ENOENT);
  EXPECT_LT(platform_.QLIBCExec("sh", {"-c", "exit 0"}), 0) << "no search of PATH";
}

TEST_F(LinuxPlatformTest, NotifierIsFoundByEnvironmentOrBesideTheProgram) {
  EXPECT_EQ(MapProgram("/bin/rm"), "/bin/rm");
  setenv(kNotifierEnv, "/opt/x/notify", 1);
  EXPECT_EQ(MapProgram(kHmxNotifyProgram), "/opt/x/notify");
  unsetenv(kNotifierEnv);
  EXPECT_EQ(
      MapProgram(kHmxNotifyProgram),
      std::filesystem::read_symlink("/proc/self/exe").parent_path().string() + "/vellis-notify");
}

// Text that is not UTF-8 ("bad\xFF") compares as bytes.
TEST_F(LinuxPlatformTest, CaseInsensitiveUtf8Comparison) {
  const std::tuple<const char*, const char*, int> cases[] = {
      {"photo", "PHOTO", 0},
      {"Stra\xC3\x9F\x65", "STRASSE", 0},
      {"\xC3\x89t\xC3\xA9", "\xC3\xA9T\xC3\x89", 0},
      {"a", "B", -1},
      {"b", "A", 1},
      {"photo", "photo2", -1},
      {"bad\xFF", "BAD\xFF", 1}};
  for (const auto& [a, b, sign] : cases) {
    int got = platform_.QLIBCUnicodeUTF8StrCaseCmp(a, b);
    EXPECT_EQ((got > 0) - (got < 0), sign) << a << " vs " << b;
  }
}

TEST_F(LinuxPlatformTest, UserPrivilegeFollowsTheShareFolderBits) {
  if (geteuid() != 0) GTEST_SKIP() << "needs root to own the folders";
  const std::tuple<mode_t, const char*, int> cases[] = {{0700, "nobody", kSharePrivNoAccess},
                                                        {0755, "nobody", kSharePrivReadOnly},
                                                        {0751, "nobody", kSharePrivNoAccess},
                                                        {0777, "nobody", kSharePrivReadWrite},
                                                        {0700, "root", kSharePrivReadWrite}};
  ShareInfo share;
  for (const auto& [mode, user, priv] : cases) {
    share.szName = "s" + std::to_string(mode);
    share.szPath = root_.Path("/volume1/" + share.szName);
    testing::MakeDirs(share.szPath);
    ASSERT_EQ(0, chmod(share.szPath.c_str(), mode));
    EXPECT_EQ(platform_.QORUShareUserPrivGet(user, share), priv) << std::oct << mode << " " << user;
  }
  EXPECT_LT(platform_.QORUShareUserPrivGet("no-such-user-vellis", share), 0);
}

}  // namespace
}  // namespace vellis::sdk
