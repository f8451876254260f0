#include "common/error.h"

#include <gtest/gtest.h>

namespace vellis {
namespace {

TEST(ErrorTest, ComposesMessageAndKeepsReasonApart) {
  struct Case {
    ErrorCode code;
    std::string reason;
    std::string message;
  } cases[] = {
      {kErrMalformedEvent, "", "Vellis error, code=906"},
      {kErrBadArgument, "Not an object", "Vellis error, code=120, reason=[Not an object]"},
      {static_cast<ErrorCode>(1401), "busy", "Vellis error, code=1401, reason=[busy]"},
  };
  for (const auto& c : cases) {
    Error e(c.code, c.reason);
    EXPECT_EQ(e.Message(), c.message);
    EXPECT_EQ(std::string(e.what()), c.reason) << c.message;
    EXPECT_EQ(e.GetCode(), c.code);
    Error copy(e);
    EXPECT_EQ(copy.GetCode(), c.code);
    EXPECT_EQ(std::string(copy.what()), c.reason);
  }
}

}  // namespace
}  // namespace vellis
