#include "tests/support/parse_json.h"

#include <gtest/gtest.h>

#include "common/json_util.h"

namespace vellis::testing {

Json::Value ParseJson(const std::string& text) {
  Json::Value v;
  EXPECT_TRUE(JsonFromString(v, text)) << text;
  return v;
}

}  // namespace vellis::testing
