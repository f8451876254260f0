// The daemon's protocol, request in and answer out, over the SQLite engine
// under a temporary root: index and document commands, then searches.
#include "daemons/searchd/handler.h"

#include <gtest/gtest.h>
#include <sqlite3.h>
#include <unistd.h>

#include <algorithm>
#include <tuple>

#include "common/fs_util.h"
#include "common/root_path.h"
#include "daemons/searchd/registry.h"
#include "daemons/searchd/sqlite_engine.h"
#include "tests/daemons/searchd/searchd_fixture.h"
#include "tests/support/fake_platform.h"
#include "tests/support/temp_root.h"

namespace vellis::searchd::testing {
namespace {

using Paths = std::vector<std::string>;

// Query data for the documents below `prefix`; `fields`: JSON list items to load.
std::string Query(const std::string& prefix, const std::string& fields = "") {
  return R"({"query": {"qsl": {"prefix": {"QORUMDPath": ")" + prefix + "\"}}}" +
         (fields.empty() ? "" : R"(, "load_field": [)" + fields + "]") + "}";
}

// The handler with index "s" created in db_. A short busy wait lets a
// write-locked index answer busy quickly.
class HandlerTest : public ::testing::Test {
 protected:
  void SetUp() override { Ok(CreateRequest("s", db_)); }

  Json::Value Ok(const Json::Value& request) { return DataOf(request, handler_.Handle(request)); }
  Json::Value Ok(const char* command, const std::string& data = "{}") {
    return Ok(Request(command, data));
  }
  // Each request in turn: `want` (JSON text) is the error code of a failed
  // answer, or what the data of a successful one holds.
  void Script(const std::vector<std::pair<Json::Value, std::string>>& steps) {
    for (const auto& [request, want_text] : steps) {
      Json::Value answer = handler_.Handle(request), want = ParseJson(want_text);
      EXPECT_TRUE(want.isInt() ? answer["error"]["code"] == want
                               : answer["success"].asBool() && Holds(answer["data"], want))
          << JsonToString(request).substr(0, 300) << "\n-> " << JsonToString(answer) << "\nwanted "
          << want_text;
    }
  }

  // The paths of the documents below `prefix`, in path order.
  Paths Below(const std::string& prefix) {
    Paths out;
    for (const Json::Value& doc : Ok("document_get_by_query", Query(prefix, R"("QORUMDPath")"))) {
      out.push_back(doc["QORUMDPath"].asString());
    }
    return out;
  }

  ::vellis::testing::TempRoot root_;
  ::vellis::testing::FakePlatform platform_;
  ::vellis::testing::ScopedPlatform scoped_{&platform_};
  SqliteEngine engine_{RootPath(kRegistryPath), /*busy_timeout_ms=*/50};
  Handler handler_{engine_};
  std::string db_ = root_.Path("/volume1/@qoruindex");
};

// Create (in SetUp), list, stats, rename and move, delete: the database file
// follows, and pending writes travel with the index.
TEST_F(HandlerTest, IndexCommandsKeepTheListAndTheDatabaseFileInStep) {
  const std::string v2 = root_.Path("/volume2"), v3 = root_.Path("/volume3");
  auto exists = [](const std::string& path) { return access(path.c_str(), F_OK) == 0; };
  EXPECT_GT(Ok("index_stats")["disk_bytes"].asInt64(), 0);
  Script({{CreateRequest("s", db_ + "/"), "{}"},  // the same folder again: nothing changes
          {CreateRequest("s", root_.Path("/elsewhere")), "1105"},
          {Upsert("/v/a.mp3"), "{}"},
          {Request("index_list"), R"([{"id": "s", "path": ")" + db_ + R"(", "paused": false}])"},
          {Request("index_stats"), R"({"id": "s", "documents": 1, "paused": false})"},
          {Request("index_config_set", R"({"data": {"id": "t", "path": ")" + v2 + "\"}}"), "{}"},
          {Request("index_stats"), "1104"},
          {Request("index_config_set", R"({"data": {"path": ")" + v3 + "\"}}", "t"), "{}"},
          {Request("index_stats", "{}", "t"), R"({"documents": 1, "path": ")" + v3 + "\"}"},
          {CreateRequest("u", db_), "{}"},
          {Request("index_config_set", R"({"data": {"id": "t"}})", "u"), "1105"},
          {Request("index_delete", "{}", "u"), "{}"},
          {Request("index_list"), R"([{"id": "t"}])"},
          {Request("index_delete", "{}", "u"), "1104"}});
  EXPECT_FALSE(exists(db_ + "/s.sqlite") || exists(db_ + "/u.sqlite") || exists(v2 + "/t.sqlite"));
  EXPECT_TRUE(exists(v3 + "/t.sqlite"));
}

// Upsert replaces a whole document, set only the fields given; deletion goes
// by id or by a path prefix that is taken literally.
TEST_F(HandlerTest, DocumentsAreWrittenReadAndDeleted) {
  const std::string get = Query("/v/s/", R"("QORUMDTitle", "QORUMDKeywords", "QORUMDFSSize",
                                             "QORUMDNoSuchField")");
  const std::string set = R"({"doc_id": "/v/s/a.txt", "data": {"QORUMDTitle": "2nd"}})";
  auto page = [](const std::string& after, int limit) {
    std::string q = Query("/v/d/", R"("QORUMDPath")");
    return q.substr(0, q.size() - 1) + R"(, "after": ")" + after + R"(", "limit": )" +
           std::to_string(limit) + "}";
  };
  for (const char* p : {"/v/d/a", "/v/d/a/x", "/v/d/a/y/z", "/v/d/ab", "/v/d/ab/w"}) Ok(Upsert(p));
  Script({{Upsert("/v/s/a.txt", R"({"QORUMDTitle": "First", "QORUMDKeywords": "k1"})"), "{}"},
          {Request("document_set_by_id", set), "{}"},
          {Request("document_get_by_query", get),
           R"([{"QORUMDTitle": "2nd", "QORUMDKeywords": "k1", "QORUMDFSSize": 100,
                "QORUMDPath": null}])"},  // only the stored fields asked for
          {Request("document_set_by_id", R"({"doc_id": "/v/s/b.txt", "data": {}})"), "1107"},
          {Upsert("/v/s/a.txt", R"({"QORUMDFSSize": 20})"), "{}"},
          {Request("document_get_by_query", get),
           R"([{"QORUMDTitle": null, "QORUMDKeywords": null, "QORUMDFSSize": 20}])"},
          // Pages of a subtree in path (byte) order: after a path, at most n.
          {Request("document_get_by_query", page("", 2)), R"([{"QORUMDPath": "/v/d/a"},
                                                              {"QORUMDPath": "/v/d/a/x"}])"},
          {Request("document_get_by_query", page("/v/d/a/x", 2)),
           R"([{"QORUMDPath": "/v/d/a/y/z"}, {"QORUMDPath": "/v/d/ab"}])"},
          {Request("document_get_by_query", page("/v/d/ab/w", 2)), "[]"},
          {Request("document_get_by_query", page("", -1)), "1102"},
          {Request("document_del_by_query", Query("/v/d/a/")), R"({"deleted": 2})"},
          {Request("document_del_by_id", R"({"doc_id": "/v/d/ab"})"), R"({"deleted": true})"},
          {Request("document_del_by_id", R"({"doc_id": "/v/d/ab"})"), R"({"deleted": false})"}});
  EXPECT_EQ(Below("/v/d/"), (Paths{"/v/d/a", "/v/d/ab/w"}));
}

// A directory move as the indexer carries it out: the item itself, then a
// query for everything below it, then one compound request of updates.
TEST_F(HandlerTest, RenameOfADirectoryWithAThousandDocuments) {
  std::vector<Json::Value> adds{Upsert("/v/s/a"), Upsert("/v/s/ab/keep.txt")};
  for (int i = 0; i < 1000; ++i)
    adds.push_back(Upsert("/v/s/a/d" + std::to_string(i % 10) + "/f" + std::to_string(i)));
  EXPECT_FALSE(handler_.Handle(Compound(adds))["has_fail"].asBool());
  Ok("document_set_by_id", R"({"doc_id": "/v/s/a", "data": {"QORUMDPath": "/v/s/b"}})");
  std::vector<Json::Value> moves;
  for (const std::string& from : Below("/v/s/a/")) {
    moves.push_back(Request("document_set_by_id", R"({"doc_id": ")" + from +
                                                      R"(", "data": {"QORUMDPath": "/v/s/b)" +
                                                      from.substr(6) + "\"}}"));
  }
  ASSERT_EQ(moves.size(), 1000u);
  EXPECT_FALSE(handler_.Handle(Compound(moves))["has_fail"].asBool());
  Paths moved = Below("/v/s/b/");
  EXPECT_EQ(moved.size(), 1000u);
  EXPECT_EQ(std::count(moved.begin(), moved.end(), "/v/s/b/d7/f417"), 1);
  EXPECT_EQ(Below("/v/s/a"), (Paths{"/v/s/ab/keep.txt"})) << "nothing left below /v/s/a/";
}

TEST_F(HandlerTest, CompoundAnswersEachSubRequestInOrder) {
  Json::Value answer = handler_.Handle(Compound(
      {Upsert("/v/s/one"), Request("document_set_by_id", R"({"doc_id": "/v/s/gone", "data": {}})"),
       Upsert("/v/s/two"), Request("commit"), Compound({})}));
  EXPECT_TRUE(Holds(answer, ParseJson(R"({"success": true, "has_fail": true, "data": [
      {"success": true}, {"success": false, "error": {"code": 1107}}, {"success": true},
      {"success": true}, {"success": false, "error": {"code": 1102}}]})")))
      << JsonToString(answer);
  EXPECT_NE(answer["data"][1]["error"]["msg"].asString().find("/v/s/gone"), std::string::npos);
  EXPECT_EQ(Below("/v/s/"), (Paths{"/v/s/one", "/v/s/two"}));
  EXPECT_FALSE(handler_.Handle(Compound({Request("commit")}))["has_fail"].asBool());
}

// A write refused for its values or by a paused index leaves the stored
// document as it was; a paused index still answers reads.
TEST_F(HandlerTest, RefusedWritesLeaveTheStoredDocumentAsItWas) {
  const std::string doc = R"({"QORUMDFSSize": 7, "QORUMDTextContent": "original"})";
  const std::string set = R"({"doc_id": "/v/s/a.txt", "data": )",
                    del = R"({"doc_id": "/v/s/a.txt"})";
  Json::Value other_identity = Upsert("/v/s/b.txt");
  other_identity["data"]["doc_id"] = "/v/s/a.txt";
  Script({{Upsert("/v/s/a.txt", doc), "{}"},
          {Upsert("/v/s/a.txt", R"({"QORUMDFSSize": "seven"})"), "1109"},
          {Upsert("/v/s/a.txt", R"({"QORUMDIsDir": "maybe"})"), "1109"},
          {Request("document_set_by_id", set + R"({"QORUMDPath": null}})"), "1108"},
          {Request("document_set_by_id", set + R"({"QORUMDDurationSecond": {}}})"), "1109"},
          {other_identity, "1102"},
          {Request("index_pause"), "{}"},
          {Upsert("/v/s/new.txt"), "1106"},
          {Request("document_set_by_id", set + R"({"QORUMDFSSize": 8}})"), "1106"},
          {Request("document_del_by_id", del), "1106"},
          {Request("document_del_by_query", Query("/v/")), "1106"},
          {Request("index_stats"), R"({"paused": true, "documents": 1})"},
          {Request("document_search", R"({"query": "original"})"), R"({"total": 1})"},
          {Request("document_get_by_query", Query("/v/s/")), "[" + doc + "]"},
          {Request("index_resume"), "{}"},
          {Request("document_del_by_id", del), R"({"deleted": true})"}});
}

TEST_F(HandlerTest, BadRequestsAnswerACodeAndANamingMessage) {
  auto cmd = [](const std::string& command, const std::string& data) {
    return R"({"command": ")" + command + R"(", "data": )" + data + "}";
  };
  // The request's text, the answer's code, a part of its message.
  const std::tuple<std::string, int, const char*> cases[] = {
      {"not json", 1100, "not a JSON object"},
      {R"({"data": {}})", 1102, "command is missing"},
      {R"({"command": 5, "data": {}})", 1102, "command must be a string"},
      {R"({"compound": {}})", 1102, "compound must be an array"},
      {cmd("index_explode", "{}"), 1101, "index_explode"},
      {cmd("commit", "[]"), 1102, "data must be an object"},
      {cmd("commit", "{}"), 1102, "data.id is missing"},
      {cmd("commit", R"({"id": "nope"})"), 1104, "nope"},
      {cmd("commit", R"({"id": "../etc"})"), 1103, R"("/")"},
      {cmd("commit", R"({"id": ".."})"), 1103, R"("..")"},
      {cmd("commit", R"({"id": "a\u0000b"})"), 1103, "NUL"},
      {cmd("commit", R"({"id": ""})"), 1103, "empty"},
      {cmd("index_create", R"({"id": "x", "path": "rel", "mappings": {}})"), 1103, "absolute"},
      {cmd("index_create", R"({"id": "x", "path": "/a/../b", "mappings": {}})"), 1103, R"("..")"},
      {cmd("index_create", R"({"id": "x", "path": "/x", "mappings": {}})"), 1111, "property_id"},
      {cmd("index_create", R"({"id": "x", "path": "/x", "mappings": {"property_id": "P",
                              "properties": {"F": {"type": "blob"}}}})"),
       1111, "blob"},
      {cmd("document_upsert_by_id", R"({"id": "s", "data": {}})"), 1102, "data.doc_id is missing"},
      {cmd("document_del_by_query", R"({"id": "s", "query": {"qsl": {"prefix": {"F": "a"}}}})"),
       1110, "QORUMDPath"},
      {cmd("document_get_by_query", R"({"id": "s", "query": {}})"), 1102, "qsl is missing"},
      {cmd("document_search", R"({"id": "s", "sort": "colour"})"), 1110, "colour"},
      {cmd("document_search", R"({"id": "s", "category": "books"})"), 1110, "books"},
      {cmd("document_search", R"({"id": "s", "limit": 100000})"), 1110, "limit"},
      {cmd("index_config_set", R"({"id": "s", "data": {}})"), 1102, R"("id" or "path")"},
  };
  for (const auto& [text, code, msg_part] : cases) {
    Json::Value answer = ParseJson(handler_.HandleText(text));
    EXPECT_TRUE(answer["error"]["code"] == code &&
                answer["error"]["msg"].asString().find(msg_part) != std::string::npos)
        << text << "\n-> " << JsonToString(answer) << "\nwanted " << code << ", " << msg_part;
  }
  EXPECT_EQ(Ok("index_list").size(), 1u) << "no bad request created an index";
}

TEST_F(HandlerTest, IdleUpkeepMergesAndKeepsEveryDocumentFindable) {
  for (int i = 0; i < 300; ++i) {  // six commits leave six segments
    const std::string text = "common batch" + std::to_string(i / 50);
    Ok(Upsert("/v/s/" + std::to_string(i), R"({"QORUMDTextContent": ")" + text + "\"}"));
    if (i % 50 == 49) Ok("commit");
  }
  EXPECT_TRUE(Ok("index_stats")["merging"].asBool());
  int steps = 0;
  while (handler_.Idle() && steps < 1000) ++steps;
  EXPECT_TRUE(steps > 0 && steps < 1000) << steps << " upkeep steps";
  Script({{Request("index_stats"), R"({"merging": false})"},
          {Request("document_search", R"({"query": "common"})"), R"({"total": 300})"},
          {Request("document_search", R"({"query": "batch3"})"), R"({"total": 50})"},
          {Upsert("/v/s/late.txt"), "{}"}});
  EXPECT_FALSE(handler_.Idle()) << "no upkeep while writes are uncommitted";
}

TEST_F(HandlerTest, WriteLockedByAnotherProcessAnswersBusyAndLosesNothing) {
  Ok(Compound({Upsert("/v/s/first"), Request("commit")}));
  sqlite3* other = nullptr;  // another process's connection, holding the write lock
  ASSERT_EQ(sqlite3_open((db_ + "/s.sqlite").c_str(), &other), SQLITE_OK);
  ASSERT_EQ(sqlite3_exec(other, "BEGIN IMMEDIATE", nullptr, nullptr, nullptr), SQLITE_OK);
  Script({{Upsert("/v/s/second"), "1400"},
          {Request("document_search"), R"({"total": 1})"}});  // reads go on
  sqlite3_close(other);                                       // rolls its transaction back
  Script({{Upsert("/v/s/second"), "{}"},                      // the repeated request succeeds
          {Request("document_search"), R"({"total": 2})"}});
}

TEST_F(HandlerTest, TermSuggestionsFollowTheirDocuments) {
  auto refresh = [](const std::string& doc) {
    return Request("update_term_suggestion", R"({"db_name": "s", "doc_id_field": ")" + doc + "\"}");
  };
  Script(
      {{Upsert("/v/s/Budget 2024.xlsx", R"({"QORUMDTitle": "Annual budget"})"), "{}"},
       {Upsert("/v/s/notes.txt", R"({"QORUMDTitle": "Budget notes"})"), "{}"},
       {Compound({refresh("/v/s/Budget 2024.xlsx"), refresh("/v/s/notes.txt")}),
        R"([{"success": true}, {"success": true}])"},
       {Request("term_suggest", R"({"prefix": "bu"})"), R"([{"term": "budget", "documents": 2}])"},
       {Request("term_suggest", R"({"prefix": "NO"})"), R"([{"term": "notes", "documents": 1}])"},
       {Upsert("/v/s/notes.txt", R"({"QORUMDTitle": "Meeting"})"), "{}"},
       {refresh("/v/s/notes.txt"), "{}"},
       {Request("term_suggest", R"({"prefix": "bu"})"), R"([{"term": "budget", "documents": 1}])"},
       {Request("term_suggest", R"({"prefix": "me"})"), R"([{"term": "meeting", "documents": 1}])"},
       {refresh("/v/s/none"), "1107"}});
}

// "document_search": query text, filters, sorting, paging and snippets, as a
// user's search reaches the daemon.
class SearchTest : public HandlerTest {
 protected:
  void SetUp() override {
    HandlerTest::SetUp();
    const Json::Value docs = ParseJson(R"([
      ["/v/s/docs/Quarterly Report.pdf", {"QORUMDFSSize": 5000, "QORUMDFSContentChangeDate": 300,
        "QORUMDTitle": "Q3 numbers", "QORUMDOwnerUserID": "1026", "QORUMDTextContent":
        "The quarterly report shows revenue growth. Revenue rose again."}],
      ["/v/s/docs/budget.docx", {"QORUMDFSSize": 2048, "QORUMDFSContentChangeDate": 100,
        "QORUMDTitle": "Café Budget", "QORUMDOwnerUserID": "1027", "QORUMDTextContent":
        "The annual budget for the café and the library."}],
      ["/v/s/docs/reversed.txt", {"QORUMDFSSize": 10, "QORUMDFSContentChangeDate": 200,
        "QORUMDTextContent": "budget annual, in the wrong order"}],
      ["/v/s/docs2/hiddenfolder/plain.txt", {"QORUMDFSSize": 20, "QORUMDFSContentChangeDate": 400,
        "QORUMDTextContent": "nothing here"}],
      ["/v/s/music/song.mp3", {"QORUMDFSSize": 4000000, "QORUMDFSContentChangeDate": 500,
        "QORUMDAuthors": "Jean-Luc Picard", "QORUMDDurationSecond": "241.5",
        "QORUMDMediaTypes": "Sound Stereo"}],
      ["/v/s/music/track.FLAC", {"QORUMDFSSize": 9000000, "QORUMDFSContentChangeDate": 600,
        "QORUMDTitle": "Engage"}],
      ["/v/s/mail/old.msg", {"QORUMDFSSize": 30, "QORUMDFSContentChangeDate": 700,
        "QORUMDTextContent": "a mail message"}],
      ["/v/s/photos/IMG_0001.JPG", {"QORUMDFSSize": 300000, "QORUMDFSContentChangeDate": 800}]])");
    for (const Json::Value& d : docs) Ok(Upsert(d[0].asString(), JsonToString(d[1])));
  }

  // The base names of the hits, sorted or in hit order, joined by ", ".
  static std::string Hits(const Json::Value& data, bool sorted = true) {
    std::vector<std::string> names;
    for (const Json::Value& hit : data["hits"]) names.push_back(Basename(hit["id"].asString()));
    if (sorted) std::sort(names.begin(), names.end());
    std::string out;
    for (const std::string& n : names) out += (out.empty() ? "" : ", ") + n;
    return out;
  }
};

TEST_F(SearchTest, QueryTextAndFiltersSelectTheRightFiles) {
  // What is searched for, the search's data (besides "id"), the files found.
  const std::tuple<const char*, const char*, const char*> cases[] = {
      {"text word", R"({"query": "revenue"})", "Quarterly Report.pdf"},
      {"case, diacritics folded", R"({"query": "CAFE"})", "budget.docx"},
      {"prefix word", R"({"query": "quart*"})", "Quarterly Report.pdf"},
      {"all words must match", R"({"query": "annual library"})", "budget.docx"},
      {"phrase keeps word order", R"({"query": "\"annual budget\""})", "budget.docx"},
      {"words in any order", R"({"query": "annual budget"})", "budget.docx, reversed.txt"},
      {"keyword: whole value", R"({"query": "QORUMDOwnerUserID:1026"})", "Quarterly Report.pdf"},
      {"keyword: not a part", R"({"query": "QORUMDOwnerUserID:102"})", ""},
      {"kept out of catch-all", R"({"query": "hiddenfolder"})", ""},
      {"white space: hyphen kept", R"({"query": "jean-luc"})", "song.mp3"},
      {"white space: no split", R"({"query": "jean"})", ""},
      {"keyword in catch-all", R"({"query": "\"sound stereo\""})", "song.mp3"},
      {"name part, any case", R"({"name": "EPO"})", "Quarterly Report.pdf"},
      {"name part with blank", R"({"name": "ly rep"})", "Quarterly Report.pdf"},
      {"short name part", R"({"name": "mg"})", "IMG_0001.JPG"},
      {"word of a file name", R"({"query": "0001"})", "IMG_0001.JPG"},
      {"int as a number", R"({"query": "QORUMDFSSize:2048.0"})", "budget.docx"},
      {"double as a number", R"({"query": "QORUMDDurationSecond:241.50"})", "song.mp3"},
      {"bool", R"({"query": "QORUMDIsDir:false", "path": "/v/s/music/"})", "song.mp3, track.FLAC"},
      {"path prefix, not /v/s/docs2", R"({"path": "/v/s/docs/"})",
       "Quarterly Report.pdf, budget.docx, reversed.txt"},
      {"extension case folded", R"({"category": "audio"})", "song.mp3, track.FLAC"},
      {"image category", R"({"category": ["image"]})", "IMG_0001.JPG"},
      {"msgc, not msg", R"({"category": "document"})",
       "Quarterly Report.pdf, budget.docx, plain.txt, reversed.txt"},
      {"two categories", R"({"category": ["video", "image"]})", "IMG_0001.JPG"},
      {"extension", R"({"extension": ["PDF", "msg"]})", "Quarterly Report.pdf, old.msg"},
      {"size range", R"({"size": {"min": 1000, "max": 300000}})",
       "IMG_0001.JPG, Quarterly Report.pdf, budget.docx"},
      {"modification range", R"({"modified": {"from": 200, "to": 400}})",
       "Quarterly Report.pdf, plain.txt, reversed.txt"},
      {"words and filter", R"({"query": "budget", "extension": "txt"})", "reversed.txt"},
      {"NOT is a word", R"({"query": "NOT budget"})", ""},
  };
  for (const auto& [what, request, files] : cases) {
    Json::Value data = Ok("document_search", request);
    EXPECT_EQ(Hits(data), files) << what << ": " << request;
    EXPECT_EQ(data["total"].asUInt(), data["hits"].size()) << what;
  }
  // Text that looks like search syntax is searched for as it is.
  for (const char* text :
       {"AND", "OR OR", "budget)", "(\"", "NEAR(a b)", "col:^x", "\"", "*", "-x +y", "a\"b\"c",
        "{std_all}:x", "x * y", "\\", "'; DROP TABLE docs"}) {
    Json::Value data(Json::objectValue);
    data["query"] = data["name"] = text;
    EXPECT_EQ(Hits(Ok(Request("document_search", JsonToString(data)))), "") << text;
  }
}

TEST_F(SearchTest, SortingAndPaging) {
  const std::pair<const char*, const char*> cases[] = {
      // search data, files in hit order
      {R"({"sort": "name", "order": "asc", "limit": 3})", "budget.docx, IMG_0001.JPG, old.msg"},
      {R"({"sort": "name", "order": "desc", "limit": 3})", "track.FLAC, song.mp3, reversed.txt"},
      {R"({"sort": "size", "order": "desc", "limit": 3})", "track.FLAC, song.mp3, IMG_0001.JPG"},
      {R"({"sort": "size", "order": "asc", "limit": 3})", "reversed.txt, plain.txt, old.msg"},
      {R"({"sort": "modified", "order": "desc", "limit": 3})", "IMG_0001.JPG, old.msg, track.FLAC"},
      {R"({"sort": "size", "offset": 6, "limit": 5})", "song.mp3, track.FLAC"},
  };
  for (const auto& [request, files] : cases) {
    Json::Value page = Ok("document_search", request);
    EXPECT_EQ(Hits(page, false), files) << request;
    EXPECT_EQ(page["total"].asInt(), 8) << request;
    EXPECT_EQ(page["offset"], ParseJson(request)["offset"].asInt()) << request;
  }
}

TEST_F(SearchTest, HitsComeByRelevanceWithTheFieldsAskedForAndASnippet) {
  Ok(Upsert("/v/s/docs/once.txt", R"({"QORUMDTextContent": "revenue, once among other words"})"));
  Json::Value hits = Ok("document_search", R"({"query": "revenue", "highlight": {"pre": "[",
      "post": "]"}, "fields": ["QORUMDTitle", "QORUMDFSSize"]})")["hits"];
  EXPECT_TRUE(Holds(hits, ParseJson(R"([{"id": "/v/s/docs/Quarterly Report.pdf", "fields":
      {"QORUMDFSSize": 5000, "QORUMDTitle": "Q3 numbers", "QORUMDPath": null}},
      {"id": "/v/s/docs/once.txt"}])")))
      << hits;
  EXPECT_GT(hits[0]["score"].asDouble(), hits[1]["score"].asDouble());
  EXPECT_NE(hits[0]["snippet"].asString().find("[revenue] growth"), std::string::npos) << hits;
  Script({{Request("document_search", R"({"path": "/v/s/mail/"})"),  // no query words
           R"({"hits": [{"snippet": "a mail message", "fields": {"QORUMDTextContent": null,
               "QORUMDPath": "/v/s/mail/old.msg"}}]})"}});           // text only when asked
}

}  // namespace
}  // namespace vellis::searchd::testing
