// Runs the built `vellis` command line as a user runs it.
#pragma once

#include <string>

namespace vellis::testing {

struct CliRun {
  int status;       // exit status; -1 when it did not exit normally
  std::string out;  // stdout and stderr together
};

// The `vellis` of this build (found through $VELLIS_TEST_BINARY_DIR, which
// ctest sets) with `args`: shell words, quoted by the caller.
CliRun Vellis(const std::string& args);

}  // namespace vellis::testing
