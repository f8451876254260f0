#include "tests/support/cli_runner.h"

#include <gtest/gtest.h>
#include <sys/wait.h>

#include <cstdio>
#include <cstdlib>

namespace vellis::testing {
namespace {

// True when `text` is `pattern` with each "..." standing for any text.
bool Matches(const std::string& text, const std::string& pattern) {
  size_t dots = pattern.find("...");
  if (dots == std::string::npos) return text == pattern;
  if (text.compare(0, dots, pattern, 0, dots) != 0) return false;
  for (size_t at = dots; at <= text.size(); ++at) {
    if (Matches(text.substr(at), pattern.substr(dots + 3))) return true;
  }
  return false;
}

}  // namespace

void ExpectRuns(const std::vector<CliCase>& cases) {
  const char* dir = getenv("VELLIS_TEST_BINARY_DIR");
  const std::string bin = std::string(dir ? dir : ".") + "/bin/vellis ";
  for (const CliCase& c : cases) {
    FILE* p = popen((bin + c.args + " 2>&1").c_str(), "r");
    ASSERT_NE(p, nullptr) << c.args;
    std::string out;
    char buf[4096];
    for (size_t n; (n = fread(buf, 1, sizeof(buf), p)) > 0;) out.append(buf, n);
    int status = pclose(p);
    status = WIFEXITED(status) ? WEXITSTATUS(status) : -1;
    EXPECT_TRUE(status == c.status && Matches(out, c.out))
        << "vellis " << c.args << "\nexit " << status << ", printed:\n"
        << out << "wanted exit " << c.status << ", printed:\n"
        << c.out;
  }
}

}  // namespace vellis::testing
