#include "fileindex/elastic/elastic_control.h"

#include <gtest/gtest.h>

#include <functional>
#include <memory>

#include "common/fs_util.h"
#include "common/json_util.h"
#include "common/root_path.h"
#include "fileindex/elastic/comm.h"
#include "tests/support/fake_document_store.h"
#include "tests/support/fake_search_daemon.h"
#include "tests/support/parse_json.h"
#include "tests/support/scripted_platform.h"
#include "tests/support/temp_root.h"

namespace vellis::fileindex::elastic {
namespace {

using testing::FakeSearchDaemon;

using testing::ParseJson;

class ElasticControlTest : public ::testing::Test {
 protected:
  // Runs of the administrators' notifier that report a lack of memory.
  int MemoryNotifications() const {
    int n = 0;
    for (const auto& exec : platform_.Execs()) {
      for (const auto& arg : exec.args) n += arg == "error:lack_of_memory";
    }
    return n;
  }

  // Answers from the document model once the script is used up.
  void ServeStore() {
    daemon_.SetHandler([this](const Json::Value& req) { return store_.Handle(req); });
  }

  testing::TempRoot root_;
  testing::ScriptedPlatform platform_;
  testing::ScopedPlatform scoped_{&platform_};
  FakeSearchDaemon daemon_{RootPath(kElasticSocketPath)};
  testing::FakeDocumentStore store_;
};

TEST_F(ElasticControlTest, BusyDaemonIsWaitedOutAndNotifiedOnceAfterEleventhAnswer) {
  platform_.SetRandValues({0, 1, 2, 3, 4, 7});
  daemon_.Push(FakeSearchDaemon::Busy(1401), 11);
  Json::Value res;
  SendRequestRetryOnBusy(res, ParseJson(R"({"command":"commit","data":{"id":"fileindex_music"}})"));
  EXPECT_EQ(res, ParseJson(R"({"success":true})"));
  EXPECT_EQ(daemon_.Requests().size(), 12u);
  EXPECT_EQ(MemoryNotifications(), 1);
  std::vector<unsigned> expected_sleeps = {900, 960, 1020, 1080, 1140};
  expected_sleeps.resize(11, 1020);  // 7 % 5 == 2 from then on
  EXPECT_EQ(platform_.Sleeps(), expected_sleeps);
  auto retries = platform_.LogsContaining("since qoruelasticd is busy");
  ASSERT_EQ(retries.size(), 11u);
  for (size_t i = 0; i < retries.size(); ++i) {
    EXPECT_NE(retries[i].find("Retry[" + std::to_string(i) +
                              "] since qoruelasticd is busy. Command: commit, db: fileindex_music"),
              std::string::npos)
        << retries[i];
  }
}

TEST_F(ElasticControlTest, NotificationCountsDependOnlyOnBusyAnswers) {
  struct Case {
    int busy;
    int notifications;
  } cases[] = {{0, 0}, {10, 0}, {11, 1}, {30, 1}};
  int before = 0;
  for (const auto& c : cases) {
    daemon_.Push(FakeSearchDaemon::Busy(1400), c.busy);
    SendRequestDiscardResult(ParseJson(R"({"command":"commit","data":{"id":"fileindex_s"}})"));
    EXPECT_EQ(MemoryNotifications() - before, c.notifications) << c.busy << " busy answers";
    before = MemoryNotifications();
  }
}

TEST_F(ElasticControlTest, OtherErrorsEndTheRetryLoop) {
  daemon_.Push(FakeSearchDaemon::Busy(1400), 2);
  daemon_.Push(FakeSearchDaemon::Failure(7, "no such index"));
  try {
    SendRequestDiscardResult(
        ParseJson(R"({"command":"index_delete","data":{"id":"fileindex_s"}})"));
    FAIL() << "error swallowed";
  } catch (const Error& e) {
    EXPECT_EQ(e.GetCode(), 7);
    EXPECT_STREQ(e.what(), "Request failed, msg=no such index");
  }
  EXPECT_EQ(daemon_.Requests().size(), 3u);
  EXPECT_EQ(platform_.Sleeps().size(), 2u);
}

TEST_F(ElasticControlTest, CompoundWithBusySubRequestIsRetriedWholeAndLoggedSafely) {
  Json::Value req = ParseJson(R"({"compound":[
      {"command":"document_set_by_id","data":{"id":"fileindex_s","doc_id":"/v/s/a"}},
      {"command":"document_set_by_id","data":{"id":"fileindex_s","doc_id":"/v/s/b"}}]})");
  daemon_.Push(FakeSearchDaemon::Raw(R"({"success":true,"has_fail":true,"data":[
      {"success":true},{"success":false,"error":{"code":1401,"msg":"later"}}]})"));
  daemon_.Push(FakeSearchDaemon::Busy(1400));
  SendRequestDiscardResult(req);
  ASSERT_EQ(daemon_.Requests().size(), 3u);
  for (const auto& sent : daemon_.Requests()) EXPECT_EQ(sent, req);
  auto retries = platform_.LogsContaining("since qoruelasticd is busy");
  ASSERT_EQ(retries.size(), 2u);
  EXPECT_NE(retries[0].find("Command: compound[2] document_set_by_id, db: fileindex_s"),
            std::string::npos)
      << retries[0];

  daemon_.Push(FakeSearchDaemon::Busy(1400));
  SendRequestDiscardResult(ParseJson(R"({"compound":[]})"));
  EXPECT_NE(platform_.LogsContaining("Command: compound[0], db: ").size(), 0u);
}

TEST_F(ElasticControlTest, IndexLifecycleRequests) {
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
  };
  for (const auto& c : cases) {
    size_t before = daemon_.Requests().size();
    c.call();
    ASSERT_EQ(daemon_.Requests().size(), before + 1) << c.request;
    EXPECT_EQ(daemon_.Requests().back(), ParseJson(c.request));
  }
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
  const Json::Value doc = ParseJson(
      R"({"QORUMDPath":"/v/s/a.txt","QORUMDFSName":"a.txt","QORUMDSearchFileName":"a.txt"})");
  auto sent = daemon_.Requests();
  ASSERT_EQ(sent.size(), 3u);
  const char* commands[] = {"document_upsert_by_id", "document_upsert_by_id", "document_set_by_id"};
  const bool need_meta[] = {true, false, false};
  for (size_t i = 0; i < sent.size(); ++i) {
    EXPECT_EQ(sent[i]["command"], commands[i]) << i;
    EXPECT_EQ(sent[i]["data"]["id"], "fileindex_s") << i;
    EXPECT_EQ(sent[i]["data"]["doc_id"], "/v/s/a.txt") << i;
    EXPECT_EQ(sent[i]["data"]["data"], doc) << i;
    EXPECT_EQ(options_seen[i],
              ParseJson(need_meta[i] ? R"({"need_meta":true})" : R"({"need_meta":false})"));
  }
}

TEST_F(ElasticControlTest, ExtractionFailureIsParseFailedAndSendsNothing) {
  std::vector<std::function<int(Json::Value*)>> failures = {
      [](Json::Value*) { return -1; },
      [](Json::Value*) -> int { throw std::runtime_error("corrupt"); },
      [](Json::Value*) -> int { throw 42; },
      [](Json::Value* doc) {
        *doc = Json::Value("not an object");
        return 0;
      },
  };
  for (size_t i = 0; i < failures.size(); ++i) {
    platform_.SetParseFile(
        [&](const std::string&, const Json::Value&, Json::Value* doc) { return failures[i](doc); });
    for (bool attr : {false, true}) {
      try {
        attr ? IndexAttr("s", "/v/s/x.pdf") : IndexUpsert("s", "/v/s/x.pdf", true);
        ADD_FAILURE() << "failure " << i << " not reported";
      } catch (const Error& e) {
        EXPECT_EQ(e.GetCode(), kErrParseFailed) << i;
        EXPECT_STREQ(e.what(), "Parse failed, path=/v/s/x.pdf");
      }
    }
  }
  EXPECT_TRUE(daemon_.Requests().empty());
}

TEST_F(ElasticControlTest, DeleteRequestsTouchOnlyTheirOwnDocuments) {
  ServeStore();
  for (const char* p : {"/vol/share/a", "/vol/share/a/x", "/vol/share/a/y/z", "/vol/share/ab",
                        "/vol/share/ab/x", "/vol/share/b"}) {
    store_.Put("fileindex_share", p, ParseJson(std::string(R"({"QORUMDPath":")") + p + "\"}"));
  }
  IndexDelDir("share", "/vol/share/a");
  IndexDel("share", "/vol/share/b");
  std::vector<std::string> left;
  for (const auto& [id, doc] : store_.Docs("fileindex_share")) left.push_back(id);
  EXPECT_EQ(left, (std::vector<std::string>{"/vol/share/a", "/vol/share/ab", "/vol/share/ab/x"}));
  EXPECT_EQ(daemon_.Requests()[0]["data"]["query"],
            ParseJson(R"({"qsl":{"prefix":{"QORUMDPath":"/vol/share/a/"}}})"));
}

TEST_F(ElasticControlTest, RenamingADirectoryRewritesEveryDocumentBelowIt) {
  ServeStore();
  for (const char* p : {"/vol/share/a", "/vol/share/a/x.txt", "/vol/share/a/y", "/vol/share/a/y/z",
                        "/vol/share/ab", "/vol/share/ab/x"}) {
    Json::Value doc;
    doc["QORUMDPath"] = p;
    doc["QORUMDParent"] = Dirname(p);
    doc["QORUMDTitle"] = "kept";
    store_.Put("fileindex_share", p, doc);
  }
  IndexRename("share", "/vol/share/b.d", "/vol/share/a");

  auto docs = store_.Docs("fileindex_share");
  std::vector<std::string> ids;
  for (const auto& [id, doc] : docs) {
    ids.push_back(id);
    EXPECT_EQ(doc["QORUMDPath"], id);
    EXPECT_EQ(doc["QORUMDParent"], Dirname(id)) << id;
    EXPECT_EQ(doc["QORUMDTitle"], "kept") << id;
  }
  EXPECT_EQ(ids, (std::vector<std::string>{"/vol/share/ab", "/vol/share/ab/x", "/vol/share/b.d",
                                           "/vol/share/b.d/x.txt", "/vol/share/b.d/y",
                                           "/vol/share/b.d/y/z"}));
  const Json::Value& moved = docs["/vol/share/b.d"];
  for (const char* name_field : {"QORUMDFSName", "QORUMDSearchFileName", "QORUMDDisplayName"}) {
    EXPECT_EQ(moved[name_field], "b.d") << name_field;
  }
  EXPECT_EQ(moved["QORUMDExtension"], "d");
  ASSERT_EQ(daemon_.Requests().size(), 3u) << "set, query, one compound";
  EXPECT_EQ(daemon_.Requests()[1]["data"]["load_field"][0], "QORUMDPath");
  EXPECT_EQ(daemon_.Requests()[2]["compound"].size(), 3u);
}

TEST_F(ElasticControlTest, RenamingAFileSendsAnEmptyCompoundAndSkipsStrayAnswers) {
  daemon_.Push(FakeSearchDaemon::Success());
  daemon_.Push(FakeSearchDaemon::Success(ParseJson(R"([{"QORUMDPath":"/vol/share/f.txt2"}])")));
  IndexRename("share", "/vol/share/g.txt", "/vol/share/f.txt");
  auto sent = daemon_.Requests();
  ASSERT_EQ(sent.size(), 3u);
  EXPECT_EQ(sent[0]["command"], "document_set_by_id");
  EXPECT_EQ(sent[0]["data"]["doc_id"], "/vol/share/f.txt");
  EXPECT_EQ(sent[0]["data"]["data"]["QORUMDParent"], "/vol/share");
  EXPECT_EQ(sent[0]["data"]["data"]["QORUMDKind"], "txt");
  EXPECT_EQ(sent[2], ParseJson(R"({"compound":[]})"));
  EXPECT_EQ(platform_.LogsContaining("Skip rename of a document not below /vol/share/f.txt").size(),
            1u);
}

TEST_F(ElasticControlTest, PrefixListingAppendsAndRefusesAnswersWithoutData) {
  daemon_.Push(FakeSearchDaemon::Success(ParseJson(
      R"([{"QORUMDPath":"/v/s/d/1"},{"other":1},{"QORUMDPath":7},{"QORUMDPath":"/v/s/d/2"}])")));
  std::vector<std::string> paths = {"kept"};
  IndexGetByPrefixPath("s", "/v/s/d", paths);
  EXPECT_EQ(paths, (std::vector<std::string>{"kept", "/v/s/d/1", "/v/s/d/2"}));
  EXPECT_EQ(daemon_.Requests()[0]["data"]["load_field"], ParseJson(R"(["QORUMDPath"])"));

  for (const char* answer : {R"({"success":true})", R"({"success":true,"data":{}})"}) {
    daemon_.Push(FakeSearchDaemon::Raw(answer));
    try {
      IndexGetByPrefixPath("s", "/v/s/d", paths);
      ADD_FAILURE() << answer;
    } catch (const Error& e) {
      EXPECT_EQ(e.GetCode(), kErrNoData) << answer;
    }
    daemon_.Push(FakeSearchDaemon::Success());
    daemon_.Push(FakeSearchDaemon::Raw(answer));
    EXPECT_THROW(IndexRename("s", "/v/s/e", "/v/s/d"), Error) << answer;
  }
  EXPECT_EQ(paths.size(), 3u);
}

TEST_F(ElasticControlTest, PathArgumentsThatWouldMatchNothingAreRefused) {
  for (const std::string bad : {"", "/v/s/x/"}) {
    std::vector<std::string> paths;
    EXPECT_THROW(IndexDelDir("s", bad), Error) << bad;
    EXPECT_THROW(IndexGetByPrefixPath("s", bad, paths), Error) << bad;
    EXPECT_THROW(IndexRename("s", "/v/s/y", bad), Error) << "from " << bad;
    EXPECT_THROW(IndexRename("s", bad, "/v/s/y"), Error) << "to " << bad;
  }
  EXPECT_TRUE(daemon_.Requests().empty());
}

TEST_F(ElasticControlTest, TermSuggestionIsOneCompoundRequest) {
  UpdateTermSuggestion("db1", {"id1", "id2"});
  UpdateTermSuggestion("db1", {});
  auto sent = daemon_.Requests();
  ASSERT_EQ(sent.size(), 2u);
  EXPECT_EQ(sent[0], ParseJson(R"({"compound":[
      {"command":"update_term_suggestion","data":{"doc_id_field":"id1","db_name":"db1"}},
      {"command":"update_term_suggestion","data":{"doc_id_field":"id2","db_name":"db1"}}]})"));
  EXPECT_EQ(sent[1], ParseJson(R"({"compound":[]})"));
}

}  // namespace
}  // namespace vellis::fileindex::elastic
