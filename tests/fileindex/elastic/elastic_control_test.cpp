#include "fileindex/elastic/elastic_control.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <functional>
#include <tuple>

#include "common/root_path.h"
#include "fileindex/elastic/comm.h"
#include "fileindex/status_mgr.h"
#include "sdk/share.h"
#include "tests/support/fake_daemon.h"
#include "tests/support/parse_json.h"
#include "tests/support/scripted_platform.h"
#include "tests/support/temp_root.h"
#include "tests/support/thrown.h"

namespace vellis::fileindex::elastic {
namespace {

using testing::FakeDaemon;
using ::testing::HasSubstr;
using testing::ParseJson;
using ::testing::StartsWith;
using testing::Thrown;

class ElasticControlTest : public ::testing::Test {
 protected:
  ElasticControlTest() { platform_.AddShare({"music", "/volume1/music"}); }

  // Runs of the administrators' notifier that report a lack of memory.
  int MemoryNotifications() const {
    const std::string note = "error:lack_of_memory";
    int n = 0;
    for (const auto& e : platform_.Execs()) n += std::count(e.args.begin(), e.args.end(), note);
    return n;
  }

  testing::TempRoot root_;
  testing::ScriptedPlatform platform_;
  testing::ScopedPlatform scoped_{&platform_};
  FakeDaemon daemon_{RootPath(kElasticSocketPath)};
  const Json::Value commit_ = ParseJson(R"({"command":"commit","data":{"id":"fileindex_music"}})");
};

TEST_F(ElasticControlTest, BusyDaemonIsWaitedOutAndNotifiedOnceAfterTheEleventhAnswer) {
  platform_.SetRandValues({0, 1, 2, 3, 4, 7});
  daemon_.Push(FakeDaemon::Busy(1401), 11);
  Json::Value res;
  SendRequestRetryOnBusy(res, commit_);
  EXPECT_EQ(res, ParseJson(R"({"success":true})"));
  EXPECT_EQ(daemon_.Requests(), std::vector<Json::Value>(12, commit_));
  std::vector<unsigned> expected_sleeps = {900, 960, 1020, 1080, 1140};
  expected_sleeps.resize(11, 1020);  // 7 % 5 == 2 from then on
  EXPECT_EQ(platform_.Sleeps(), expected_sleeps);
  auto retries = platform_.LogsContaining("since qoruelasticd is busy");
  ASSERT_EQ(retries.size(), 11u);
  for (size_t i = 0; i < retries.size(); ++i) {
    EXPECT_THAT(retries[i], HasSubstr("Retry[" + std::to_string(i) +
                                      "] since qoruelasticd is busy. Command: commit, db: "
                                      "fileindex_music"));
  }
}

TEST_F(ElasticControlTest, NotificationDependsOnlyOnTheBusyAnswersOfOneCall) {
  int before = 0;
  for (auto [busy, notifications] : {std::pair{0, 0}, {10, 0}, {11, 1}, {30, 1}}) {
    daemon_.Push(FakeDaemon::Busy(1400), busy);
    SendRequestDiscardResult(commit_);
    EXPECT_EQ(MemoryNotifications() - before, notifications) << busy << " busy answers";
    before = MemoryNotifications();
  }
}

TEST_F(ElasticControlTest, OtherErrorsEndTheRetryLoop) {
  daemon_.Push(FakeDaemon::Busy(1400), 2);
  daemon_.Push(FakeDaemon::Failure(7, "no such index"));
  EXPECT_EQ(Thrown([&] { SendRequestDiscardResult(commit_); }),
            "7 Request failed, msg=no such index");
  EXPECT_EQ(daemon_.Requests().size(), 3u);
  EXPECT_EQ(platform_.Sleeps().size(), 2u);
}

TEST_F(ElasticControlTest, CompoundWithBusySubRequestIsRetriedWhole) {
  Json::Value req = ParseJson(R"({"compound":[
      {"command":"document_set_by_id","data":{"id":"fileindex_s","doc_id":"/v/s/a"}},
      {"command":"document_set_by_id","data":{"id":"fileindex_s","doc_id":"/v/s/b"}}]})");
  daemon_.Push(FakeDaemon::Raw(R"({"success":true,"has_fail":true,"data":[
      {"success":true},{"success":false,"error":{"code":1401,"msg":"later"}}]})"));
  daemon_.Push(FakeDaemon::Busy(1400));
  SendRequestDiscardResult(req);
  EXPECT_EQ(daemon_.Requests(), std::vector<Json::Value>(3, req));
  auto retries = platform_.LogsContaining("since qoruelasticd is busy");
  ASSERT_EQ(retries.size(), 2u);
  EXPECT_THAT(retries[0], HasSubstr("Command: compound[2] document_set_by_id, db: fileindex_s"));

  daemon_.Push(FakeDaemon::Busy(1400));
  SendRequestDiscardResult(ParseJson(R"({"compound":[]})"));
  EXPECT_EQ(platform_.LogsContaining("Command: compound[0], db: ").size(), 1u);
}

TEST_F(ElasticControlTest, EachCallSendsItsRequest) {
  struct Case {
    std::function<void()> call;
    const char* request;
  } cases[] = {
      {[] { ShareIndexDelete("music"); },
       R"({"command":"index_delete","data":{"id":"fileindex_music"}})"},
      {[] { ShareIndexPause("music"); },
       R"({"command":"index_pause","data":{"id":"fileindex_music"}})"},
      {[] { ShareIndexResume("my music"); },
       R"({"command":"index_resume","data":{"id":"fileindex_my music"}})"},
      {[] { ShareIndexRename("old", "new", "/volume2/@db/new"); },
       R"({"command":"index_config_set","data":{"id":"fileindex_old",
           "data":{"id":"fileindex_new","path":"/volume2/@db/new"}}})"},
      {[] { ShareIndexMigrate("music", "/volume3/@db/music"); },
       R"({"command":"index_config_set","data":{"id":"fileindex_music",
           "data":{"path":"/volume3/@db/music"}}})"},
      {[] { IndexDel("s", "/v/s/b"); },
       R"({"command":"document_del_by_id","data":{"id":"fileindex_s","doc_id":"/v/s/b"}})"},
      {[] { IndexDelDir("s", "/v/s/a"); },
       R"({"command":"document_del_by_query","data":{"id":"fileindex_s",
           "query":{"qsl":{"prefix":{"QORUMDPath":"/v/s/a/"}}}}})"},
      {[] { IndexCommit("music"); }, R"({"command":"commit","data":{"id":"fileindex_music"}})"},
      {[] {
         UpdateTermSuggestion("db1", {"id1", "id2"});
       },
       R"({"compound":[
          {"command":"update_term_suggestion","data":{"doc_id_field":"id1","db_name":"db1"}},
          {"command":"update_term_suggestion","data":{"doc_id_field":"id2","db_name":"db1"}}]})"},
      {[] { UpdateTermSuggestion("db1", {}); }, R"({"compound":[]})"},
  };
  for (const auto& c : cases) {
    size_t before = daemon_.Requests().size();
    c.call();
    ASSERT_EQ(daemon_.Requests().size(), before + 1) << c.request;
    EXPECT_EQ(daemon_.Requests().back(), ParseJson(c.request));
  }
}

TEST_F(ElasticControlTest, CreateSendsTheSchemaAndTheSharesDatabasePath) {
  EXPECT_THAT(Thrown([] { ShareIndexCreate("nosuch"); }), StartsWith("800 "));
  ShareIndexCreate("music");
  Json::Value expected;
  expected["command"] = "index_create";
  expected["data"]["id"] = "fileindex_music";
  expected["data"]["path"] = sdk::SDKShare("music").GetDBPath();
  expected["data"]["settings"] = GetFileIndexSettings();
  expected["data"]["mappings"] = GetFileIndexMappings();
  expected["data"]["event_handler"] = GetFileIndexEventHandler();
  EXPECT_EQ(daemon_.Requests(), std::vector<Json::Value>{expected}) << "none for nosuch";
}

TEST_F(ElasticControlTest, FailedCommitOnAFullVolumeFlagsTheShare) {
  for (auto [space_enough, thrown, bits] :
       {std::tuple{true, "7 Request failed, msg=disk error", 0},
        {false, "1003 Share (music) space not enough", kShareStatusNeedReindex}}) {
    platform_.SetQuota(space_enough, sdk::kPlatformErrNoSpace);
    daemon_.Push(FakeDaemon::Failure(7, "disk error"));
    EXPECT_EQ(Thrown([] { IndexCommit("music"); }), thrown);
    EXPECT_EQ(StatusMgr().GetShareStatus("music"), bits) << thrown;
  }
  platform_.ClearCalls();
  IndexCommit("music");
  const auto calls = platform_.Calls();
  EXPECT_EQ(std::count(calls.begin(), calls.end(), "QORUQuotaIsEnough"), 0)
      << "a commit that succeeds asks nothing about space";
}

TEST_F(ElasticControlTest, UpsertAndAttrSendTheExtractedDocument) {
  std::vector<Json::Value> options_seen;
  platform_.SetParseFile(
      [&](const std::string& path, const Json::Value& options, Json::Value* doc) {
        options_seen.push_back(options);
        (*doc)["QORUMDPath"] = path;
        (*doc)["QORUMDFSName"] = "a.txt";
        return 0;
      });
  IndexUpsert("s", "/v/s/a.txt", true);
  IndexUpsert("s", "/v/s/a.txt", false);
  IndexAttr("s", "/v/s/a.txt");
  const char* commands[] = {"document_upsert_by_id", "document_upsert_by_id", "document_set_by_id"};
  auto sent = daemon_.Requests();
  ASSERT_EQ(sent.size(), 3u);
  for (size_t i = 0; i < sent.size(); ++i) {
    EXPECT_EQ(sent[i], ParseJson(std::string(R"({"command":")") + commands[i] +
                                 R"(","data":{"id":"fileindex_s","doc_id":"/v/s/a.txt","data":{
        "QORUMDPath":"/v/s/a.txt","QORUMDFSName":"a.txt","QORUMDSearchFileName":"a.txt"}}})"));
    EXPECT_EQ(options_seen[i]["need_meta"], i == 0) << i;
  }
}

TEST_F(ElasticControlTest, ExtractionFailureIsParseFailedAndSendsNothing) {
  int failure = 0;  // a failure code, an exception of any type, a document that is no object
  platform_.SetParseFile([&](const std::string&, const Json::Value&, Json::Value* doc) -> int {
    if (failure == 1) throw 42;
    if (failure == 2) *doc = "not an object";
    return failure == 2 ? 0 : -1;
  });
  for (; failure < 3; ++failure) {
    EXPECT_EQ(Thrown([] { IndexUpsert("s", "/v/s/x.pdf", true); }),
              "914 Parse failed, path=/v/s/x.pdf")
        << failure;
    EXPECT_EQ(Thrown([] { IndexAttr("s", "/v/s/x.pdf"); }), "914 Parse failed, path=/v/s/x.pdf");
  }
  EXPECT_TRUE(daemon_.Requests().empty());
}

TEST_F(ElasticControlTest, RenameMovesTheDocumentAndRewritesOnlyThoseBelowIt) {
  daemon_.Push(FakeDaemon::Success());
  daemon_.Push(FakeDaemon::Success(ParseJson(
      R"([{"QORUMDPath":"/v/s/a/x.txt"},{"QORUMDPath":"/v/s/ab/x"},{"QORUMDPath":"/v/s/a/y/z"}])")));
  IndexRename("s", "/v/s/New.TXT", "/v/s/a");
  auto sent = daemon_.Requests();
  ASSERT_EQ(sent.size(), 3u) << "set, query, one compound";
  EXPECT_EQ(sent[0], ParseJson(R"({"command":"document_set_by_id","data":{"id":"fileindex_s",
      "doc_id":"/v/s/a","data":{"QORUMDPath":"/v/s/New.TXT","QORUMDParent":"/v/s",
      "QORUMDFSName":"New.TXT","QORUMDSearchFileName":"New.TXT","QORUMDDisplayName":"New.TXT",
      "QORUMDKind":"txt","QORUMDExtension":"TXT"}}})"));
  EXPECT_EQ(sent[1]["data"]["query"], ParseJson(R"({"qsl":{"prefix":{"QORUMDPath":"/v/s/a/"}}})"));
  EXPECT_EQ(sent[2], ParseJson(R"({"compound":[
      {"command":"document_set_by_id","data":{"id":"fileindex_s","doc_id":"/v/s/a/x.txt",
       "data":{"QORUMDPath":"/v/s/New.TXT/x.txt","QORUMDParent":"/v/s/New.TXT"}}},
      {"command":"document_set_by_id","data":{"id":"fileindex_s","doc_id":"/v/s/a/y/z",
       "data":{"QORUMDPath":"/v/s/New.TXT/y/z","QORUMDParent":"/v/s/New.TXT/y"}}}]})"));
  EXPECT_EQ(platform_.LogsContaining("Skip rename of a document not below /v/s/a: ").size(), 1u);
}

TEST_F(ElasticControlTest, PrefixListingAppendsPathsAndRefusesAnswersWithoutData) {
  daemon_.Push(FakeDaemon::Success(ParseJson(
      R"([{"QORUMDPath":"/v/s/d/1"},{"other":1},{"QORUMDPath":7},{"QORUMDPath":"/v/s/d/2"}])")));
  std::vector<std::string> paths = {"kept"};
  IndexGetByPrefixPath("s", "/v/s/d", paths);
  EXPECT_EQ(paths, (std::vector<std::string>{"kept", "/v/s/d/1", "/v/s/d/2"}));
  EXPECT_EQ(daemon_.Requests()[0], ParseJson(R"({"command":"document_get_by_query","data":{
      "id":"fileindex_s","query":{"qsl":{"prefix":{"QORUMDPath":"/v/s/d/"}}},
      "load_field":["QORUMDPath"]}})"));
  for (const char* answer : {R"({"success":true})", R"({"success":true,"data":{}})"}) {
    daemon_.Push(FakeDaemon::Raw(answer));
    EXPECT_THAT(Thrown([&] { IndexGetByPrefixPath("s", "/v/s/d", paths); }), StartsWith("916 "));
    daemon_.Push(FakeDaemon::Success());
    daemon_.Push(FakeDaemon::Raw(answer));
    EXPECT_THAT(Thrown([] { IndexRename("s", "/v/s/e", "/v/s/d"); }), StartsWith("916 "));
  }
  EXPECT_EQ(paths.size(), 3u);
}

TEST_F(ElasticControlTest, PathArgumentsThatWouldMatchNothingAreRefused) {
  for (const std::string bad : {"", "/v/s/x/"}) {
    std::vector<std::string> paths;
    EXPECT_THAT(Thrown([&] { IndexDelDir("s", bad); }), StartsWith("120 ")) << bad;
    EXPECT_THAT(Thrown([&] { IndexGetByPrefixPath("s", bad, paths); }), StartsWith("120 ")) << bad;
    EXPECT_THAT(Thrown([&] { IndexRename("s", "/v/s/y", bad); }), StartsWith("120 ")) << bad;
    EXPECT_THAT(Thrown([&] { IndexRename("s", bad, "/v/s/y"); }), StartsWith("120 ")) << bad;
  }
  EXPECT_TRUE(daemon_.Requests().empty());
}

}  // namespace
}  // namespace vellis::fileindex::elastic
