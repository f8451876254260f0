#include "sdk/domain_socket.h"

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cstring>
#include <memory>
#include <thread>

#include "common/error.h"
#include "common/root_path.h"
#include "sdk/frame.h"
#include "tests/support/fake_platform.h"
#include "tests/support/fake_search_daemon.h"
#include "tests/support/temp_root.h"
#include "tests/support/thrown.h"

namespace vellis::sdk {
namespace {

using testing::FakePlatform;
using testing::FakeSearchDaemon;
using testing::ScopedPlatform;
using testing::Thrown;

class SockConnectionTest : public ::testing::Test {
 protected:
  void SetUp() override {
    int fds[2];
    ASSERT_EQ(socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, fds), 0);
    conn_ = std::make_unique<SockConnection>(fds[0]);
    peer_ = fds[1];
    conn_->SetTimeouts(100, 100);
  }
  void TearDown() override {
    if (peer_ >= 0) close(peer_);
    peer_ = -1;
  }
  void PeerWrite(const std::string& bytes) {
    ASSERT_EQ(write(peer_, bytes.data(), bytes.size()), static_cast<ssize_t>(bytes.size()));
  }
  void ClosePeer() {
    close(peer_);
    peer_ = -1;
  }

  FakePlatform platform_;
  ScopedPlatform scoped_{&platform_};
  std::unique_ptr<SockConnection> conn_;
  int peer_ = -1;
};

TEST_F(SockConnectionTest, FailedReceiveClosesTheConnectionAndSaysWhy) {
  struct Case {
    std::string from_peer;
    bool close_peer;
    std::string logged;
  } cases[] = {
      {EncodeFrameHeader(0), false, "receive refused: announced message length is 0"},
      {EncodeFrameHeader(kMaxMessageSize + 1), false, "above the maximum"},
      {EncodeFrameHeader(0xFFFFFFFFu), false, "above the maximum"},
      {EncodeFrameHeader(100) + "{\"success\":", true, "peer closed the connection after 15 bytes"},
      {"", false, "receive timed out after 100 ms, 0 bytes received"},
  };
  for (const auto& c : cases) {
    TearDown();
    SetUp();
    PeerWrite(c.from_peer);
    if (c.close_peer) ClosePeer();
    std::string message = "old";
    EXPECT_FALSE(conn_->Recv(message)) << c.logged;
    EXPECT_EQ(conn_->fd(), -1) << c.logged;
    EXPECT_LT(message.capacity(), 4096u) << "nothing allocated: " << c.logged;
    EXPECT_EQ(platform_.LogsContaining(c.logged).size(), 1u) << c.logged;
    platform_.ClearLogs();
  }
}

TEST_F(SockConnectionTest, FailedSendClosesTheConnectionWithoutSignal) {
  EXPECT_FALSE(conn_->Send(std::string(8u << 20, 'x'))) << "a peer that never reads";
  EXPECT_EQ(conn_->fd(), -1);
  EXPECT_EQ(platform_.LogsContaining("send timed out after 100 ms").size(), 1u);
  TearDown();
  SetUp();
  ClosePeer();
  EXPECT_FALSE(conn_->Send("{}"));  // SIGPIPE would end the test binary here
  EXPECT_EQ(platform_.LogsContaining("send failed: Broken pipe").size(), 1u);
  EXPECT_FALSE(conn_->Send("{}")) << "a closed connection stays closed";
  TearDown();
  SetUp();
  EXPECT_FALSE(conn_->Send("")) << "an empty message is refused";
  EXPECT_EQ(platform_.LogsContaining("send refused: message length 0").size(), 1u);
}

// A connection is made only where a daemon listens; one request gets one
// answer, or Error 913 naming the step.
TEST(DomainSockConnectionTest, OneRequestOneAnswerOrError913NamingTheStep) {
  FakePlatform platform;
  ScopedPlatform scoped(&platform);
  testing::TempRoot root;
  const std::string path = root.Path("/var/run/x.sock");
  DomainSockConnection too_long("/" + std::string(200, 'a'));
  EXPECT_FALSE(too_long.Connect());
  EXPECT_EQ(errno, ENAMETOOLONG);
  EXPECT_EQ(Thrown([&] { Exchange(path, Json::Value()); }).rfind("913 Connect failed: " + path, 0),
            0u);

  FakeSearchDaemon daemon(path);
  DomainSockConnection conn(path);
  ASSERT_TRUE(conn.Connect());
  std::string answer;
  EXPECT_TRUE(conn.Send("{\"question\":1}") && conn.Recv(answer));
  EXPECT_EQ(answer, "{\"success\":true}");
  conn.Disconnect();
  EXPECT_EQ(conn.fd(), -1);
  EXPECT_EQ(daemon.RawRequests(), std::vector<std::string>{"{\"question\":1}"});
  daemon.Push(FakeSearchDaemon::Raw("{\"success\":true,\"data\":7}"));
  EXPECT_EQ(Exchange(path, Json::Value(Json::objectValue))["data"].asInt(), 7);
  daemon.Push(FakeSearchDaemon::Raw("[1]"));
  EXPECT_EQ(Thrown([&] { Exchange(path, Json::Value()); }), "913 Recv failed, res=[1]");
  daemon.Push({"", /*close=*/true});
  EXPECT_EQ(Thrown([&] { ExchangeText(path, "{}"); }), "913 Recv failed: " + path);
}

TEST(DomainSockConnectionTest, DaemonThatNeverAcceptsIsNotWaitedForForever) {
  testing::FakePlatform platform;
  ScopedPlatform scoped(&platform);
  testing::TempRoot root;
  const std::string path = root.Path("/var/run/stuck.sock");
  sockaddr_un addr{};
  addr.sun_family = AF_UNIX;
  memcpy(addr.sun_path, path.c_str(), path.size() + 1);
  int listener = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  ASSERT_EQ(bind(listener, reinterpret_cast<sockaddr*>(&addr), sizeof(addr)), 0);
  ASSERT_EQ(listen(listener, 0), 0);
  // The accept queue fills up; the next connect would block for good.
  std::vector<std::unique_ptr<DomainSockConnection>> conns;
  bool refused = false;
  for (int i = 0; i < 8 && !refused; ++i) {
    conns.push_back(std::make_unique<DomainSockConnection>(path));
    conns.back()->SetTimeouts(50, 50);
    refused = !conns.back()->Connect();
  }
  EXPECT_TRUE(refused) << "connect never gave up";
  EXPECT_EQ(errno, EAGAIN);
  close(listener);
}

}  // namespace
}  // namespace vellis::sdk
