// Runs the `vellis` of this build ($VELLIS_TEST_BINARY_DIR/bin) as a user runs it.
#pragma once

#include <string>
#include <vector>

namespace vellis::testing {

// One run: `args` are shell words quoted by the caller; `out` is what it
// prints on stdout and stderr together, "..." standing for any text.
struct CliCase {
  std::string args;
  int status;
  std::string out;
};

// Runs each case in order and expects its exit status and output. A failure
// names the arguments and shows what the run printed.
void ExpectRuns(const std::vector<CliCase>& cases);

}  // namespace vellis::testing
