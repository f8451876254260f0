#include "fileindex/elastic/communication.h"

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <unistd.h>

#include <memory>

#include "common/json_util.h"
#include "common/root_path.h"
#include "sdk/frame.h"
#include "tests/support/fake_index_daemon.h"
#include "tests/support/parse_json.h"
#include "tests/support/scripted_platform.h"
#include "tests/support/temp_root.h"

namespace vellis::fileindex {
namespace {

using testing::FakeIndexDaemon;

using testing::ParseJson;

std::string Frame(const std::string& text) {
  return sdk::EncodeFrameHeader(static_cast<uint32_t>(text.size())) + text;
}

class SendCommandTest : public ::testing::Test {
 protected:
  void SetUp() override { old_ = TEST_SetCommandTimeouts({100, 100}); }
  void TearDown() override { TEST_SetCommandTimeouts(old_); }

  FakeIndexDaemon& StartDaemon() {
    daemon_.reset();
    daemon_ = std::make_unique<FakeIndexDaemon>(RootPath(kFileIndexDaemonSocketPath));
    return *daemon_;
  }

  // The code and reason of the Error that SendCommandToDaemon throws.
  std::pair<int, std::string> FailureOf(const std::string& type, const Json::Value& data) {
    try {
      SendCommandToDaemon(type, data);
    } catch (const Error& e) {
      return {e.GetCode(), e.what()};
    }
    return {0, "no error"};
  }

  testing::TempRoot root_;
  testing::ScriptedPlatform platform_;
  testing::ScopedPlatform scoped_{&platform_};
  std::unique_ptr<FakeIndexDaemon> daemon_;
  CommandTimeouts old_{};
};

TEST_F(SendCommandTest, DeliversCommandsAndReturnsTheAnswer) {
  StartDaemon();
  EXPECT_EQ(SendCommandToDaemon("pause", ParseJson(R"({"resume_time":1700007200})")),
            R"({"success":true})");
  daemon_->SetAnswerBytes(Frame(R"({"success":false})"));
  EXPECT_EQ(SendCommandToDaemon("resume", Json::Value()), R"({"success":false})");
  SendCommandToDaemon("worker_create", Json::Value("music"));
  auto commands = daemon_->Commands();
  ASSERT_EQ(commands.size(), 3u);
  EXPECT_EQ(commands[0], ParseJson(R"({"type":"pause","data":{"resume_time":1700007200}})"));
  EXPECT_EQ(commands[1], ParseJson(R"({"type":"resume","data":null})"));
  EXPECT_EQ(commands[2], ParseJson(R"({"type":"worker_create","data":"music"})"));
  EXPECT_TRUE(platform_.Sleeps().empty());
}

TEST_F(SendCommandTest, MissingDaemonIsTriedFiveTimesThenFailsWhileSending) {
  auto [code, reason] = FailureOf("pause", Json::Value());
  EXPECT_EQ(code, kErrInternal);
  EXPECT_EQ(reason.rfind("write failed, reason=", 0), 0u) << reason;
  EXPECT_EQ(platform_.Sleeps(), (std::vector<unsigned>{1, 1, 1, 1}));

  // A daemon whose socket appears during the waits is reached.
  platform_.SetOnSleep([this](unsigned, size_t sleeps) {
    if (sleeps == 6) StartDaemon();
  });
  EXPECT_EQ(SendCommandToDaemon("resume", Json::Value()), R"({"success":true})");
  EXPECT_EQ(platform_.Sleeps().size(), 6u);
  EXPECT_EQ(daemon_->Commands().size(), 1u);
}

TEST_F(SendCommandTest, DaemonThatNeverReadsIsGivenUpAfterTheSendTimeOut) {
  StartDaemon().SetNeverRead(true);
  auto [code, reason] = FailureOf("notify_setting_changed", Json::Value(std::string(4 << 20, 'x')));
  EXPECT_EQ(code, kErrInternal);
  EXPECT_EQ(reason, "write failed, reason=Resource temporarily unavailable");
}

TEST_F(SendCommandTest, BadAnswersAreClearErrors) {
  struct Case {
    std::string answer;
    std::string reason;
  } cases[] = {
      {sdk::EncodeFrameHeader(0), "bad answer: announced message length is 0"},
      {sdk::EncodeFrameHeader(0xFFFFFFFFu), "bad answer: announced message length 4294967295"},
      {sdk::EncodeFrameHeader(100) + "{\"succ", "read failed, reason=end of stream"},
      {"", "read failed, reason=end of stream"},
  };
  StartDaemon().SetCloseAfterAnswer(true);
  for (const auto& c : cases) {
    daemon_->SetAnswerBytes(c.answer);
    auto [code, reason] = FailureOf("pause", Json::Value());
    EXPECT_EQ(code, kErrInternal) << c.reason;
    EXPECT_EQ(reason.substr(0, c.reason.size()), c.reason);
  }
  EXPECT_EQ(daemon_->Commands().size(), 4u);
}

TEST_F(SendCommandTest, SilentDaemonTimesOut) {
  for (const std::string& answer : {std::string(), sdk::EncodeFrameHeader(10) + "{"}) {
    StartDaemon().SetAnswerBytes(answer);  // then nothing, until the client hangs up
    auto [code, reason] = FailureOf("pause", Json::Value());
    EXPECT_EQ(code, kErrInternal);
    EXPECT_EQ(reason, "read failed, reason=Resource temporarily unavailable") << answer.size();
  }
}

TEST(BufferTest, WritesInPiecesOfAtMost1024Bytes) {
  int fds[2];
  ASSERT_EQ(socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, fds), 0);
  std::string data(3000, 'a');
  BufferWrite(fds[0], 0, reinterpret_cast<const unsigned char*>(data.data()));
  BufferWrite(fds[0], static_cast<unsigned>(data.size()),
              reinterpret_cast<const unsigned char*>(data.data()));
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
  std::string data(2500, 'b');
  data += "tail";
  ASSERT_EQ(write(fds[1], data.data(), data.size()), static_cast<ssize_t>(data.size()));
  std::string got(2500, '\0');
  BufferRead(fds[0], 0, reinterpret_cast<unsigned char*>(&got[0]));
  BufferRead(fds[0], 2500, reinterpret_cast<unsigned char*>(&got[0]));
  EXPECT_EQ(got, std::string(2500, 'b'));
  close(fds[1]);
  try {
    BufferRead(fds[0], 10, reinterpret_cast<unsigned char*>(&got[0]));
    ADD_FAILURE() << "read past the end";
  } catch (const Error& e) {
    EXPECT_EQ(e.GetCode(), kErrInternal);
    EXPECT_STREQ(e.what(), "read failed, reason=end of stream");
  }
  // Writing to the closed peer fails without SIGPIPE.
  EXPECT_THROW(BufferWrite(fds[0], 4, reinterpret_cast<const unsigned char*>("abcd")), Error);
  EXPECT_EQ(platform.LogsContaining("reason: write failed, reason=Broken pipe").size(), 1u);
  close(fds[0]);
}

}  // namespace
}  // namespace vellis::fileindex
