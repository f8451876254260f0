#include "tests/support/thrown.h"

#include "common/error.h"

namespace vellis::testing {

std::string Thrown(const std::function<void()>& fn) {
  try {
    fn();
  } catch (const Error& e) {
    return std::to_string(e.GetCode()) + " " + e.what();
  }
  return "no error";
}

}  // namespace vellis::testing
