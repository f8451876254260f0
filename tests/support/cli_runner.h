// Runs the `vellis` of this build ($VELLIS_TEST_BINARY_DIR/bin) as a user runs it.
#pragma once

#include <gtest/gtest.h>
#include <sys/wait.h>

#include <cstdio>
#include <cstdlib>
#include <string>
#include <tuple>
#include <vector>

namespace vellis::testing {

// One run: its arguments, shell words quoted by the caller; its exit status;
// what it prints on stdout and stderr together, "..." standing for any text.
using CliCase = std::tuple<std::string, int, std::string>;

// True when `text` is `pattern` with each "..." standing for any text.
inline bool MatchesWithDots(const std::string& text, const std::string& pattern) {
  size_t dots = pattern.find("...");
  if (dots == std::string::npos) return text == pattern;
  if (text.compare(0, dots, pattern, 0, dots) != 0) return false;
  for (size_t at = dots; at <= text.size(); ++at) {
    if (MatchesWithDots(text.substr(at), pattern.substr(dots + 3))) return true;
  }
  return false;
}

// Runs each case in order and expects its exit status and output. A failure
// names the arguments and shows what the run printed.
inline void ExpectRuns(const std::vector<CliCase>& cases) {
  const char* dir = getenv("VELLIS_TEST_BINARY_DIR");
  const std::string bin = std::string(dir ? dir : ".") + "/bin/vellis ";
  for (const auto& [args, want_status, want] : cases) {
    FILE* p = popen((bin + args + " 2>&1").c_str(), "r");
    ASSERT_NE(p, nullptr) << args;
    std::string out;
    char buf[4096];
    for (size_t n; (n = fread(buf, 1, sizeof(buf), p)) > 0;) out.append(buf, n);
    int status = pclose(p);
    status = WIFEXITED(status) ? WEXITSTATUS(status) : -1;
    EXPECT_TRUE(status == want_status && MatchesWithDots(out, want))
        << "vellis " << args << "\nexit " << status << ", printed:\n"
        << out << "wanted exit " << want_status << ", printed:\n"
        << want;
  }
}

}  // namespace vellis::testing
