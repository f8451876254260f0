#include "daemons/common/peer.h"

#include <gtest/gtest.h>
#include <sys/socket.h>
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

TEST(PeerTest, CredentialsAreTheConnectingProcesss) {
  int fds[2];
  ASSERT_EQ(socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, fds), 0);
  Peer peer = PeerOf(fds[0]);
  EXPECT_EQ(peer.pid, getpid());
  EXPECT_EQ(peer.uid, getuid());
  EXPECT_EQ(peer.gid, getgid());
  close(fds[0]);
  close(fds[1]);
  int pipe_fds[2];
  ASSERT_EQ(pipe(pipe_fds), 0);
  Peer unknown = PeerOf(pipe_fds[0]);  // not a socket: no credentials
  EXPECT_EQ(unknown.uid, static_cast<uid_t>(-1));
  EXPECT_FALSE(IsAdministrator(unknown));
  close(pipe_fds[0]);
  close(pipe_fds[1]);
}

}  // namespace
}  // namespace vellis::daemon
