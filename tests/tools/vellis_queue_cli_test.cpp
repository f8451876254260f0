// The `vellis queue` commands, run as a user runs them.
#include <gtest/gtest.h>

#include <cstdio>
#include <cstdlib>
#include <string>

#include "tests/support/cli_runner.h"
#include "tests/support/temp_root.h"

namespace vellis::testing {
namespace {

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
  CliRun r = Vellis("queue fold " + queue_);
  EXPECT_EQ(r.status, 0) << r.out;
  EXPECT_EQ(r.out,
            "[01] /volume1/s/a\n"
            "[05] /volume1/s/old -> /volume1/s/new\n"
            "[04] /volume1/s, data={\"photo\":true}\n"
            "3\n");
}

TEST_F(QueueCliTest, FoldOfAMissingQueueFailsWithItsCode) {
  CliRun r = Vellis("queue fold " + root_.Path("/nothing"));
  EXPECT_EQ(r.status, 1);
  EXPECT_NE(r.out.find("error 502: Failed to open queue, reason=No such file or directory"),
            std::string::npos)
      << r.out;
}

TEST_F(QueueCliTest, RotateThenPendingSeesTheSideFile) {
  WriteFile(queue_, "{\"event\":65536,\"path\":\"/volume1/s/dir\"}\n");
  CliRun rotate = Vellis("queue rotate " + queue_);
  EXPECT_EQ(rotate.status, 0) << rotate.out;
  EXPECT_EQ(ReadFile(queue_ + ".tmp"), "{\"event\":65536,\"path\":\"/volume1/s/dir\"}\n");

  CliRun below = Vellis("queue pending " + queue_ + " /volume1/s/dir/x");
  EXPECT_EQ(below.out, "processing: no\nreindex: yes\n");
  CliRun sibling = Vellis("queue pending " + queue_ + " /volume1/s/di");
  EXPECT_EQ(sibling.out, "processing: no\nreindex: no\n");
  CliRun at = Vellis("queue pending " + queue_ + " /volume1/s");
  EXPECT_EQ(at.out, "processing: yes\nreindex: no\n");
}

TEST_F(QueueCliTest, MissingArgumentsAreAUsageError) {
  CliRun r = Vellis("queue fold");
  EXPECT_NE(r.status, 0);
  EXPECT_NE(r.out.find("FILE is required"), std::string::npos) << r.out;
}

}  // namespace
}  // namespace vellis::testing
