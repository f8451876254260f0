#include "fileindex/elastic/comm.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <memory>

#include "common/json_util.h"
#include "common/root_path.h"
#include "sdk/frame.h"
#include "tests/support/fake_daemon.h"
#include "tests/support/parse_json.h"
#include "tests/support/scripted_platform.h"
#include "tests/support/temp_root.h"
#include "tests/support/thrown.h"

namespace vellis {
namespace {

using testing::FakeDaemon;
using ::testing::HasSubstr;
using testing::ParseJson;

class SendRequestImplTest : public ::testing::Test {
 protected:
  SendRequestImplTest() : old_timeouts_(TEST_SetRequestTimeouts({100, 100})) {}
  ~SendRequestImplTest() override { TEST_SetRequestTimeouts(old_timeouts_); }

  // "<code> <reason>" of what SendRequestImpl throws; the answer goes to res_.
  std::string Send(const Json::Value& req) {
    return testing::Thrown([&] { SendRequestImpl(res_, req); });
  }
  void StartDaemon() { daemon_ = std::make_unique<FakeDaemon>(RootPath(kElasticSocketPath)); }

  testing::TempRoot root_;
  testing::ScriptedPlatform platform_;
  testing::ScopedPlatform scoped_{&platform_};
  std::unique_ptr<FakeDaemon> daemon_ = std::make_unique<FakeDaemon>(RootPath(kElasticSocketPath));
  RequestTimeouts old_timeouts_;
  Json::Value req_ = ParseJson(R"({"command":"commit","data":{"id":"fileindex_music"}})");
  Json::Value res_;
};

TEST_F(SendRequestImplTest, WaitsUpToFifteenSecondsForTheSocketThenConnectsAnyway) {
  daemon_.reset();
  EXPECT_EQ(Send(req_), "913 Connect failed");
  EXPECT_EQ(platform_.Sleeps(), std::vector<unsigned>(15, 1));
  auto waits = platform_.LogsContaining("elastic socket is not ready, retry ... ");
  ASSERT_EQ(waits.size(), 15u);
  for (size_t i = 0; i < waits.size(); ++i) {
    EXPECT_THAT(waits[i], HasSubstr("comm.cpp:"));
    EXPECT_THAT(waits[i], HasSubstr("retry ... " + std::to_string(i + 1)));
  }
  // A socket that appears during the third wait of the next call is used.
  platform_.SetOnSleep([this](unsigned, size_t sleeps) {
    if (sleeps != 18) return;
    StartDaemon();
    daemon_->Push(FakeDaemon::Success(ParseJson(R"([{"QORUMDPath":"/v/s/a"}])")));
  });
  EXPECT_EQ(Send(req_), "no error");
  EXPECT_EQ(res_, ParseJson(R"({"success":true,"data":[{"QORUMDPath":"/v/s/a"}]})"));
  EXPECT_EQ(daemon_->Requests(), std::vector<Json::Value>{req_});
  EXPECT_EQ(platform_.Sleeps().size(), 18u);
}

TEST_F(SendRequestImplTest, RefusesAnswersThatAreNotWholeJsonObjectsWithBoolSuccess) {
  const std::string ok = R"({"success":true})";
  struct Case {
    FakeDaemon::Reply reply;
    std::string thrown;
  } cases[] = {
      {FakeDaemon::Raw("not json"), "913 Recv failed, res=not json"},
      {FakeDaemon::Raw(std::string(10000, 'x')),
       "913 Recv failed, res=" + std::string(4096, 'x') + "...(10000 bytes)"},
      {FakeDaemon::Raw(R"({"data":1})"), R"(913 Recv failed, res={"data":1})"},
      {FakeDaemon::Raw(R"({"success":"yes"})"), R"(913 Recv failed, res={"success":"yes"})"},
      {FakeDaemon::Raw("[true]"), "913 Recv failed, res=[true]"},
      {FakeDaemon::Raw(ok + " x"), "913 Recv failed, res=" + ok + " x"},
      {{sdk::EncodeFrameHeader(0)}, "913 Recv failed, res="},
      {{sdk::EncodeFrameHeader(100) + R"({"succ)", true}, "913 Recv failed, res="},
      {{"", true}, "913 Recv failed, res="},                              // closed at once
      {{""}, "913 Recv failed, res="},                                    // silent
      {{FakeDaemon::Raw(ok).bytes, false, 40}, "913 Recv failed, res="},  // too slow
      {FakeDaemon::Failure(5, "no such index"), "5 Request failed, msg=no such index"},
      {FakeDaemon::Busy(1401), "1401 Request failed, msg=busy"},
      {FakeDaemon::Raw(R"({"success":false})"),
       R"(120 Missing property: error, data={"success":false})"},
      {FakeDaemon::Raw(R"({"success":false,"error":{"msg":"m"}})"),
       R"(120 Missing property: code, data={"msg":"m"})"},
      {FakeDaemon::Raw(R"({"success":false,"error":{"code":7}})"),
       R"(120 Missing property: msg, data={"code":7})"},
  };
  for (const auto& c : cases) {
    daemon_->Push(c.reply);
    EXPECT_EQ(Send(req_), c.thrown);
  }
  EXPECT_EQ(daemon_->Requests(), std::vector<Json::Value>(std::size(cases), req_));
  EXPECT_EQ(platform_.LogsContaining("receive timed out").size(), 2u) << "silent and too slow";
}

TEST_F(SendRequestImplTest, CompoundAnswerReportsOnlyABusySubRequest) {
  const Json::Value req =
      ParseJson(R"({"compound":[{"command":"a","data":{}},{"command":"b","data":{}}]})");
  const std::string failed = R"([{"success":false,"error":{"code":5,"msg":"x"}},
                                 {"success":false,"error":{"code":1400,"msg":"queue full"}},
                                 {"success":false,"error":{"code":6,"msg":"y"}}])";
  const std::string no_busy = R"([{"success":false,"error":{"code":5,"msg":"x"}},
                                  {"success":false,"error":{"code":6,"msg":"y"}}])";
  struct Case {
    std::string answer;
    const Json::Value& request;
    std::string thrown;
    size_t logged;
  } cases[] = {
      {R"({"success":true,"has_fail":true,"data":)" + failed + "}", req, "1400 queue full", 1},
      {R"({"success":true,"has_fail":true,"data":)" + no_busy + "}", req, "no error", 2},
      {R"({"success":true,"has_fail":false,"data":)" + failed + "}", req, "no error", 0},
      {R"({"success":true,"data":)" + failed + "}", req, "no error", 0},
      {R"({"success":true,"has_fail":true,"data":)" + failed + "}", req_, "no error", 0},
      {R"({"success":true,"has_fail":true,"data":{}})", req,
       R"(913 Compound answer without data array, res={"success":true,"has_fail":true,"data":{}})",
       0},
  };
  for (const auto& c : cases) {
    platform_.ClearLogs();
    daemon_->Push(FakeDaemon::Raw(c.answer));
    EXPECT_EQ(Send(c.request), c.thrown) << c.answer;
    auto logs = platform_.LogsContaining("(SendRequestImpl) Compound failed: ");
    ASSERT_EQ(logs.size(), c.logged) << c.answer;
    for (Json::ArrayIndex i = 0; i < c.logged; ++i) {
      EXPECT_THAT(logs[i], HasSubstr(JsonToString(req["compound"][i]) + (i ? " (6) y" : " (5) x")));
    }
  }
}

}  // namespace
}  // namespace vellis
