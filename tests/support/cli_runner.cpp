#include "tests/support/cli_runner.h"

#include <sys/wait.h>

#include <cstdio>
#include <cstdlib>

namespace vellis::testing {

CliRun Vellis(const std::string& args) {
  const char* dir = getenv("VELLIS_TEST_BINARY_DIR");
  std::string bin = std::string(dir ? dir : ".") + "/bin/vellis";
  FILE* p = popen((bin + " " + args + " 2>&1").c_str(), "r");
  CliRun r{-1, ""};
  if (!p) return r;
  char buf[4096];
  for (size_t n; (n = fread(buf, 1, sizeof(buf), p)) > 0;) r.out.append(buf, n);
  int status = pclose(p);
  r.status = WIFEXITED(status) ? WEXITSTATUS(status) : -1;
  return r;
}

}  // namespace vellis::testing
