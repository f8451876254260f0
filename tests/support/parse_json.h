// JSON text for tests.
#pragma once

#include <gtest/gtest.h>
#include <json/json.h>

#include <string>

#include "common/json_util.h"

namespace vellis::testing {

// The value of `text`; a text that does not parse fails the current test
// (non-fatally) and gives null.
inline Json::Value ParseJson(const std::string& text) {
  Json::Value v;
  EXPECT_TRUE(JsonFromString(v, text)) << text;
  return v;
}

}  // namespace vellis::testing
