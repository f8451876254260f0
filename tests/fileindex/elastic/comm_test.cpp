#include "fileindex/elastic/comm.h"

#include <gtest/gtest.h>

#include <memory>

#include "common/json_util.h"
#include "common/root_path.h"
#include "sdk/frame.h"
#include "tests/support/fake_search_daemon.h"
#include "tests/support/parse_json.h"
#include "tests/support/scripted_platform.h"
#include "tests/support/temp_root.h"

namespace vellis {
namespace {

using testing::FakeSearchDaemon;

using testing::ParseJson;

class SendRequestImplTest : public ::testing::Test {
 protected:
  void SetUp() override { old_timeouts_ = TEST_SetRequestTimeouts({100, 100}); }
  void TearDown() override { TEST_SetRequestTimeouts(old_timeouts_); }

  // A fresh daemon each time (the old one removes its socket file first).
  FakeSearchDaemon& StartDaemon() {
    daemon_.reset();
    daemon_ = std::make_unique<FakeSearchDaemon>(RootPath(kElasticSocketPath));
    return *daemon_;
  }

  testing::TempRoot root_;
  testing::ScriptedPlatform platform_;
  testing::ScopedPlatform scoped_{&platform_};
  std::unique_ptr<FakeSearchDaemon> daemon_;
  RequestTimeouts old_timeouts_{};
  Json::Value req_ = ParseJson(R"({"command":"commit","data":{"id":"fileindex_music"}})");
};

TEST_F(SendRequestImplTest, WaitsForASocketThatAppearsAfterThreeSeconds) {
  platform_.SetOnSleep([this](unsigned, size_t sleeps) {
    if (sleeps == 3) StartDaemon();
  });
  Json::Value res;
  SendRequestImpl(res, req_);
  EXPECT_EQ(res, ParseJson(R"({"success":true})"));
  EXPECT_EQ(platform_.Sleeps(), (std::vector<unsigned>{1, 1, 1}));
  auto waits = platform_.LogsContaining("elastic socket is not ready, retry ... ");
  ASSERT_EQ(waits.size(), 3u);
  for (size_t i = 0; i < waits.size(); ++i) {
    EXPECT_NE(waits[i].find("comm.cpp:"), std::string::npos) << waits[i];
    EXPECT_NE(waits[i].find("retry ... " + std::to_string(i + 1)), std::string::npos) << waits[i];
  }
  ASSERT_EQ(daemon_->Requests().size(), 1u);
  EXPECT_EQ(daemon_->Requests()[0], req_);
}

TEST_F(SendRequestImplTest, GivesUpWaitingAfterFifteenSecondsAndFailsToConnect) {
  Json::Value res;
  try {
    SendRequestImpl(res, req_);
    FAIL() << "no daemon, yet no error";
  } catch (const Error& e) {
    EXPECT_EQ(e.GetCode(), kErrDaemonUnreachable);
    EXPECT_STREQ(e.what(), "Connect failed");
  }
  EXPECT_EQ(platform_.Sleeps(), std::vector<unsigned>(15, 1));
  auto waits = platform_.LogsContaining("elastic socket is not ready, retry ... ");
  ASSERT_EQ(waits.size(), 15u);
  EXPECT_NE(waits.back().find("retry ... 15"), std::string::npos) << waits.back();
  EXPECT_EQ(platform_.LogsContaining("Failed [!conn.Connect()], reason: Connect failed").size(),
            1u);
}

TEST_F(SendRequestImplTest, ReturnsTheWholeAnswer) {
  for (const char* answer :
       {R"({"success":true})", R"({"success":true,"data":[{"QORUMDPath":"/v/s/a"}]})"}) {
    StartDaemon().Push(FakeSearchDaemon::Raw(answer));
    Json::Value res;
    SendRequestImpl(res, req_);
    EXPECT_EQ(res, ParseJson(answer)) << answer;
  }
  EXPECT_TRUE(platform_.Sleeps().empty());
}

TEST_F(SendRequestImplTest, RefusesBadAnswersWithAClearError) {
  struct Case {
    FakeSearchDaemon::Reply reply;
    int code;
    std::string reason;
  } cases[] = {
      {FakeSearchDaemon::Raw("not json"), 913, "Recv failed, res=not json"},
      {FakeSearchDaemon::Raw(std::string(10000, 'x')), 913,
       "Recv failed, res=" + std::string(4096, 'x') + "...(10000 bytes)"},
      {FakeSearchDaemon::Raw(R"({"data":1})"), 913, R"(Recv failed, res={"data":1})"},
      {FakeSearchDaemon::Raw(R"({"success":"yes"})"), 913, R"(Recv failed, res={"success":"yes"})"},
      {FakeSearchDaemon::Raw("[true]"), 913, "Recv failed, res=[true]"},
      {FakeSearchDaemon::Raw(R"({"success":true} x)"), 913,
       R"(Recv failed, res={"success":true} x)"},
      {FakeSearchDaemon::HeaderOnly(sdk::kMaxMessageSize + 1), 913, "Recv failed, res="},
      {FakeSearchDaemon::HeaderOnly(0), 913, "Recv failed, res="},
      {FakeSearchDaemon::CloseMidMessage(100, R"({"succ)"), 913, "Recv failed, res="},
      {FakeSearchDaemon::CloseEarly(), 913, "Recv failed, res="},
      {FakeSearchDaemon::Silence(), 913, "Recv failed, res="},
      {FakeSearchDaemon::Trickle(R"({"success":true})", 40), 913, "Recv failed, res="},
      {FakeSearchDaemon::Failure(5, "no such index"), 5, "Request failed, msg=no such index"},
      {FakeSearchDaemon::Busy(1401), 1401, "Request failed, msg=busy"},
      {FakeSearchDaemon::Raw(R"({"success":false})"), 120, "Missing property: error"},
      {FakeSearchDaemon::Raw(R"({"success":false,"error":{"msg":"m"}})"), 120,
       "Missing property: code"},
      {FakeSearchDaemon::Raw(R"({"success":false,"error":{"code":7}})"), 120,
       "Missing property: msg"},
  };
  for (const auto& c : cases) {
    StartDaemon().Push(c.reply);
    Json::Value res;
    try {
      SendRequestImpl(res, req_);
      ADD_FAILURE() << "no error for " << c.reason;
    } catch (const Error& e) {
      EXPECT_EQ(e.GetCode(), c.code) << c.reason;
      EXPECT_EQ(std::string(e.what()).substr(0, c.reason.size()), c.reason);
    }
  }
  EXPECT_EQ(platform_.LogsContaining("above the maximum").size(), 1u);
  EXPECT_EQ(platform_.LogsContaining("receive timed out").size(), 2u);
}

TEST_F(SendRequestImplTest, CompoundAnswerThrowsOnBusySubRequestAfterLoggingOthers) {
  Json::Value req = ParseJson(R"({"compound":[
      {"command":"document_set_by_id","data":{"id":"fileindex_s","doc_id":"/v/s/a"}},
      {"command":"document_set_by_id","data":{"id":"fileindex_s","doc_id":"/v/s/b"}},
      {"command":"document_set_by_id","data":{"id":"fileindex_s","doc_id":"/v/s/c"}}]})");
  StartDaemon().Push(FakeSearchDaemon::Raw(R"({"success":true,"has_fail":true,"data":[
      {"success":false,"error":{"code":5,"msg":"bad doc"}},
      {"success":false,"error":{"code":1400,"msg":"queue full"}},
      {"success":false,"error":{"code":6,"msg":"never reached"}}]})"));
  Json::Value res;
  try {
    SendRequestImpl(res, req);
    FAIL() << "busy sub-request not reported";
  } catch (const Error& e) {
    EXPECT_EQ(e.GetCode(), 1400);
    EXPECT_STREQ(e.what(), "queue full");
  }
  auto logged = platform_.LogsContaining("Compound failed: ");
  ASSERT_EQ(logged.size(), 1u);
  EXPECT_NE(logged[0].find("(SendRequestImpl) Compound failed: " +
                           JsonToString(req["compound"][0]) + " (5) bad doc"),
            std::string::npos)
      << logged[0];
}

TEST_F(SendRequestImplTest, CompoundAnswerWithOtherFailuresSucceeds) {
  Json::Value req =
      ParseJson(R"({"compound":[{"command":"a","data":{}},{"command":"b","data":{}}]})");
  const std::string failed = R"([{"success":false,"error":{"code":5,"msg":"x"}},
                                {"success":false,"error":{"code":6,"msg":"y"}}])";
  struct Case {
    std::string answer;
    const Json::Value& request;
    size_t logged;
  } cases[] = {
      {R"({"success":true,"has_fail":true,"data":)" + failed + "}", req, 2},
      {R"({"success":true,"has_fail":false,"data":)" + failed + "}", req, 0},
      {R"({"success":true,"data":)" + failed + "}", req, 0},
      {R"({"success":true,"has_fail":true,"data":)" + failed + "}", req_, 0},  // not compound
  };
  for (const auto& c : cases) {
    platform_.ClearLogs();
    StartDaemon().Push(FakeSearchDaemon::Raw(c.answer));
    Json::Value res;
    EXPECT_NO_THROW(SendRequestImpl(res, c.request)) << c.answer;
    EXPECT_EQ(res, ParseJson(c.answer));
    EXPECT_EQ(platform_.LogsContaining("Compound failed").size(), c.logged) << c.answer;
  }
}

TEST_F(SendRequestImplTest, CompoundAnswerWithoutDataArrayIsRefused) {
  Json::Value req = ParseJson(R"({"compound":[]})");
  StartDaemon().Push(FakeSearchDaemon::Raw(R"({"success":true,"has_fail":true,"data":{}})"));
  Json::Value res;
  try {
    SendRequestImpl(res, req);
    FAIL() << "accepted";
  } catch (const Error& e) {
    EXPECT_EQ(e.GetCode(), kErrDaemonUnreachable);
    EXPECT_NE(std::string(e.what()).find("without data array"), std::string::npos) << e.what();
  }
}

}  // namespace
}  // namespace vellis
