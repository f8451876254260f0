#include "common/root_path.h"

#include <stdlib.h>

#include <gtest/gtest.h>

#include <string>

namespace vellis {
namespace {

// Sets $VELLIS_ROOT (or unsets it for nullptr) and restores it afterwards.
class RootPathTest : public ::testing::Test {
 protected:
  void SetUp() override {
    const char* old = getenv(kRootEnv);
    had_old_ = old != nullptr;
    if (old) old_ = old;
  }
  void TearDown() override {
    if (had_old_) {
      setenv(kRootEnv, old_.c_str(), 1);
    } else {
      unsetenv(kRootEnv);
    }
  }
  void SetRoot(const char* root) {
    if (root) {
      setenv(kRootEnv, root, 1);
    } else {
      unsetenv(kRootEnv);
    }
  }

  bool had_old_ = false;
  std::string old_;
};

TEST_F(RootPathTest, PrefixesTheRootWithoutItsTrailingSlashes) {
  struct Case {
    const char* root;
    std::string expected;
  } cases[] = {
      {nullptr, "/var/run/fileindexd.sock"},
      {"", "/var/run/fileindexd.sock"},
      {"/", "/var/run/fileindexd.sock"},
      {"///", "/var/run/fileindexd.sock"},
      {"/tmp/r", "/tmp/r/var/run/fileindexd.sock"},
      {"/tmp/r//", "/tmp/r/var/run/fileindexd.sock"},
  };
  for (const auto& c : cases) {
    SetRoot(c.root);
    EXPECT_EQ(RootPath("/var/run/fileindexd.sock"), c.expected)
        << "root=" << (c.root ? c.root : "(unset)");
  }
}

TEST_F(RootPathTest, ReadsTheRootAnewOnEveryCall) {
  SetRoot("/a");
  EXPECT_EQ(RootPath("/x.lock"), "/a/x.lock");
  SetRoot("/b/");
  EXPECT_EQ(RootPath("/x.lock"), "/b/x.lock");
  SetRoot(nullptr);
  EXPECT_EQ(RootPath("/x.lock"), "/x.lock");
}

}  // namespace
}  // namespace vellis
