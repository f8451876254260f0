// JSON text for tests.
#pragma once

#include <json/json.h>

#include <string>

namespace vellis::testing {

// The value of `text`; a text that does not parse fails the current test
// (non-fatally) and gives null.
Json::Value ParseJson(const std::string& text);

}  // namespace vellis::testing
