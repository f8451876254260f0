// Switching the effective user and back, for real (the tests run as root).
#include "sdk/credentials.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <cerrno>
#include <string>

#include "common/error.h"
#include "sdk/platform.h"
#include "tests/support/fake_share_platform.h"

namespace vellis::sdk {
namespace {

using testing::FakeSharePlatform;
using testing::ScopedPlatform;

class CredentialsTest : public ::testing::Test {
 protected:
  CredentialsTest() : scoped_(&platform_) {}

  void SetUp() override {
    if (geteuid() != 0) GTEST_SKIP() << "switching users needs root";
    ASSERT_EQ(0, platform_.QORUUserGet("nobody", &nobody_));
  }

  void TearDown() override {
    // Whatever a test did, the next one starts as root again.
    if (geteuid() != 0) {
      ASSERT_TRUE(platform_.target()->ResetCredentialsByName("root", 1));
    }
  }

  FakeSharePlatform platform_;
  ScopedPlatform scoped_;
  UserInfo nobody_;
};

TEST_F(CredentialsTest, ScopeWithoutSwitchTouchesNothing) {
  { SDKCredentials creds; }
  EXPECT_TRUE(platform_.Resets().empty());
  EXPECT_EQ(geteuid(), 0u);
  EXPECT_EQ(getegid(), 0u);
}

TEST_F(CredentialsTest, SwitchesToTheUserAndBack) {
  {
    SDKCredentials creds("nobody");
    EXPECT_EQ(geteuid(), nobody_.uid);
    EXPECT_EQ(getegid(), nobody_.gid);
    // Really unprivileged: root's own folder is closed now, and root's
    // supplementary groups are gone.
    EXPECT_NE(0, faccessat(AT_FDCWD, "/root", W_OK, AT_EACCESS));
    gid_t groups[64];
    int n = getgroups(64, groups);
    ASSERT_GE(n, 0);
    for (int i = 0; i < n; ++i) EXPECT_NE(groups[i], 0u) << "group " << i;
  }
  EXPECT_EQ(geteuid(), 0u);
  EXPECT_EQ(getegid(), 0u);
  EXPECT_EQ(platform_.Resets(), (std::vector<std::string>{"nobody", "root"}));
}

TEST_F(CredentialsTest, AdministratorsBecomeRoot) {
  platform_.SetAdminMember("nobody", 1);
  {
    SDKCredentials creds("nobody");
    EXPECT_EQ(geteuid(), 0u);
  }
  // Nothing changed, so nothing is switched back.
  EXPECT_EQ(platform_.Resets(), (std::vector<std::string>{"root"}));
}

TEST_F(CredentialsTest, FailedSwitchIsError503AndKeepsTheIds) {
  struct Case {
    std::string user;
    bool scripted_failure;
  } cases[] = {{"no-such-user-vellis", false}, {"nobody", true}};
  for (const Case& c : cases) {
    platform_.ClearFailures();
    if (c.scripted_failure) platform_.FailCall("ResetCredentialsByName", EPERM, c.user);
    SDKCredentials creds;
    try {
      creds.AsUser(c.user);
      ADD_FAILURE() << "switched to " << c.user;
    } catch (const Error& e) {
      EXPECT_EQ(e.GetCode(), kErrCredentials) << c.user;
      EXPECT_NE(std::string(e.what()).find("user=" + c.user), std::string::npos) << e.what();
    }
    EXPECT_EQ(geteuid(), 0u) << c.user;
    EXPECT_EQ(getegid(), 0u) << c.user;
  }
}

TEST_F(CredentialsTest, FailedSwitchBackIsReportedNotSwallowed) {
  platform_.FailCall("ResetCredentialsByName", EPERM, "root");
  try {
    SDKCredentials creds("nobody");
  } catch (const Error& e) {
    EXPECT_EQ(e.GetCode(), kErrCredentials);
    EXPECT_EQ(std::string(e.what()), "ResetCredentialsByName failed, user=root, err=1");
  }
  EXPECT_EQ(geteuid(), nobody_.uid) << "the failed switch back must leave the foreign user visible";
  EXPECT_EQ(platform_.LogsContaining("Failed [!ResetCredentialsByName(username_)]").size(), 1u);
}

}  // namespace
}  // namespace vellis::sdk
