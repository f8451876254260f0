#include "daemons/common/server_loop.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <atomic>
#include <condition_variable>
#include <cstring>
#include <memory>
#include <mutex>
#include <thread>
#include <vector>

#include "common/error.h"
#include "common/json_util.h"
#include "daemons/common/process.h"
#include "sdk/domain_socket.h"
#include "sdk/frame.h"
#include "sdk/socket_io.h"
#include "tests/support/fake_platform.h"
#include "tests/support/temp_root.h"

namespace vellis::daemon {
namespace {

using testing::FakePlatform;
using testing::ScopedPlatform;
using testing::TempRoot;

std::string Header(uint32_t length) { return sdk::EncodeFrameHeader(length); }
std::string Frame(const std::string& text) { return Header(text.size()) + text; }

// A raw client of the loop, read without blocking so that the test thread
// can step the loop in between.
class Client {
 public:
  explicit Client(const std::string& path) {
    sockaddr_un addr{};
    addr.sun_family = AF_UNIX;
    strncpy(addr.sun_path, path.c_str(), sizeof(addr.sun_path) - 1);
    fd_ = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    connected_ = connect(fd_, reinterpret_cast<sockaddr*>(&addr), sizeof(addr)) == 0;
  }
  ~Client() { Close(); }
  void Close() {
    if (fd_ >= 0) close(fd_);
    fd_ = -1;
  }
  bool connected() const { return connected_; }
  int fd() const { return fd_; }
  void Send(const std::string& bytes) {
    ASSERT_EQ(send(fd_, bytes.data(), bytes.size(), MSG_NOSIGNAL),
              static_cast<ssize_t>(bytes.size()));
  }
  // Takes what has arrived; true once the answer is whole or the server
  // has closed the connection.
  bool Poll() {
    char buf[65536];
    while (!ended_ && reader_.state() == sdk::FrameReader::State::kNeedMore) {
      ssize_t n = recv(fd_, buf, sizeof(buf), MSG_DONTWAIT);
      if (n < 0 && errno == EAGAIN) return false;
      if (n <= 0) {
        ended_ = true;
        break;
      }
      reader_.Feed(buf, static_cast<size_t>(n));
    }
    return true;
  }
  bool answered() const { return reader_.state() == sdk::FrameReader::State::kComplete; }
  bool closed_without_answer() const { return ended_ && !reader_.started(); }
  const std::string& answer() const { return reader_.message(); }

 private:
  int fd_ = -1;
  bool connected_ = false;
  bool ended_ = false;
  sdk::FrameReader reader_;
};

class ServerLoopTest : public ::testing::Test {
 protected:
  ServerLoopTest() {
    options_.socket_path = root_.Path("/var/run/test.sock");
    options_.log_name = "testd";
    options_.request_timeout_ms = 5000;
    options_.answer_timeout_ms = 5000;
    options_.workers = 2;
    options_.idle_after_ms = 0;
  }
  ~ServerLoopTest() override { loop_.reset(); }

  // The handler answers {"echo": <request>, "uid", "gid", "pid"}; a request
  // "block" waits until Release().
  void Start(ServerLoop::Upkeep upkeep = nullptr) {
    loop_ = std::make_unique<ServerLoop>(
        options_,
        [this](const Request& r) {
          ++handled_;
          if (r.text == "\"block\"") {
            std::unique_lock<std::mutex> lock(mu_);
            cv_.wait(lock, [this] { return released_; });
          }
          if (r.text == "\"big\"") return std::string(8 << 20, ' ') + "{}";
          Json::Value a(Json::objectValue);
          a["echo"] = r.text;
          a["uid"] = static_cast<Json::UInt>(r.peer.uid);
          a["gid"] = static_cast<Json::UInt>(r.peer.gid);
          a["pid"] = static_cast<Json::Int>(r.peer.pid);
          return JsonToString(a);
        },
        std::move(upkeep), [this] { return now_ms_; });
    loop_->Listen();
  }
  void Release() {
    std::lock_guard<std::mutex> lock(mu_);
    released_ = true;
    cv_.notify_all();
  }

  // Steps the loop until every client has its answer or was closed (at most
  // 5 s of real time).
  void StepUntilDone(std::vector<Client*> clients) {
    for (int i = 0; i < 500; ++i) {
      loop_->Step(10);
      bool all = true;
      for (Client* c : clients) all = c->Poll() && all;
      if (all) return;
    }
    ADD_FAILURE() << "clients still waiting";
  }
  // Steps until the loop holds `open` connections (at most 5 s of real
  // time): workers close finished connections, and the loop forgets them on
  // a later round.
  void StepUntilOpen(size_t open) {
    for (int i = 0; i < 500 && loop_->stats().open != open; ++i) loop_->Step(10);
  }
  // Steps for about `ms` of real time without waiting for anything.
  void StepFor(int ms) {
    for (int i = 0; i < ms / 10; ++i) loop_->Step(10);
  }

  TempRoot root_;
  FakePlatform platform_;
  ScopedPlatform scoped_{&platform_};
  ServerOptions options_;
  int64_t now_ms_ = 1000000;
  std::atomic<int> handled_{0};
  std::mutex mu_;
  std::condition_variable cv_;
  bool released_ = false;
  std::unique_ptr<ServerLoop> loop_;
};

TEST_F(ServerLoopTest, AnswersEachRequestWithThePeersCredentials) {
  Start();
  Client a(options_.socket_path), b(options_.socket_path);
  a.Send(Frame("\"first\""));
  b.Send(Frame("\"second\""));
  StepUntilDone({&a, &b});
  ASSERT_TRUE(a.answered() && b.answered());
  Json::Value answer;
  ASSERT_TRUE(JsonFromString(answer, a.answer())) << a.answer();
  EXPECT_EQ(answer["echo"].asString(), "\"first\"");
  EXPECT_EQ(answer["uid"].asUInt(), getuid());
  EXPECT_EQ(answer["gid"].asUInt(), getgid());
  EXPECT_EQ(answer["pid"].asInt(), getpid());
  EXPECT_NE(b.answer().find("second"), std::string::npos);
  StepUntilOpen(0);
  EXPECT_EQ(loop_->stats().answered, 2u);
  EXPECT_EQ(loop_->stats().open, 0u) << "one request per connection";
}

TEST_F(ServerLoopTest, ListenReplacesOnlyASocketFile) {
  testing::WriteFile(options_.socket_path, "not a socket");
  EXPECT_THROW(Start(), Error) << "a regular file at the socket path is not replaced";
}

TEST_F(ServerLoopTest, BadFramesCloseTheConnectionWithoutReachingTheHandler) {
  Start();
  const struct {
    const char* what;
    std::string bytes;
    bool close_after;
    const char* logged;
  } cases[] = {
      {"length 0", Header(0), false, "length is 0"},
      {"length 0xFFFFFFFF", Header(0xFFFFFFFFu) + "{}", false, "above the maximum"},
      {"length above the cap", Header(sdk::kMaxMessageSize + 1), false, "above the maximum"},
      {"byte-swapped length", Header(__builtin_bswap32(100u)) + "{\"a\": 12}", false,
       "above the maximum"},
      {"end of stream mid-frame", Header(100) + "{\"command\"", true,
       "connection lost inside a message after 14 bytes"},
      {"half a length, then end", std::string("\x05\x00", 2), true, "after 2 bytes"},
  };
  for (const auto& c : cases) {
    platform_.ClearLogs();
    Client client(options_.socket_path);
    client.Send(c.bytes);
    if (c.close_after) shutdown(client.fd(), SHUT_WR);
    StepUntilDone({&client});
    EXPECT_TRUE(client.closed_without_answer()) << c.what;
    EXPECT_EQ(platform_.LogsContaining(c.logged).size(), 1u) << c.what;
  }
  EXPECT_EQ(handled_, 0);
  EXPECT_EQ(loop_->stats().dropped, std::size(cases));
  Client good(options_.socket_path);
  good.Send(Frame("\"after\""));
  StepUntilDone({&good});
  EXPECT_TRUE(good.answered()) << "the loop still serves";
}

TEST_F(ServerLoopTest, ClientSendingAByteASecondIsDroppedAtItsDeadline) {
  Start();
  Client slow(options_.socket_path);
  const std::string request = Frame("\"a slow request\"");
  size_t others = 0;
  for (size_t i = 0; i < request.size() && !slow.Poll(); ++i, ++others) {
    slow.Send(request.substr(i, 1));
    now_ms_ += 1000;  // one byte a second
    Client other(options_.socket_path);
    other.Send(Frame("\"other\""));
    StepUntilDone({&other});
    EXPECT_TRUE(other.answered()) << "second " << i;
  }
  StepUntilDone({&slow});
  StepUntilOpen(0);
  EXPECT_TRUE(slow.closed_without_answer());
  EXPECT_EQ(platform_.LogsContaining(" bytes in 5000 ms, not a whole message").size(), 1u);
  EXPECT_EQ(loop_->stats().timed_out, 1u);
  EXPECT_EQ(loop_->stats().answered, others);
  EXPECT_GE(others, 5u);
}

TEST_F(ServerLoopTest, ClientThatNeverReadsItsAnswerIsDroppedAtTheAnswerDeadline) {
  Start();
  Client greedy(options_.socket_path);
  greedy.Send(Frame("\"big\""));  // 8 MiB: more than the socket takes at once
  StepFor(300);
  Client other(options_.socket_path);
  other.Send(Frame("\"other\""));
  StepUntilDone({&other});
  EXPECT_TRUE(other.answered()) << "a stuck answer holds up nobody";
  StepUntilOpen(1);
  EXPECT_EQ(loop_->stats().open, 1u) << "the greedy client still waits for its answer";
  now_ms_ += options_.answer_timeout_ms;
  loop_->Step(0);
  EXPECT_EQ(loop_->stats().open, 0u);
  EXPECT_EQ(platform_.LogsContaining("answer not delivered: the client took").size(), 1u);
}

// A long request runs on a worker while the loop serves others; its client
// may leave before the answer, which then costs no signal.
TEST_F(ServerLoopTest, LongRequestsRunBesideTheLoop) {
  signal(SIGPIPE, SIG_DFL);  // a SIGPIPE would end this test binary
  Start();
  auto slow = std::make_unique<Client>(options_.socket_path);
  slow->Send(Frame("\"block\""));
  Client quick(options_.socket_path);
  quick.Send(Frame("\"quick\""));
  StepUntilDone({&quick});
  EXPECT_TRUE(quick.answered()) << "answered while the first request still runs";
  EXPECT_FALSE(slow->Poll());
  slow.reset();
  Release();
  StepFor(100);
  Client next(options_.socket_path);
  next.Send(Frame("\"next\""));
  StepUntilDone({&next});
  EXPECT_TRUE(next.answered());
  StepUntilOpen(0);
  EXPECT_EQ(loop_->stats().answered, 2u);
}

TEST_F(ServerLoopTest, OverTheCapTheOldestIdleConnectionGoesThenNewOnesAreRefused) {
  options_.max_connections = 3;
  Start();
  Client a(options_.socket_path), b(options_.socket_path), c(options_.socket_path);
  StepFor(50);
  Client d(options_.socket_path);
  StepFor(50);
  EXPECT_TRUE(a.Poll() && a.closed_without_answer()) << "the oldest idle connection";
  EXPECT_FALSE(b.Poll());
  EXPECT_EQ(loop_->stats().evicted, 1u);
  // None idle: each has sent part of a request.
  for (Client* busy : {&b, &c, &d}) busy->Send(Header(10));
  StepFor(50);
  Client e(options_.socket_path);
  StepFor(50);
  EXPECT_TRUE(e.Poll() && e.closed_without_answer());
  EXPECT_EQ(loop_->stats().refused, 1u);
  EXPECT_EQ(platform_.LogsContaining("refused a connection: 3 connections open").size(), 1u);
  d.Send("\"complete\"");
  StepUntilDone({&d});
  EXPECT_TRUE(d.answered()) << "the connections kept are served";
}

TEST_F(ServerLoopTest, UpkeepRunsWhenQuietUntilItIsDone) {
  options_.idle_after_ms = 1000;
  std::atomic<int> steps{0};
  Start([&steps] { return ++steps < 3; });
  StepFor(50);
  EXPECT_EQ(steps, 0) << "not before a quiet second";
  now_ms_ += 1000;
  for (int i = 0; i < 100 && steps < 3; ++i) loop_->Step(10);
  EXPECT_EQ(steps, 3) << "steps follow each other while more remains";
  StepFor(50);
  EXPECT_EQ(steps, 3) << "done until the next quiet second";
  Client c(options_.socket_path);
  c.Send(Frame("\"wake\""));
  StepUntilDone({&c});
  now_ms_ += 1000;
  for (int i = 0; i < 100 && steps < 4; ++i) loop_->Step(10);
  EXPECT_EQ(steps, 4);
}

// The loop as daemons run it: its own thread, the real clock.
class ServerLoopRunTest : public ServerLoopTest {
 protected:
  void Run() {
    ASSERT_EQ(pipe2(stop_, O_CLOEXEC), 0);
    thread_ = std::thread([this] { loop_->Run(stop_[0]); });
  }
  void Stop() {
    ASSERT_EQ(write(stop_[1], "x", 1), 1);
    thread_.join();
    close(stop_[0]);
    close(stop_[1]);
  }
  int stop_[2] = {-1, -1};
  std::thread thread_;
};

TEST_F(ServerLoopRunTest, ThousandIdleConnectionsDelayNoRequest) {
  RaiseDescriptorLimit();
  rlimit limit;
  ASSERT_EQ(getrlimit(RLIMIT_NOFILE, &limit), 0);
  if (limit.rlim_cur < 2200) GTEST_SKIP() << "needs 2,200 descriptors, has " << limit.rlim_cur;
  options_.request_timeout_ms = 60 * 1000;
  Start();
  Run();
  std::vector<std::unique_ptr<Client>> idle;
  for (int i = 0; i < 1000; ++i) {
    idle.push_back(std::make_unique<Client>(options_.socket_path));
    ASSERT_TRUE(idle.back()->connected()) << i;
  }
  // The old design (a thread per connection read) would wait out the idle
  // connections' time-outs here: 60 s.
  EXPECT_NE(sdk::ExchangeText(options_.socket_path, "\"hello\"", 5000).find("hello"),
            std::string::npos);
  Stop();
}

TEST_F(ServerLoopRunTest, StopAnswersRequestsReceivedAndClosesIdleConnections) {
  Start();
  Run();
  Client idle(options_.socket_path);
  Client working(options_.socket_path);
  working.Send(Frame("\"block\""));
  while (handled_ == 0) std::this_thread::sleep_for(std::chrono::milliseconds(5));
  std::thread stopper([this] { Stop(); });
  std::this_thread::sleep_for(std::chrono::milliseconds(100));
  Release();
  stopper.join();
  std::string why;
  std::string answer;
  EXPECT_EQ(sdk::ReadFrame(working.fd(), &answer, sdk::DeadlineAfter(2000), &why).status,
            sdk::IoStatus::kOk);
  EXPECT_EQ(sdk::ReadFrame(idle.fd(), &answer, sdk::DeadlineAfter(2000), &why).status,
            sdk::IoStatus::kClosed);
  Client late(options_.socket_path);
  late.Send(Frame("\"late\""));
  EXPECT_FALSE(late.Poll() && late.answered()) << "no connection is served after the stop";
  loop_.reset();
  EXPECT_NE(access(options_.socket_path.c_str(), F_OK), 0) << "socket file removed";
}

}  // namespace
}  // namespace vellis::daemon
