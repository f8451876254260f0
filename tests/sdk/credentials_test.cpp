// Switching the effective user and back, for real (the tests run as root).
#include "sdk/credentials.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <string>

#include "sdk/platform.h"
#include "tests/support/fake_share_platform.h"
#include "tests/support/thrown.h"

namespace vellis::sdk {
namespace {

class CredentialsTest : public ::testing::Test {
 protected:
  void SetUp() override {
    if (geteuid() != 0) GTEST_SKIP() << "switching users needs root";
    ASSERT_EQ(0, platform_.QORUUserGet("nobody", &nobody_));
  }
  void TearDown() override {
    // Whatever a test did, the next one starts as root again.
    ASSERT_TRUE(geteuid() == 0 || platform_.target()->ResetCredentialsByName("root", 1));
  }

  testing::FakeSharePlatform platform_;
  testing::ScopedPlatform scoped_{&platform_};
  UserInfo nobody_;
};

TEST_F(CredentialsTest, SwitchesToTheUserForTheScopeOnlyAndAdministratorsToRoot) {
  { SDKCredentials creds; }
  EXPECT_TRUE(platform_.Resets().empty());
  {
    SDKCredentials creds("nobody");
    EXPECT_EQ(geteuid(), nobody_.uid);
    EXPECT_EQ(getegid(), nobody_.gid);
    // Really unprivileged: root's own folder is closed now, and root's
    // supplementary groups are gone.
    EXPECT_NE(0, faccessat(AT_FDCWD, "/root", W_OK, AT_EACCESS));
    gid_t groups[64];
    int n = getgroups(64, groups);
    EXPECT_EQ(std::count(groups, groups + std::max(n, 0), 0u), 0) << n << " groups";
  }
  EXPECT_EQ(geteuid() + getegid(), 0u);
  platform_.SetAdminMember("nobody", 1);
  {
    SDKCredentials creds("nobody");
    EXPECT_EQ(geteuid(), 0u) << "administrators become root";
  }
  EXPECT_EQ(platform_.Resets(), (std::vector<std::string>{"nobody", "root", "root"}))
      << "no switch back for administrators";
}

TEST_F(CredentialsTest, FailedSwitchIsError503AndKeepsTheIds) {
  platform_.FailCall("ResetCredentialsByName", EPERM, "nobody");
  for (const std::string user : {"no-such-user-vellis", "nobody"}) {
    SDKCredentials creds;
    const std::string thrown = testing::Thrown([&] { creds.AsUser(user); });
    EXPECT_EQ(thrown.rfind("503 ResetCredentialsByName failed, user=" + user, 0), 0u) << thrown;
    EXPECT_EQ(geteuid() + getegid(), 0u) << user;
  }
}

TEST_F(CredentialsTest, FailedSwitchBackIsReportedNotSwallowed) {
  platform_.FailCall("ResetCredentialsByName", EPERM, "root");
  EXPECT_EQ(testing::Thrown([] { SDKCredentials creds("nobody"); }),
            "503 ResetCredentialsByName failed, user=root, err=1");
  EXPECT_EQ(geteuid(), nobody_.uid) << "the failed switch back must leave the foreign user visible";
  EXPECT_EQ(platform_.LogsContaining("Failed [!ResetCredentialsByName(username_)]").size(), 1u);
}

}  // namespace
}  // namespace vellis::sdk
