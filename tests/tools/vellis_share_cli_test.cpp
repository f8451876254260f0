// The `vellis share` and `vellis path` commands, run as a user runs them.
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <string>

#include "tests/support/temp_root.h"

namespace vellis::testing {
namespace {

struct CliRun {
  int status;
  std::string out;
};

// The built `vellis` with `args` (shell words, quoted by the caller), stdout
// and stderr together.
CliRun Vellis(const std::string& args) {
  const char* dir = getenv("VELLIS_TEST_BINARY_DIR");
  std::string bin = std::string(dir ? dir : ".") + "/tools/vellis/vellis";
  FILE* p = popen((bin + " " + args + " 2>&1").c_str(), "r");
  CliRun r{-1, ""};
  if (!p) return r;
  char buf[4096];
  for (size_t n; (n = fread(buf, 1, sizeof(buf), p)) > 0;) r.out.append(buf, n);
  int status = pclose(p);
  r.status = WIFEXITED(status) ? WEXITSTATUS(status) : -1;
  return r;
}

class ShareCliTest : public ::testing::Test {
 protected:
  void SetUp() override {
    MakeDirs(v_ + "/photo/dir");
    MakeDirs(v_ + "/music");
    ASSERT_EQ(0, symlink("/etc", (v_ + "/photo/etc").c_str()));
    ASSERT_EQ(Vellis("share add photo " + v_ + "/photo --recycle-bin").status, 0);
  }

  TempRoot root_;
  std::string v_ = root_.Path("/volume1");
};

TEST_F(ShareCliTest, SharesAreAddedListedAndRemoved) {
  EXPECT_EQ(Vellis("share add music " + v_ + "/music --read-only").out,
            "added music " + v_ + "/music\n");
  EXPECT_EQ(Vellis("share list").out,
            "photo\t" + v_ +
                "/photo\tindexable=yes encryption=no recycle-bin=yes hide-unreadable=no\n"
                "music\t" +
                v_ + "/music\tindexable=no encryption=no recycle-bin=no hide-unreadable=no\n");
  EXPECT_EQ(Vellis("share remove music").status, 0);
  CliRun gone = Vellis("share remove music");
  EXPECT_EQ(gone.status, 1);
  EXPECT_EQ(gone.out, "error 800: no such share: \"music\"\n");
}

TEST_F(ShareCliTest, BadSharesAreRefusedWithTheirReason) {
  struct Case {
    std::string args;
    std::string out;
  } cases[] = {
      {"share add 'a/b' " + v_ + "/a/b", "error 120: share name contains \"/\"\n"},
      {"share add -- -x " + v_ + "/-x", "error 120: share name may not begin with \"-\"\n"},
      {"share add music volume1/music",
       "error 120: share path is not absolute: \"volume1/music\"\n"},
      {"share add music " + v_ + "/../volume1/music",
       "error 120: share path contains \"..\": " + v_ + "/../volume1/music\n"},
  };
  for (const Case& c : cases) {
    CliRun r = Vellis(c.args);
    EXPECT_EQ(r.status, 1) << c.args;
    EXPECT_EQ(r.out, c.out) << c.args;
  }
  EXPECT_EQ(Vellis("share list").out.find("music"), std::string::npos);
}

TEST_F(ShareCliTest, PathCommandsNameTheRuleTheTypeAndTheShare) {
  EXPECT_EQ(Vellis("path check " + v_ + "/photo/dir").out, "indexable\n");
  EXPECT_EQ(Vellis("path check " + v_ + "/photo/etc").out, "not indexable: not-canonical\n");
  EXPECT_EQ(Vellis("path check " + v_ + "/photo/dir/").out, "not indexable: not-canonical\n");
  EXPECT_EQ(Vellis("path check /proc").out, "not indexable: system-fs\n");
  CliRun outside = Vellis("path check " + v_ + "/music");
  EXPECT_EQ(outside.status, 1);
  EXPECT_EQ(outside.out, "error 502: QORUShareNamePathGet failed, full_path=" + v_ + "/music\n");
  EXPECT_EQ(Vellis("path type /x/IMG.JPG").out, "3 image\n");
  EXPECT_EQ(Vellis("path type /x/a.exe").out, "4 unknown\n");
  EXPECT_EQ(Vellis("path share " + v_ + "/photo/dir/a").out, "photo\t" + v_ + "/photo\n");
}

}  // namespace
}  // namespace vellis::testing
