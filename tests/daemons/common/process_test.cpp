// What every daemon does with its log lines.
#include "daemons/common/process.h"

#include <gtest/gtest.h>
#include <syslog.h>

#include <cstdlib>

namespace vellis::daemon {
namespace {

// A copy on stderr only in the foreground, and never when stderr is the
// journal already.
TEST(LogOptionsTest, StderrCopyOnlyInTheForegroundAndOutsideTheJournal) {
  struct Case {
    bool foreground;
    const char* journal;  // $JOURNAL_STREAM; null: unset
    bool copy;
  } cases[] = {
      {true, nullptr, true},   {true, "", true},         {true, "8:1234", false},
      {false, nullptr, false}, {false, "8:1234", false},
  };
  for (const Case& c : cases) {
    if (c.journal) {
      setenv("JOURNAL_STREAM", c.journal, 1);
    } else {
      unsetenv("JOURNAL_STREAM");
    }
    const int options = LogOptions(c.foreground);
    EXPECT_EQ((options & LOG_PERROR) != 0, c.copy)
        << "foreground " << c.foreground << ", JOURNAL_STREAM "
        << (c.journal ? c.journal : "unset");
    EXPECT_NE(options & LOG_PID, 0);
  }
  unsetenv("JOURNAL_STREAM");
}

}  // namespace
}  // namespace vellis::daemon
