#include "common/log.h"

#include <errno.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <string>

#include "tests/support/fake_platform.h"
#include "tests/support/thrown.h"

namespace vellis {
namespace {

int reason_evaluations = 0;

// Counts its calls and disturbs errno, as a reason built from system calls may.
std::string CountedReason(const std::string& text) {
  ++reason_evaluations;
  errno = EPERM;
  return text;
}

void CheckPositive(int value) {
  VELLIS_THROW_IF(value <= 0, kErrInternal, CountedReason("value=" + std::to_string(value)));
}

class LogTest : public ::testing::Test {
 protected:
  // The lines logged since the last call, as "<priority> <text>" without
  // the "log_test.cpp:<line> " prefix.
  std::vector<std::string> TakeLines() {
    std::vector<std::string> out;
    for (auto l : platform_.Logs()) {
      if (l.text.rfind("log_test.cpp:", 0) == 0) l.text.erase(0, l.text.find(' ') + 1);
      out.push_back(std::to_string(l.priority) + " " + l.text);
    }
    platform_.ClearLogs();
    return out;
  }

  // "(<pid>, <euid>) ", as the lines about a failure have it.
  const std::string process_ =
      "(" + std::to_string(getpid()) + ", " + std::to_string(geteuid()) + ") ";
  testing::FakePlatform platform_;
  testing::ScopedPlatform scoped_{&platform_};
};

TEST_F(LogTest, ThrowIfLogsTheFailedConditionWithErrnoAndThrows) {
  errno = ENOENT;
  EXPECT_EQ(testing::Thrown([] { CheckPositive(-3); }), "502 value=-3");
  EXPECT_EQ(errno, 0);
  EXPECT_EQ(TakeLines(), std::vector<std::string>{"3 " + process_ +
                                                  "(CheckPositive) Failed [value <= 0], reason: "
                                                  "value=-3 [err: No such file or directory]"});
  reason_evaluations = 0;
  errno = EAGAIN;
  EXPECT_NO_THROW(CheckPositive(1));
  EXPECT_EQ(errno, EAGAIN);
  EXPECT_EQ(reason_evaluations, 0) << "the reason was built without a failure";
  EXPECT_TRUE(TakeLines().empty());
}

TEST_F(LogTest, ErrnoLinesResetErrnoPlainLinesKeepIt) {
  const std::string long_text(600, 'q');  // longer than the formatting buffer
  errno = EACCES;
  VELLIS_LOG_ERRNO("open %s, mode=%o", "/x", 0644);
  EXPECT_EQ(errno, 0);
  errno = ENOSPC;
  VELLIS_LOG_ERR("text=%s end", long_text.c_str());
  EXPECT_EQ(errno, ENOSPC);
  errno = 0;
  VELLIS_LOG_ERRNO("no error");
  VELLIS_LOG_DEBUG("hidden below the debug level");
  EXPECT_EQ(TakeLines(),
            (std::vector<std::string>{
                "3 " + process_ + "(TestBody) open /x, mode=644 [err: Permission denied]",
                "3 text=" + long_text + " end", "3 " + process_ + "(TestBody) no error"}));
}

TEST(ErrorTest, MessageNamesTheCodeAndTheReasonWhatOnlyTheReason) {
  EXPECT_EQ(Error(kErrMalformedEvent).Message(), std::string("Vellis error, code=906"));
  const Error e(kErrBadArgument, "Not an object");
  EXPECT_EQ(e.Message(), std::string("Vellis error, code=120, reason=[Not an object]"));
  EXPECT_STREQ(e.what(), "Not an object");
}

}  // namespace
}  // namespace vellis
