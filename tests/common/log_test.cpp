#include "common/log.h"

#include <errno.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <string>

#include "tests/support/fake_platform.h"

namespace vellis {
namespace {

using testing::FakePlatform;
using testing::ScopedPlatform;

int reason_evaluations = 0;
int throw_line = 0;

// Counts its calls and disturbs errno, as a reason built from system calls
// may.
std::string CountedReason(const std::string& text) {
  ++reason_evaluations;
  errno = EPERM;
  return text;
}

void CheckPositive(int value, int err) {
  errno = err;
  throw_line = __LINE__ + 1;
  VELLIS_THROW_IF(value <= 0, kErrInternal, CountedReason("value=" + std::to_string(value)));
}

std::string Prefix(int line, const char* func) {
  return "log_test.cpp:" + std::to_string(line) + " (" + std::to_string(getpid()) + ", " +
         std::to_string(geteuid()) + ") (" + func + ") ";
}

class LogTest : public ::testing::Test {
 protected:
  void SetUp() override { reason_evaluations = 0; }
  void TearDown() override { fileindex::log_level = LOG_INFO; }

  FakePlatform platform_;
  ScopedPlatform scoped_{&platform_};
};

TEST_F(LogTest, ThrowIfLogsTheFailureLineAndThrows) {
  struct Case {
    int err;
    std::string suffix;
  } cases[] = {{0, ""}, {ENOENT, " [err: No such file or directory]"}};
  for (const auto& c : cases) {
    platform_.ClearLogs();
    try {
      CheckPositive(-3, c.err);
      ADD_FAILURE() << "no throw, errno " << c.err;
    } catch (const Error& e) {
      EXPECT_EQ(errno, 0) << "errno " << c.err;
      EXPECT_EQ(e.GetCode(), kErrInternal);
      EXPECT_STREQ(e.what(), "value=-3");
    }
    const auto logs = platform_.Logs();
    ASSERT_EQ(logs.size(), 1u) << "errno " << c.err;
    EXPECT_EQ(logs[0].priority, LOG_ERR);
    EXPECT_EQ(logs[0].text, Prefix(throw_line, "CheckPositive") +
                                "Failed [value <= 0], reason: value=-3" + c.suffix);
  }
}

TEST_F(LogTest, ThrowIfDoesNothingWhileTheConditionHolds) {
  errno = EAGAIN;
  EXPECT_NO_THROW(CheckPositive(1, EAGAIN));
  EXPECT_EQ(errno, EAGAIN);
  EXPECT_EQ(reason_evaluations, 0) << "the reason was built without a failure";
  EXPECT_TRUE(platform_.Logs().empty());
}

TEST_F(LogTest, ErrnoLineCarriesThePrefixAndResetsErrno) {
  struct Case {
    int err;
    std::string suffix;
  } cases[] = {{0, ""}, {EACCES, " [err: Permission denied]"}};
  for (const auto& c : cases) {
    platform_.ClearLogs();
    errno = c.err;
    const int line = __LINE__ + 1;
    VELLIS_LOG_ERRNO("open %s, mode=%o", "/x", 0644);
    EXPECT_EQ(errno, 0);
    const auto logs = platform_.Logs();
    ASSERT_EQ(logs.size(), 1u);
    EXPECT_EQ(logs[0].priority, LOG_ERR);
    EXPECT_EQ(logs[0].text, Prefix(line, "TestBody") + "open /x, mode=644" + c.suffix);
  }
}

TEST_F(LogTest, PlainLinesKeepErrnoAndLongText) {
  const std::string long_text(3000, 'q');
  errno = ENOSPC;
  const int line = __LINE__ + 1;
  VELLIS_LOG_ERR("text=%s end", long_text.c_str());
  EXPECT_EQ(errno, ENOSPC);
  const auto logs = platform_.Logs();
  ASSERT_EQ(logs.size(), 1u);
  EXPECT_EQ(logs[0].priority, LOG_ERR);
  EXPECT_EQ(logs[0].text, "log_test.cpp:" + std::to_string(line) + " text=" + long_text + " end");
}

TEST_F(LogTest, DebugLinesOnlyAtDebugLevel) {
  for (int level : {LOG_INFO, LOG_ERR, LOG_DEBUG}) {
    platform_.ClearLogs();
    fileindex::log_level = level;
    const int line = __LINE__ + 1;
    VELLIS_LOG_DEBUG("level %d", level);
    const auto logs = platform_.Logs();
    ASSERT_EQ(logs.size(), level == LOG_DEBUG ? 1u : 0u) << "level " << level;
    if (!logs.empty()) {
      EXPECT_EQ(logs[0].priority, LOG_DEBUG);
      EXPECT_EQ(logs[0].text, "log_test.cpp:" + std::to_string(line) + " level 7");
    }
  }
}

}  // namespace
}  // namespace vellis
