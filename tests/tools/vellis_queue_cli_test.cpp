// The `vellis queue` commands, run as a user runs them.
#include <gtest/gtest.h>
#include <sys/wait.h>

#include <cstdio>
#include <cstdlib>
#include <string>

#include "tests/support/temp_root.h"

namespace vellis::testing {
namespace {

struct Result {
  int status;
  std::string out;
};

// Runs the built `vellis` with `args` (shell words), stdout and stderr
// together.
Result RunVellis(const std::string& args) {
  const char* dir = getenv("VELLIS_TEST_BINARY_DIR");
  std::string bin = std::string(dir ? dir : ".") + "/tools/vellis/vellis";
  FILE* p = popen((bin + " " + args + " 2>&1").c_str(), "r");
  Result r{-1, ""};
  if (!p) return r;
  char buf[4096];
  size_t n;
  while ((n = fread(buf, 1, sizeof(buf), p)) > 0) r.out.append(buf, n);
  int status = pclose(p);
  r.status = WIFEXITED(status) ? WEXITSTATUS(status) : -1;
  return r;
}

class QueueCliTest : public ::testing::Test {
 protected:
  TempRoot root_;
  std::string queue_ = root_.Path("/volume1/@fileindex/s.queue");
};

TEST_F(QueueCliTest, FoldPrintsSurvivingOperationsThenTheCount) {
  WriteFile(queue_,
            "{\"event\":64,\"path\":\"/volume1/s/a\"}\n"
            "{\"event\":128,\"path\":\"/volume1/s/a\"}\n"
            "not json\n"
            "{\"event\":256,\"path\":\"/volume1/s/new\",\"path_old\":\"/volume1/s/old\"}\n"
            "{\"event\":131072,\"path\":\"/volume1/s\",\"data\":{\"photo\":true}}");
  Result r = RunVellis("queue fold " + queue_);
  EXPECT_EQ(r.status, 0) << r.out;
  EXPECT_EQ(r.out,
            "[01] /volume1/s/a\n"
            "[05] /volume1/s/old -> /volume1/s/new\n"
            "[04] /volume1/s, data={\"photo\":true}\n"
            "3\n");
}

TEST_F(QueueCliTest, FoldOfAMissingQueueFailsWithItsCode) {
  Result r = RunVellis("queue fold " + root_.Path("/nothing"));
  EXPECT_EQ(r.status, 1);
  EXPECT_NE(r.out.find("error 502: Failed to open queue, reason=No such file or directory"),
            std::string::npos)
      << r.out;
}

TEST_F(QueueCliTest, RotateThenPendingSeesTheSideFile) {
  WriteFile(queue_, "{\"event\":65536,\"path\":\"/volume1/s/dir\"}\n");
  Result rotate = RunVellis("queue rotate " + queue_);
  EXPECT_EQ(rotate.status, 0) << rotate.out;
  EXPECT_EQ(ReadFile(queue_ + ".tmp"), "{\"event\":65536,\"path\":\"/volume1/s/dir\"}\n");

  Result below = RunVellis("queue pending " + queue_ + " /volume1/s/dir/x");
  EXPECT_EQ(below.out, "processing: no\nreindex: yes\n");
  Result sibling = RunVellis("queue pending " + queue_ + " /volume1/s/di");
  EXPECT_EQ(sibling.out, "processing: no\nreindex: no\n");
  Result at = RunVellis("queue pending " + queue_ + " /volume1/s");
  EXPECT_EQ(at.out, "processing: yes\nreindex: no\n");
}

TEST_F(QueueCliTest, MissingArgumentsAreAUsageError) {
  Result r = RunVellis("queue fold");
  EXPECT_NE(r.status, 0);
  EXPECT_NE(r.out.find("FILE is required"), std::string::npos) << r.out;
}

}  // namespace
}  // namespace vellis::testing
