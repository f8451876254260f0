// "document_search": query text, filters, sorting, paging and snippets, as a
// user's search reaches the daemon.
#include <gtest/gtest.h>

#include <algorithm>

#include "common/json_util.h"
#include "common/root_path.h"
#include "daemons/searchd/handler.h"
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

constexpr char kIndex[] = "fileindex_s";

class SearchTest : public ::testing::Test {
 protected:
  void SetUp() override {
    ASSERT_TRUE(handler_.Handle(CreateRequest(kIndex, root_.Path("/db")))["success"].asBool());
    Add("/v/s/docs/Quarterly Report.pdf", 5000, 300,
        {{"QORUMDTextContent", "The quarterly report shows revenue growth. Revenue rose again."},
         {"QORUMDTitle", "Q3 numbers"},
         {"QORUMDOwnerUserID", "1026"}});
    Add("/v/s/docs/budget.docx", 2048, 100,
        {{"QORUMDTextContent", "The annual budget for the café and the library."},
         {"QORUMDTitle", "Café Budget"},
         {"QORUMDOwnerUserID", "1027"}});
    Add("/v/s/docs/reversed.txt", 10, 200,
        {{"QORUMDTextContent", "budget annual, in the wrong order"}});
    Add("/v/s/docs2/hiddenfolder/plain.txt", 20, 400, {{"QORUMDTextContent", "nothing here"}});
    Add("/v/s/music/song.mp3", 4000000, 500,
        {{"QORUMDAuthors", "Jean-Luc Picard"},
         {"QORUMDDurationSecond", "241.5"},
         {"QORUMDMediaTypes", "Sound Stereo"}});
    Add("/v/s/music/track.FLAC", 9000000, 600, {{"QORUMDTitle", "Engage"}});
    Add("/v/s/mail/old.msg", 30, 700, {{"QORUMDTextContent", "a mail message"}});
    Add("/v/s/photos/IMG_0001.JPG", 300000, 800, {});
  }

  void Add(const std::string& path, int64_t size, int64_t mtime,
           std::vector<std::pair<std::string, std::string>> fields) {
    Json::Value doc = FileDoc(path, size, mtime);
    for (const auto& [k, v] : fields) doc[k] = v;
    Json::Value answer = handler_.Handle(UpsertRequest(kIndex, doc));
    ASSERT_TRUE(answer["success"].asBool()) << JsonToString(answer);
  }

  Json::Value Search(Json::Value data) {
    data["id"] = kIndex;
    Json::Value answer = handler_.Handle(Request("document_search", data));
    EXPECT_TRUE(answer["success"].asBool()) << JsonToString(data) << " -> " << JsonToString(answer);
    return answer["data"];
  }

  // The base names of the hits, sorted (or in hit order).
  std::vector<std::string> HitNames(const Json::Value& data, bool sorted = true) {
    std::vector<std::string> out;
    for (const Json::Value& hit : data["hits"]) {
      std::string id = hit["id"].asString();
      out.push_back(id.substr(id.rfind('/') + 1));
    }
    if (sorted) std::sort(out.begin(), out.end());
    return out;
  }

  TempRoot root_;
  FakePlatform platform_;
  ScopedPlatform scoped_{&platform_};
  SqliteEngine engine_{RootPath(kRegistryPath)};
  Handler handler_{engine_};
};

using Names = std::vector<std::string>;

TEST_F(SearchTest, QueryTextAndFiltersSelectTheRightFiles) {
  struct Case {
    const char* what;
    const char* request;  // members of "data" besides "id"
    Names expected;
  };
  const Case cases[] = {
      {"word in the text content", R"({"query": "revenue"})", {"Quarterly Report.pdf"}},
      {"case and diacritics folded", R"({"query": "CAFE"})", {"budget.docx"}},
      {"prefix word", R"({"query": "quart*"})", {"Quarterly Report.pdf"}},
      {"all words must match", R"({"query": "annual library"})", {"budget.docx"}},
      {"phrase keeps word order", R"({"query": "\"annual budget\""})", {"budget.docx"}},
      {"words in any order", R"({"query": "annual budget"})", {"budget.docx", "reversed.txt"}},
      {"keyword field matches the whole value",
       R"({"query": "QORUMDOwnerUserID:1026"})",
       {"Quarterly Report.pdf"}},
      {"keyword field does not match a part", R"({"query": "QORUMDOwnerUserID:102"})", {}},
      {"field kept out of the catch-all", R"({"query": "hiddenfolder"})", {}},
      {"white-space field keeps hyphenated words", R"({"query": "jean-luc"})", {"song.mp3"}},
      {"white-space field does not split at hyphens", R"({"query": "jean"})", {}},
      {"keyword value in the catch-all, whole", R"({"query": "\"sound stereo\""})", {"song.mp3"}},
      {"file name substring, any case", R"({"name": "EPO"})", {"Quarterly Report.pdf"}},
      {"file name substring with a blank", R"({"name": "ly rep"})", {"Quarterly Report.pdf"}},
      {"short file name substring", R"({"name": "mg"})", {"IMG_0001.JPG"}},
      {"query word found in a file name", R"({"query": "0001"})", {"IMG_0001.JPG"}},
      {"int field compares as a number", R"({"query": "QORUMDFSSize:2048.0"})", {"budget.docx"}},
      {"double field compares as a number",
       R"({"query": "QORUMDDurationSecond:241.50"})",
       {"song.mp3"}},
      {"bool field",
       R"({"query": "QORUMDIsDir:false", "path": "/v/s/music/"})",
       {"song.mp3", "track.FLAC"}},
      {"path prefix excludes a longer sibling",
       R"({"path": "/v/s/docs/"})",
       {"Quarterly Report.pdf", "budget.docx", "reversed.txt"}},
      {"audio category (extension case folded)",
       R"({"category": "audio"})",
       {"song.mp3", "track.FLAC"}},
      {"image category", R"({"category": ["image"]})", {"IMG_0001.JPG"}},
      {"document category as its list stands (msgc, not msg)",
       R"({"category": "document"})",
       {"Quarterly Report.pdf", "budget.docx", "plain.txt", "reversed.txt"}},
      {"two categories", R"({"category": ["video", "image"]})", {"IMG_0001.JPG"}},
      {"extension", R"({"extension": ["PDF", "msg"]})", {"Quarterly Report.pdf", "old.msg"}},
      {"size range",
       R"({"size": {"min": 1000, "max": 300000}})",
       {"IMG_0001.JPG", "Quarterly Report.pdf", "budget.docx"}},
      {"modification range",
       R"({"modified": {"from": 200, "to": 400}})",
       {"Quarterly Report.pdf", "plain.txt", "reversed.txt"}},
      {"words and filters together",
       R"({"query": "budget", "extension": "txt"})",
       {"reversed.txt"}},
  };
  for (const Case& c : cases) {
    Json::Value data = Search(Parse(c.request));
    Names expected = c.expected;
    std::sort(expected.begin(), expected.end());
    EXPECT_EQ(HitNames(data), expected) << c.what << ": " << c.request;
    EXPECT_EQ(data["total"].asUInt(), expected.size()) << c.what;
  }
}

TEST_F(SearchTest, QueryTextIsNeverTakenAsSearchSyntax) {
  const char* hostile[] = {
      "AND",       "OR OR",       "NOT budget", "budget)", "(\"",
      "NEAR(a b)", "col:^x",      "\"",         "*",       "-x +y",
      "a\"b\"c",   "{std_all}:x", "x * y",      "\\",      "'; DROP TABLE docs; --"};
  for (const char* text : hostile) {
    Json::Value data(Json::objectValue);
    data["query"] = text;
    data["name"] = text;
    Search(data);
  }
  Add("/v/s/docs/denial.txt", 1, 1, {{"QORUMDTextContent", "this is not a budget"}});
  Json::Value data(Json::objectValue);
  data["query"] = "NOT budget";
  EXPECT_EQ(HitNames(Search(data)), (Names{"denial.txt"})) << "NOT is a word like any other";
}

TEST_F(SearchTest, SortingAndPaging) {
  struct Case {
    const char* sort;
    const char* order;
    Names expected;  // the first three
  };
  const Case cases[] = {
      {"name", "asc", {"budget.docx", "IMG_0001.JPG", "old.msg"}},
      {"name", "desc", {"track.FLAC", "song.mp3", "reversed.txt"}},
      {"size", "desc", {"track.FLAC", "song.mp3", "IMG_0001.JPG"}},
      {"size", "asc", {"reversed.txt", "plain.txt", "old.msg"}},
      {"modified", "desc", {"IMG_0001.JPG", "old.msg", "track.FLAC"}},
  };
  for (const Case& c : cases) {
    Json::Value data(Json::objectValue);
    data["sort"] = c.sort;
    data["order"] = c.order;
    data["limit"] = 3;
    Json::Value page = Search(data);
    EXPECT_EQ(HitNames(page, false), c.expected) << c.sort << " " << c.order;
    EXPECT_EQ(page["total"].asInt(), 8) << c.sort << " " << c.order;
  }
  Json::Value data(Json::objectValue);
  data["sort"] = "size";
  data["offset"] = 6;
  data["limit"] = 5;
  Json::Value tail = Search(data);
  EXPECT_EQ(HitNames(tail, false), (Names{"song.mp3", "track.FLAC"}));
  EXPECT_EQ(tail["total"].asInt(), 8);
  EXPECT_EQ(tail["offset"].asInt(), 6);
}

TEST_F(SearchTest, RelevanceRanksTheBetterMatchFirst) {
  Json::Value data(Json::objectValue);
  data["query"] = "revenue";
  Add("/v/s/docs/once.txt", 1, 1,
      {{"QORUMDTextContent", "revenue was mentioned once among many other words of text here"}});
  Json::Value hits = Search(data)["hits"];
  ASSERT_EQ(hits.size(), 2u);
  EXPECT_EQ(hits[0]["id"].asString(), "/v/s/docs/Quarterly Report.pdf");
  EXPECT_GT(hits[0]["score"].asDouble(), hits[1]["score"].asDouble());
}

TEST_F(SearchTest, HitsCarryTheirFieldsAndAHighlightedSnippet) {
  Json::Value data(Json::objectValue);
  data["query"] = "growth";
  data["fields"].append("QORUMDTitle");
  data["fields"].append("QORUMDFSSize");
  data["highlight"]["pre"] = "[";
  data["highlight"]["post"] = "]";
  Json::Value hits = Search(data)["hits"];
  ASSERT_EQ(hits.size(), 1u);
  EXPECT_EQ(hits[0]["fields"].getMemberNames(), (Names{"QORUMDFSSize", "QORUMDTitle"}));
  EXPECT_EQ(hits[0]["fields"]["QORUMDTitle"].asString(), "Q3 numbers");
  EXPECT_NE(hits[0]["snippet"].asString().find("revenue [growth]"), std::string::npos)
      << hits[0]["snippet"].asString();

  Json::Value plain(Json::objectValue);
  plain["path"] = "/v/s/mail/";
  Json::Value mail = Search(plain)["hits"];
  ASSERT_EQ(mail.size(), 1u);
  EXPECT_EQ(mail[0]["snippet"].asString(), "a mail message") << "no query words: the text's start";
  EXPECT_FALSE(mail[0]["fields"].isMember("QORUMDTextContent")) << "text comes only when asked";
  EXPECT_EQ(mail[0]["fields"]["QORUMDPath"].asString(), "/v/s/mail/old.msg");
}

}  // namespace
}  // namespace vellis::searchd::testing
