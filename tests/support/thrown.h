// What a call throws, as text that a test can compare.
#pragma once

#include <functional>
#include <string>

namespace vellis::testing {

// "<code> <reason>" of the vellis::Error that `fn` throws, or "no error".
std::string Thrown(const std::function<void()>& fn);

}  // namespace vellis::testing
