// The daemon's protocol, request in and answer out, over the SQLite engine
// under a temporary root.
#include "daemons/searchd/handler.h"

#include <gtest/gtest.h>
#include <sqlite3.h>
#include <sys/stat.h>

#include <set>

#include "common/json_util.h"
#include "common/root_path.h"
#include "daemons/searchd/registry.h"
#include "daemons/searchd/sqlite_engine.h"
#include "tests/daemons/searchd/searchd_fixture.h"
#include "tests/support/fake_platform.h"
#include "tests/support/temp_root.h"

namespace vellis::searchd::testing {
namespace {

using ::vellis::testing::FakePlatform;
using ::vellis::testing::ScopedPlatform;
using ::vellis::testing::TempRoot;

bool FileExists(const std::string& path) {
  struct stat st;
  return stat(path.c_str(), &st) == 0;
}

class HandlerTest : public ::testing::Test {
 protected:
  // The answer's "data" when it succeeded; a test failure otherwise.
  Json::Value Ok(const Json::Value& request) {
    Json::Value answer = handler_.Handle(request);
    EXPECT_TRUE(answer["success"].asBool())
        << "request " << JsonToString(request) << "\nanswer " << JsonToString(answer);
    return answer["data"];
  }
  // The error code of a failed answer (0 when it succeeded).
  int FailCode(const Json::Value& request) {
    Json::Value answer = handler_.Handle(request);
    if (answer["success"].asBool()) return 0;
    return answer["error"]["code"].asInt();
  }
  Json::Value Data(const std::string& id) {
    Json::Value d(Json::objectValue);
    d["id"] = id;
    return d;
  }
  // The QORUMDPath of every document below `prefix`, in order.
  std::vector<std::string> PathsBelow(const std::string& id, const std::string& prefix) {
    Json::Value d = Data(id);
    d["query"] = PrefixQuery(prefix);
    d["load_field"].append("QORUMDPath");
    std::vector<std::string> out;
    for (const Json::Value& doc : Ok(Request("document_get_by_query", d))) {
      out.push_back(doc["QORUMDPath"].asString());
    }
    return out;
  }

  TempRoot root_;
  FakePlatform platform_;
  ScopedPlatform scoped_{&platform_};
  SqliteEngine engine_{RootPath(kRegistryPath)};
  Handler handler_{engine_};
  std::string db_dir_ = root_.Path("/volume1/@qoruindex");
};

TEST_F(HandlerTest, IndexLifecycle) {
  Ok(CreateRequest("fileindex_music", db_dir_));
  EXPECT_TRUE(FileExists(db_dir_ + "/fileindex_music.sqlite"));
  Ok(CreateRequest("fileindex_music", db_dir_ + "/"));  // same folder: idempotent
  EXPECT_EQ(FailCode(CreateRequest("fileindex_music", root_.Path("/elsewhere"))), 1105);

  Json::Value list = Ok(Request("index_list", Json::Value(Json::objectValue)));
  ASSERT_EQ(list.size(), 1u);
  EXPECT_EQ(list[0]["id"].asString(), "fileindex_music");
  EXPECT_EQ(list[0]["path"].asString(), db_dir_);
  EXPECT_FALSE(list[0]["paused"].asBool());

  Ok(UpsertRequest("fileindex_music", FileDoc("/volume1/music/a.mp3")));
  Ok(Request("commit", Data("fileindex_music")));
  Json::Value stats = Ok(Request("index_stats", Data("fileindex_music")));
  EXPECT_EQ(stats["documents"].asInt(), 1);
  EXPECT_GT(stats["disk_bytes"].asInt64(), 0);

  Ok(Request("index_delete", Data("fileindex_music")));
  EXPECT_FALSE(FileExists(db_dir_ + "/fileindex_music.sqlite"));
  EXPECT_EQ(Ok(Request("index_list", Json::Value(Json::objectValue))).size(), 0u);
  EXPECT_EQ(FailCode(Request("index_delete", Data("fileindex_music"))), 1104);
}

TEST_F(HandlerTest, UpsertReplacesTheWholeDocumentAndSetOnlyTheGivenFields) {
  Ok(CreateRequest("s", db_dir_));
  Json::Value doc = FileDoc("/volume1/s/a.txt", 10);
  doc["QORUMDTitle"] = "First";
  doc["QORUMDKeywords"] = "k1";
  Ok(UpsertRequest("s", doc));

  Json::Value set = Data("s");
  set["doc_id"] = "/volume1/s/a.txt";
  set["data"]["QORUMDTitle"] = "Second";
  Ok(Request("document_set_by_id", set));
  Json::Value got = Data("s");
  got["query"] = PrefixQuery("/volume1/s/");
  Json::Value docs = Ok(Request("document_get_by_query", got));
  ASSERT_EQ(docs.size(), 1u);
  EXPECT_EQ(docs[0]["QORUMDTitle"].asString(), "Second");
  EXPECT_EQ(docs[0]["QORUMDKeywords"].asString(), "k1") << "set keeps fields not given";
  EXPECT_EQ(docs[0]["QORUMDFSSize"].asInt(), 10);

  Json::Value whole = FileDoc("/volume1/s/a.txt", 20);
  Ok(UpsertRequest("s", whole));
  docs = Ok(Request("document_get_by_query", got));
  ASSERT_EQ(docs.size(), 1u);
  EXPECT_FALSE(docs[0].isMember("QORUMDKeywords")) << "upsert replaces the whole document";
  EXPECT_EQ(docs[0]["QORUMDFSSize"].asInt(), 20);

  set["doc_id"] = "/volume1/s/none.txt";
  EXPECT_EQ(FailCode(Request("document_set_by_id", set)), 1107);
}

// A directory move as the indexer carries it out: the item itself, then a
// query for everything below it, then one compound request of updates.
TEST_F(HandlerTest, RenameOfADirectoryWithAThousandDocuments) {
  Ok(CreateRequest("s", db_dir_));
  Json::Value batch(Json::objectValue);
  batch["compound"] = Json::Value(Json::arrayValue);
  batch["compound"].append(UpsertRequest("s", FileDoc("/volume1/s/a")));
  for (int i = 0; i < 1000; ++i) {
    batch["compound"].append(UpsertRequest("s", FileDoc("/volume1/s/a/d" + std::to_string(i % 10) +
                                                        "/f" + std::to_string(i) + ".txt")));
  }
  batch["compound"].append(UpsertRequest("s", FileDoc("/volume1/s/ab/keep.txt")));
  EXPECT_FALSE(Ok(batch).isNull());

  Json::Value self = Data("s");
  self["doc_id"] = "/volume1/s/a";
  self["data"]["QORUMDPath"] = "/volume1/s/b";
  self["data"]["QORUMDFSName"] = "b";
  Ok(Request("document_set_by_id", self));

  Json::Value query = Data("s");
  query["query"] = PrefixQuery("/volume1/s/a/");
  query["load_field"].append("QORUMDPath");
  query["load_field"].append("QORUMDParent");
  query["load_field"].append("QORUMDFSName");
  Json::Value below = Ok(Request("document_get_by_query", query));
  ASSERT_EQ(below.size(), 1000u);
  Json::Value moves(Json::objectValue);
  moves["compound"] = Json::Value(Json::arrayValue);
  for (const Json::Value& doc : below) {
    std::string old_path = doc["QORUMDPath"].asString();
    Json::Value set = Data("s");
    set["doc_id"] = old_path;
    set["data"]["QORUMDPath"] = "/volume1/s/b" + old_path.substr(strlen("/volume1/s/a"));
    moves["compound"].append(Request("document_set_by_id", set));
  }
  Json::Value answer = handler_.Handle(moves);
  EXPECT_TRUE(answer["success"].asBool());
  EXPECT_FALSE(answer["has_fail"].asBool()) << JsonToString(answer["data"][0]);
  EXPECT_EQ(answer["data"].size(), 1000u);

  EXPECT_EQ(PathsBelow("s", "/volume1/s/a/").size(), 0u);
  std::vector<std::string> moved = PathsBelow("s", "/volume1/s/b/");
  EXPECT_EQ(moved.size(), 1000u);
  EXPECT_EQ(std::count(moved.begin(), moved.end(), "/volume1/s/b/d7/f417.txt"), 1);
  EXPECT_EQ(PathsBelow("s", "/volume1/s/ab/"), std::vector<std::string>{"/volume1/s/ab/keep.txt"});
  Json::Value stats = Ok(Request("index_stats", Data("s")));
  EXPECT_EQ(stats["documents"].asInt(), 1002);
}

TEST_F(HandlerTest, DeleteByIdAndByPrefix) {
  Ok(CreateRequest("s", db_dir_));
  for (const char* p : {"/v/s/a", "/v/s/a/x", "/v/s/a/y/z", "/v/s/ab", "/v/s/ab/w"}) {
    Ok(UpsertRequest("s", FileDoc(p)));
  }
  Json::Value del = Data("s");
  del["query"] = PrefixQuery("/v/s/a/");
  EXPECT_EQ(Ok(Request("document_del_by_query", del))["deleted"].asInt(), 2);
  EXPECT_EQ(PathsBelow("s", "/v/"), (std::vector<std::string>{"/v/s/a", "/v/s/ab", "/v/s/ab/w"}));

  Json::Value one = Data("s");
  one["doc_id"] = "/v/s/ab";
  EXPECT_TRUE(Ok(Request("document_del_by_id", one))["deleted"].asBool());
  EXPECT_FALSE(Ok(Request("document_del_by_id", one))["deleted"].asBool())
      << "deleting a missing document is no error";
  EXPECT_EQ(PathsBelow("s", "/v/"), (std::vector<std::string>{"/v/s/a", "/v/s/ab/w"}));
}

TEST_F(HandlerTest, GetByQueryLoadsOnlyTheNamedFields) {
  Ok(CreateRequest("s", db_dir_));
  Json::Value doc = FileDoc("/v/s/d/a.txt", 5);
  doc["QORUMDTextContent"] = "some words";
  Ok(UpsertRequest("s", doc));
  Json::Value q = Data("s");
  q["query"] = PrefixQuery("/v/s/d/");
  q["load_field"].append("QORUMDPath");
  q["load_field"].append("QORUMDTextContent");
  q["load_field"].append("QORUMDNoSuchField");
  Json::Value docs = Ok(Request("document_get_by_query", q));
  ASSERT_EQ(docs.size(), 1u);
  EXPECT_EQ(docs[0].getMemberNames(),
            (std::vector<std::string>{"QORUMDPath", "QORUMDTextContent"}));
  EXPECT_EQ(docs[0]["QORUMDTextContent"].asString(), "some words");
}

TEST_F(HandlerTest, PausedIndexRefusesWritesAndStillAnswersReads) {
  Ok(CreateRequest("s", db_dir_));
  Json::Value doc = FileDoc("/v/s/report.txt");
  doc["QORUMDTextContent"] = "quarterly numbers";
  Ok(UpsertRequest("s", doc));
  Ok(Request("index_pause", Data("s")));

  EXPECT_EQ(FailCode(UpsertRequest("s", FileDoc("/v/s/new.txt"))), 1106);
  Json::Value del = Data("s");
  del["doc_id"] = "/v/s/report.txt";
  EXPECT_EQ(FailCode(Request("document_del_by_id", del)), 1106);
  EXPECT_TRUE(Ok(Request("index_stats", Data("s")))["paused"].asBool());
  Json::Value search = Data("s");
  search["query"] = "quarterly";
  EXPECT_EQ(Ok(Request("document_search", search))["total"].asInt(), 1);

  Ok(Request("index_resume", Data("s")));
  Ok(UpsertRequest("s", FileDoc("/v/s/new.txt")));
  EXPECT_EQ(PathsBelow("s", "/v/s/").size(), 2u);
}

TEST_F(HandlerTest, RenameAndMigrateMoveTheIndexFiles) {
  Ok(CreateRequest("fileindex_old", db_dir_));
  Ok(UpsertRequest("fileindex_old", FileDoc("/volume1/old/a.txt")));

  Json::Value rename = Data("fileindex_old");
  rename["data"]["id"] = "fileindex_new";
  rename["data"]["path"] = root_.Path("/volume2/@qoruindex");
  Ok(Request("index_config_set", rename));
  EXPECT_EQ(FailCode(Request("index_stats", Data("fileindex_old"))), 1104);
  EXPECT_FALSE(FileExists(db_dir_ + "/fileindex_old.sqlite"));
  EXPECT_TRUE(FileExists(root_.Path("/volume2/@qoruindex/fileindex_new.sqlite")));
  EXPECT_EQ(PathsBelow("fileindex_new", "/volume1/"),
            std::vector<std::string>{"/volume1/old/a.txt"})
      << "pending writes travel with the index";

  Json::Value migrate = Data("fileindex_new");
  migrate["data"]["path"] = root_.Path("/volume3/db");
  Ok(Request("index_config_set", migrate));
  Json::Value stats = Ok(Request("index_stats", Data("fileindex_new")));
  EXPECT_EQ(stats["path"].asString(), root_.Path("/volume3/db"));
  EXPECT_EQ(stats["documents"].asInt(), 1);

  Ok(CreateRequest("fileindex_other", db_dir_));
  Json::Value clash = Data("fileindex_other");
  clash["data"]["id"] = "fileindex_new";
  EXPECT_EQ(FailCode(Request("index_config_set", clash)), 1105);
}

TEST_F(HandlerTest, CompoundAnswersEachSubRequestInOrder) {
  Ok(CreateRequest("s", db_dir_));
  Json::Value missing = Data("s");
  missing["doc_id"] = "/v/s/missing";
  missing["data"]["QORUMDTitle"] = "x";
  Json::Value req(Json::objectValue);
  req["compound"].append(UpsertRequest("s", FileDoc("/v/s/one")));
  req["compound"].append(Request("document_set_by_id", missing));
  req["compound"].append(UpsertRequest("s", FileDoc("/v/s/two")));
  req["compound"].append(Request("commit", Data("s")));

  Json::Value answer = handler_.Handle(req);
  EXPECT_TRUE(answer["success"].asBool());
  EXPECT_TRUE(answer["has_fail"].asBool());
  ASSERT_EQ(answer["data"].size(), 4u);
  EXPECT_TRUE(answer["data"][0]["success"].asBool());
  EXPECT_FALSE(answer["data"][1]["success"].asBool());
  EXPECT_EQ(answer["data"][1]["error"]["code"].asInt(), 1107);
  EXPECT_NE(answer["data"][1]["error"]["msg"].asString().find("/v/s/missing"), std::string::npos);
  EXPECT_TRUE(answer["data"][2]["success"].asBool());
  EXPECT_TRUE(answer["data"][3]["success"].asBool());
  EXPECT_EQ(PathsBelow("s", "/v/s/"), (std::vector<std::string>{"/v/s/one", "/v/s/two"}));

  Json::Value fine(Json::objectValue);
  fine["compound"].append(Request("commit", Data("s")));
  EXPECT_FALSE(handler_.Handle(fine)["has_fail"].asBool());
}

TEST_F(HandlerTest, FailedWriteLeavesTheStoredDocumentAsItWas) {
  Ok(CreateRequest("s", db_dir_));
  Json::Value doc = FileDoc("/v/s/a.txt", 7);
  doc["QORUMDTextContent"] = "original text";
  Ok(UpsertRequest("s", doc));

  struct Case {
    const char* what;
    Json::Value request;
    int code;
  };
  Json::Value bad_size = doc;
  bad_size["QORUMDFSSize"] = "seven";
  bad_size["QORUMDTextContent"] = "replaced";
  Json::Value bad_flag = doc;
  bad_flag["QORUMDIsDir"] = "maybe";
  Json::Value drop_required = Data("s");
  drop_required["doc_id"] = "/v/s/a.txt";
  drop_required["data"]["QORUMDPath"] = Json::Value();
  Json::Value bad_set = Data("s");
  bad_set["doc_id"] = "/v/s/a.txt";
  bad_set["data"]["QORUMDDurationSecond"] = Json::Value(Json::objectValue);
  Json::Value other_id = doc;
  other_id["QORUMDPath"] = "/v/s/b.txt";
  Json::Value mismatch = UpsertRequest("s", other_id);
  mismatch["data"]["doc_id"] = "/v/s/a.txt";
  const Case cases[] = {
      {"int field with text", UpsertRequest("s", bad_size), 1109},
      {"bool field with text", UpsertRequest("s", bad_flag), 1109},
      {"required identity removed", Request("document_set_by_id", drop_required), 1108},
      {"double field with an object", Request("document_set_by_id", bad_set), 1109},
      {"doc_id differs from the identity field", mismatch, 1102},
  };
  for (const Case& c : cases) {
    Json::Value answer = handler_.Handle(c.request);
    EXPECT_FALSE(answer["success"].asBool()) << c.what;
    EXPECT_EQ(answer["error"]["code"].asInt(), c.code) << c.what << ": " << JsonToString(answer);
    Json::Value q = Data("s");
    q["query"] = PrefixQuery("/v/s/");
    Json::Value docs = Ok(Request("document_get_by_query", q));
    ASSERT_EQ(docs.size(), 1u) << c.what;
    EXPECT_EQ(docs[0]["QORUMDFSSize"].asInt(), 7) << c.what;
    EXPECT_EQ(docs[0]["QORUMDTextContent"].asString(), "original text") << c.what;
  }
}

TEST_F(HandlerTest, BadRequestsAnswerACodeAndANamingMessage) {
  Ok(CreateRequest("s", db_dir_));
  struct Case {
    std::string text;
    int code;
    std::string msg_part;
  };
  const Case cases[] = {
      {"not json", 1100, "not a JSON object"},
      {"[1, 2]", 1100, "not a JSON object"},
      {"{\"command\": \"commit\"} trailing", 1100, "not a JSON object"},
      {"{\"data\": {}}", 1102, "command is missing"},
      {"{\"command\": 5, \"data\": {}}", 1102, "command must be a string"},
      {"{\"command\": \"index_explode\", \"data\": {}}", 1101, "index_explode"},
      {"{\"command\": \"commit\", \"data\": []}", 1102, "data must be an object"},
      {"{\"command\": \"commit\", \"data\": {}}", 1102, "data.id is missing"},
      {"{\"command\": \"commit\", \"data\": {\"id\": 7}}", 1102, "data.id must be a string"},
      {"{\"command\": \"commit\", \"data\": {\"id\": \"nope\"}}", 1104, "nope"},
      {"{\"command\": \"commit\", \"data\": {\"id\": \"../etc\"}}", 1103, "\"/\""},
      {"{\"command\": \"commit\", \"data\": {\"id\": \"..\"}}", 1103, "\"..\""},
      {"{\"command\": \"commit\", \"data\": {\"id\": \"a\\u0000b\"}}", 1103, "NUL"},
      {"{\"command\": \"commit\", \"data\": {\"id\": \"\"}}", 1103, "empty"},
      {"{\"command\": \"index_create\", \"data\": {\"id\": \"x\", \"path\": \"rel/dir\", "
       "\"mappings\": {\"property_id\": \"QORUMDPath\"}}}",
       1103, "absolute"},
      {"{\"command\": \"index_create\", \"data\": {\"id\": \"x\", \"path\": \"/tmp/../etc\", "
       "\"mappings\": {\"property_id\": \"QORUMDPath\"}}}",
       1103, "\"..\""},
      {"{\"command\": \"index_create\", \"data\": {\"id\": \"x\", \"path\": \"/tmp/x\", "
       "\"mappings\": {\"properties\": {}}}}",
       1111, "property_id"},
      {"{\"command\": \"index_create\", \"data\": {\"id\": \"x\", \"path\": \"/tmp/x\", "
       "\"mappings\": {\"property_id\": \"P\", \"properties\": {\"F\": {\"type\": \"blob\"}}}}}",
       1111, "blob"},
      {"{\"command\": \"document_upsert_by_id\", \"data\": {\"id\": \"s\", \"data\": {}}}", 1102,
       "data.doc_id is missing"},
      {"{\"command\": \"document_upsert_by_id\", \"data\": {\"id\": \"s\", \"doc_id\": \"/a\", "
       "\"data\": \"text\"}}",
       1102, "data.data must be an object"},
      {"{\"command\": \"document_del_by_query\", \"data\": {\"id\": \"s\", \"query\": {\"qsl\": "
       "{\"prefix\": {\"QORUMDFSName\": \"a\"}}}}}",
       1110, "QORUMDPath"},
      {"{\"command\": \"document_get_by_query\", \"data\": {\"id\": \"s\", \"query\": {}}}", 1102,
       "data.query.qsl is missing"},
      {"{\"command\": \"document_search\", \"data\": {\"id\": \"s\", \"sort\": \"colour\"}}", 1110,
       "colour"},
      {"{\"command\": \"document_search\", \"data\": {\"id\": \"s\", \"category\": \"books\"}}",
       1110, "books"},
      {"{\"command\": \"document_search\", \"data\": {\"id\": \"s\", \"limit\": 100000}}", 1110,
       "limit"},
      {"{\"command\": \"index_config_set\", \"data\": {\"id\": \"s\", \"data\": {}}}", 1102,
       "\"id\" or \"path\""},
      {"{\"compound\": {}}", 1102, "compound must be an array"},
  };
  for (const Case& c : cases) {
    Json::Value answer = Parse(handler_.HandleText(c.text));
    EXPECT_FALSE(answer["success"].asBool()) << c.text;
    EXPECT_EQ(answer["error"]["code"].asInt(), c.code) << c.text << " -> " << JsonToString(answer);
    EXPECT_NE(answer["error"]["msg"].asString().find(c.msg_part), std::string::npos)
        << c.text << " -> " << JsonToString(answer);
  }
  Json::Value nested = Parse(handler_.HandleText("{\"compound\": [{\"compound\": []}]}"));
  EXPECT_TRUE(nested["has_fail"].asBool());
  EXPECT_EQ(nested["data"][0]["error"]["code"].asInt(), 1102);
  EXPECT_EQ(Ok(Request("index_list", Json::Value(Json::objectValue))).size(), 1u)
      << "no bad request created an index";
}

TEST_F(HandlerTest, IdleUpkeepMergesAndKeepsEveryDocumentFindable) {
  Ok(CreateRequest("s", db_dir_));
  // Several commits leave several full-text segments behind.
  for (int batch = 0; batch < 6; ++batch) {
    Json::Value req(Json::objectValue);
    for (int i = 0; i < 50; ++i) {
      Json::Value doc =
          FileDoc("/v/s/" + std::to_string(batch) + "/f" + std::to_string(i) + ".txt");
      doc["QORUMDTextContent"] = "common words batch" + std::to_string(batch);
      req["compound"].append(UpsertRequest("s", doc));
    }
    EXPECT_FALSE(handler_.Handle(req)["has_fail"].asBool());
    Ok(Request("commit", Data("s")));
  }
  EXPECT_TRUE(Ok(Request("index_stats", Data("s")))["merging"].asBool());
  int steps = 0;
  while (handler_.Idle() && steps < 1000) ++steps;
  EXPECT_GT(steps, 0) << "six commits leave segments to merge";
  EXPECT_LT(steps, 1000) << "upkeep ends";
  EXPECT_FALSE(Ok(Request("index_stats", Data("s")))["merging"].asBool());
  Json::Value search = Data("s");
  search["query"] = "common";
  EXPECT_EQ(Ok(Request("document_search", search))["total"].asInt(), 300);
  search["query"] = "batch3";
  EXPECT_EQ(Ok(Request("document_search", search))["total"].asInt(), 50);

  Ok(UpsertRequest("s", FileDoc("/v/s/late.txt")));
  EXPECT_FALSE(handler_.Idle()) << "no upkeep while writes are uncommitted";
  EXPECT_TRUE(Ok(Request("index_stats", Data("s")))["merging"].asBool());
}

TEST(HandlerBusyTest, WriteLockedByAnotherProcessAnswersBusyAndLosesNothing) {
  TempRoot root;
  FakePlatform platform;
  ScopedPlatform scoped(&platform);
  SqliteEngine engine(RootPath(kRegistryPath), /*busy_timeout_ms=*/50);
  Handler handler(engine);
  ASSERT_TRUE(handler.Handle(CreateRequest("s", root.Path("/db")))["success"].asBool());
  ASSERT_TRUE(handler.Handle(UpsertRequest("s", FileDoc("/v/s/first")))["success"].asBool());
  Json::Value commit = Request("commit", Parse(R"({"id": "s"})"));
  ASSERT_TRUE(handler.Handle(commit)["success"].asBool());

  // Another process (here another connection) holds the write lock.
  sqlite3* other = nullptr;
  ASSERT_EQ(sqlite3_open(root.Path("/db/s.sqlite").c_str(), &other), SQLITE_OK);
  ASSERT_EQ(sqlite3_exec(other, "BEGIN IMMEDIATE", nullptr, nullptr, nullptr), SQLITE_OK);
  Json::Value answer = handler.Handle(UpsertRequest("s", FileDoc("/v/s/second")));
  EXPECT_FALSE(answer["success"].asBool());
  EXPECT_EQ(answer["error"]["code"].asInt(), 1400) << JsonToString(answer);
  Json::Value search = Request("document_search", Parse(R"({"id": "s"})"));
  EXPECT_EQ(handler.Handle(search)["data"]["total"].asInt(), 1) << "reads go on";
  sqlite3_exec(other, "ROLLBACK", nullptr, nullptr, nullptr);
  sqlite3_close(other);

  EXPECT_TRUE(handler.Handle(UpsertRequest("s", FileDoc("/v/s/second")))["success"].asBool())
      << "the repeated request succeeds";
  EXPECT_EQ(handler.Handle(search)["data"]["total"].asInt(), 2);
}

TEST_F(HandlerTest, TermSuggestionsFollowTheirDocuments) {
  Ok(CreateRequest("fileindex_s", db_dir_));
  Json::Value a = FileDoc("/v/s/Budget 2024.xlsx");
  a["QORUMDTitle"] = "Annual budget";
  Json::Value b = FileDoc("/v/s/notes.txt");
  b["QORUMDTitle"] = "Budget notes";
  Ok(UpsertRequest("fileindex_s", a));
  Ok(UpsertRequest("fileindex_s", b));
  Json::Value req(Json::objectValue);
  for (const char* id : {"/v/s/Budget 2024.xlsx", "/v/s/notes.txt"}) {
    Json::Value d(Json::objectValue);
    d["doc_id_field"] = id;
    d["db_name"] = "fileindex_s";
    req["compound"].append(Request("update_term_suggestion", d));
  }
  EXPECT_FALSE(handler_.Handle(req)["has_fail"].asBool());

  auto suggest = [this](const std::string& prefix) {
    Json::Value d = Data("fileindex_s");
    d["prefix"] = prefix;
    std::vector<std::string> out;
    for (const Json::Value& t : Ok(Request("term_suggest", d))) {
      out.push_back(t["term"].asString() + "=" + std::to_string(t["documents"].asInt()));
    }
    return out;
  };
  EXPECT_EQ(suggest("bu"), std::vector<std::string>{"budget=2"});
  EXPECT_EQ(suggest("NO"), std::vector<std::string>{"notes=1"});

  b["QORUMDTitle"] = "Meeting";
  Ok(UpsertRequest("fileindex_s", b));
  req["compound"].resize(1);
  req["compound"][0]["data"]["doc_id_field"] = "/v/s/notes.txt";
  EXPECT_FALSE(handler_.Handle(req)["has_fail"].asBool());
  EXPECT_EQ(suggest("bu"), std::vector<std::string>{"budget=1"});
  EXPECT_EQ(suggest("me"), std::vector<std::string>{"meeting=1"});

  Json::Value unknown(Json::objectValue);
  unknown["doc_id_field"] = "/v/s/none";
  unknown["db_name"] = "fileindex_s";
  EXPECT_EQ(FailCode(Request("update_term_suggestion", unknown)), 1107);
}

}  // namespace
}  // namespace vellis::searchd::testing
