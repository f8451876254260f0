#include "daemons/common/peer.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <map>
#include <string>

#include "tests/support/fake_platform.h"

namespace vellis::daemon {
namespace {

// Users 1000 "alice" (an administrator) and 1001 "bob".
class UsersPlatform : public testing::FakePlatform {
 public:
  int QORUUserGetByUID(uint32_t uid, sdk::UserInfo* out) override {
    auto it = users_.find(uid);
    if (it == users_.end()) return -1;
    out->name = it->second;
    out->uid = uid;
    return 0;
  }
  int QLIBGroupIsAdminGroupMem(const std::string& user, int) override {
    return user == "alice" ? 1 : 0;
  }

 private:
  std::map<uint32_t, std::string> users_ = {{1000, "alice"}, {1001, "bob"}};
};

TEST(PeerTest, AdministratorsAreRootAndTheAdministratorsGroup) {
  UsersPlatform platform;
  testing::ScopedPlatform scoped(&platform);
  const struct {
    uid_t uid;
    bool admin;
  } cases[] = {
      {0, true}, {1000, true}, {1001, false}, {4242, false}, {static_cast<uid_t>(-1), false},
  };
  for (const auto& c : cases) {
    Peer peer;
    peer.uid = c.uid;
    peer.gid = 100;
    EXPECT_EQ(IsAdministrator(peer), c.admin) << "uid " << c.uid;
  }
}

// The credentials themselves travel with each request (server_loop_test);
// what is not a socket has none, which never passes for root.
TEST(PeerTest, WhatIsNotASocketHasNoCredentials) {
  int fds[2];
  ASSERT_EQ(pipe(fds), 0);
  Peer unknown = PeerOf(fds[0]);
  EXPECT_EQ(unknown.uid, static_cast<uid_t>(-1));
  EXPECT_FALSE(IsAdministrator(unknown));
  close(fds[0]);
  close(fds[1]);
}

}  // namespace
}  // namespace vellis::daemon
