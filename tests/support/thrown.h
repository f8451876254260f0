// What a call throws, as text that a test can compare.
#pragma once

#include <functional>
#include <string>

#include "common/error.h"

namespace vellis::testing {

// "<code> <reason>" of the vellis::Error that `fn` throws, or "no error".
inline std::string Thrown(const std::function<void()>& fn) {
  try {
    fn();
  } catch (const Error& e) {
    return std::to_string(e.GetCode()) + " " + e.what();
  }
  return "no error";
}

}  // namespace vellis::testing
