#include "fileindex/elastic/communication.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <unistd.h>

#include <memory>

#include "common/root_path.h"
#include "sdk/frame.h"
#include "tests/support/fake_daemon.h"
#include "tests/support/parse_json.h"
#include "tests/support/scripted_platform.h"
#include "tests/support/temp_root.h"
#include "tests/support/thrown.h"

namespace vellis::fileindex {
namespace {

using testing::FakeDaemon;
using testing::ParseJson;
using ::testing::StartsWith;

class SendCommandTest : public ::testing::Test {
 protected:
  SendCommandTest() : old_(TEST_SetCommandTimeouts({100, 100})) {}
  ~SendCommandTest() override { TEST_SetCommandTimeouts(old_); }

  // "<code> <reason>" of what sending `data` throws.
  static std::string Thrown(const Json::Value& data = Json::Value()) {
    return testing::Thrown([&] { SendCommandToDaemon("pause", data); });
  }

  testing::TempRoot root_;
  testing::ScriptedPlatform platform_;
  testing::ScopedPlatform scoped_{&platform_};
  std::unique_ptr<FakeDaemon> daemon_ =
      std::make_unique<FakeDaemon>(RootPath(kFileIndexDaemonSocketPath));
  CommandTimeouts old_;
};

TEST_F(SendCommandTest, DeliversCommandsAndReturnsTheAnswerText) {
  daemon_->Push(FakeDaemon::Raw(R"({"success":false} )"));
  EXPECT_EQ(SendCommandToDaemon("pause", ParseJson(R"({"resume_time":1700007200})")),
            R"({"success":false} )");
  EXPECT_EQ(SendCommandToDaemon("resume", Json::Value()), R"({"success":true})");
  SendCommandToDaemon("worker_create", Json::Value("music"));
  const Json::Value sent = ParseJson(R"([{"type":"pause","data":{"resume_time":1700007200}},
      {"type":"resume","data":null},{"type":"worker_create","data":"music"}])");
  EXPECT_EQ(daemon_->Commands(), std::vector<Json::Value>(sent.begin(), sent.end()));
  EXPECT_TRUE(platform_.Sleeps().empty());
}

TEST_F(SendCommandTest, ConnectIsRetriedFiveTimesOnlyWhileTheSocketIsMissing) {
  daemon_.reset();
  EXPECT_THAT(Thrown(), StartsWith("502 write failed, reason="));
  EXPECT_EQ(platform_.Sleeps(), std::vector<unsigned>(4, 1));

  // A daemon whose socket appears during the waits is reached.
  platform_.SetOnSleep([this](unsigned, size_t sleeps) {
    if (sleeps == 6) daemon_ = std::make_unique<FakeDaemon>(RootPath(kFileIndexDaemonSocketPath));
  });
  EXPECT_EQ(SendCommandToDaemon("resume", Json::Value()), R"({"success":true})");
  EXPECT_EQ(platform_.Sleeps().size(), 6u);
  EXPECT_EQ(daemon_->Commands().size(), 1u);

  // Any other connect error ends the attempts at once.
  daemon_.reset();
  testing::WriteFile(RootPath(kFileIndexDaemonSocketPath), "");  // not a socket
  EXPECT_THAT(Thrown(), StartsWith("502 write failed, reason="));
  EXPECT_EQ(platform_.Sleeps().size(), 6u);
}

TEST_F(SendCommandTest, TransferFailuresAreErrors) {
  struct Case {
    FakeDaemon::Reply reply;
    std::string thrown;
  } cases[] = {
      {{"", false, 0, false}, "502 write failed, reason=Resource temporarily unavailable"},
      {{sdk::EncodeFrameHeader(0), true}, "502 bad answer: announced message length is 0"},
      {{sdk::EncodeFrameHeader(0xFFFFFFFFu), true},
       "502 bad answer: announced message length 4294967295"},
      {{sdk::EncodeFrameHeader(100) + "{\"succ", true}, "502 read failed, reason=end of stream"},
      {{"", true}, "502 read failed, reason=end of stream"},
      {{""}, "502 read failed, reason=Resource temporarily unavailable"},
  };
  for (const auto& c : cases) {
    daemon_->Push(c.reply);
    // A command the daemon does not read fills the socket buffer.
    const Json::Value data = c.reply.read ? Json::Value() : Json::Value(std::string(4 << 20, 'x'));
    EXPECT_THAT(Thrown(data), StartsWith(c.thrown));
  }
  EXPECT_EQ(daemon_->Commands().size(), std::size(cases) - 1);
}

TEST(BufferTest, WritesInPiecesOfAtMost1024Bytes) {
  int fds[2];
  ASSERT_EQ(socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, fds), 0);
  const std::vector<unsigned char> data(3000, 'a');
  BufferWrite(fds[0], 0, data.data());
  BufferWrite(fds[0], 3000, data.data());
  // Each packet of a SOCK_SEQPACKET socket is one write.
  std::vector<ssize_t> pieces;
  char buf[4096];
  for (ssize_t n; (n = recv(fds[1], buf, sizeof(buf), MSG_DONTWAIT)) > 0;) pieces.push_back(n);
  EXPECT_EQ(pieces, (std::vector<ssize_t>{1024, 1024, 952}));
  close(fds[0]);
  close(fds[1]);
}

TEST(BufferTest, ReadsExactlyAndFailsOnEarlyEndOrClosedPeer) {
  testing::FakePlatform platform;
  testing::ScopedPlatform scoped(&platform);
  int fds[2];
  ASSERT_EQ(socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, fds), 0);
  const std::string data = std::string(2500, 'b') + "tail";
  ASSERT_EQ(write(fds[1], data.data(), data.size()), static_cast<ssize_t>(data.size()));
  std::string got(2500, '\0');
  auto* buf = reinterpret_cast<unsigned char*>(&got[0]);
  BufferRead(fds[0], 0, buf);
  BufferRead(fds[0], 2500, buf);
  EXPECT_EQ(got, std::string(2500, 'b'));
  close(fds[1]);
  EXPECT_EQ(testing::Thrown([&] { BufferRead(fds[0], 10, buf); }),
            "502 read failed, reason=end of stream");
  // Writing to the closed peer fails without SIGPIPE.
  EXPECT_EQ(testing::Thrown([&] { BufferWrite(fds[0], 4, buf); }),
            "502 write failed, reason=Broken pipe");
  close(fds[0]);
}

}  // namespace
}  // namespace vellis::fileindex
