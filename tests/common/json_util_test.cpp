#include "common/json_util.h"

#include <dirent.h>
#include <errno.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "tests/support/parse_json.h"
#include "tests/support/temp_root.h"

namespace vellis {
namespace {

using testing::ReadFile;
using testing::TempRoot;
using testing::WriteFile;

using testing::ParseJson;

std::string Nested(int depth) { return std::string(depth, '[') + std::string(depth, ']'); }

// The reason of the Error thrown by GetJsonValue<T>, or "" when none is.
template <typename T>
std::string GetReason(const std::string& obj, const std::string& key, bool required) {
  T out{};
  try {
    GetJsonValue(out, ParseJson(obj), key, required);
  } catch (const Error& e) {
    EXPECT_EQ(e.GetCode(), kErrBadArgument) << obj;
    return e.what();
  }
  return "";
}

TEST(GetJsonValueTest, RefusesWithReasonAndData) {
  struct Case {
    std::string reason;
    std::string expected;
  } cases[] = {
      {GetReason<int>(R"({"a":"x"})", "a", true), R"(Not a string, data={"a":"x"})"},
      {GetReason<std::string>(R"({"a":[1]})", "a", true), R"(Not a string, data={"a":[1]})"},
      {GetReason<unsigned int>(R"({"a":-1})", "a", true), R"(Not a string, data={"a":-1})"},
      {GetReason<int>(R"({"a":4294967296})", "a", true), R"(Not a string, data={"a":4294967296})"},
      {GetReason<bool>(R"({"a":1})", "b", true), R"(Missing property: b, data={"a":1})"},
      {GetReason<Json::Value>(R"({"a":1})", "b", true), R"(Missing property: b, data={"a":1})"},
      {GetReason<std::string>("[1]", "a", true), "Not an object, data=[1]"},
      {GetReason<int>("null", "a", false), "Not an object, data=null"},
      {GetReason<Json::Value>(R"("s")", "a", false), R"(Not an object, data="s")"},
  };
  for (const auto& c : cases) EXPECT_EQ(c.reason, c.expected);
}

TEST(GetJsonValueTest, OptionalMissingOrUnconvertibleLeavesOutUntouched) {
  const Json::Value obj = ParseJson(R"({"s":"x","arr":[1],"neg":-5,"obj":{}})");
  for (const char* key : {"missing", "s", "arr", "obj"}) {
    int i = 42;
    GetJsonValue(i, obj, key, false);
    EXPECT_EQ(i, 42) << key;
  }
  unsigned int u = 7;
  GetJsonValue(u, obj, "neg", false);
  EXPECT_EQ(u, 7u);
  std::string s = "keep";
  GetJsonValue(s, obj, "arr", false);
  EXPECT_EQ(s, "keep");
  Json::Value v = "keep";
  GetJsonValue(v, obj, "missing", false);
  EXPECT_EQ(v, Json::Value("keep"));
}

TEST(GetJsonValueTest, NullMemberYieldsTheEmptyValueForEveryType) {
  const Json::Value obj = ParseJson(R"({"n":null})");
  std::string s = "x";
  bool b = true;
  int i = 1;
  unsigned int u = 1;
  long long ll = 1;
  double d = 1.5;
  GetJsonValue(s, obj, "n", true);
  GetJsonValue(b, obj, "n", true);
  GetJsonValue(i, obj, "n", true);
  GetJsonValue(u, obj, "n", true);
  GetJsonValue(ll, obj, "n", true);
  GetJsonValue(d, obj, "n", true);
  EXPECT_EQ(s, "");
  EXPECT_FALSE(b);
  EXPECT_EQ(i + static_cast<long long>(u) + ll, 0);
  EXPECT_EQ(d, 0.0);
}

// These conversions are the JSON library's own rules (isConvertibleTo and
// asString/asBool/...); the helpers must not make them stricter.
TEST(GetJsonValueTest, FollowsTheJsonLibraryConversions) {
  const Json::Value obj =
      ParseJson(R"({"t":true,"one":1,"real":2.0,"big":3000000000,"huge":9007199254740993})");
  struct Case {
    std::string key;
    std::string as_string;
  } strings[] = {{"t", "true"}, {"one", "1"}, {"big", "3000000000"}};
  for (const auto& c : strings) {
    std::string s;
    GetJsonValue(s, obj, c.key, true);
    EXPECT_EQ(s, c.as_string) << c.key;
  }
  bool b = false;
  GetJsonValue(b, obj, "one", true);
  EXPECT_TRUE(b);
  int i = 0;
  GetJsonValue(i, obj, "real", true);
  EXPECT_EQ(i, 2);
  long long big = 0, huge = 0;
  GetJsonValue(big, obj, "big", true);
  GetJsonValue(huge, obj, "huge", true);
  EXPECT_EQ(big, 3000000000LL);
  EXPECT_EQ(huge, 9007199254740993LL);
}

TEST(JsonArrTest, ConvertsStringVectorsBothWays) {
  const std::vector<std::string> vec = {"a", "", "\xc3\xa9"};
  EXPECT_EQ(JsonToString(Vec2JsonArr(vec)), "[\"a\",\"\",\"\xc3\xa9\"]");
  EXPECT_EQ(JsonArr2Vec<std::string>(Vec2JsonArr(vec)), vec);
  EXPECT_EQ(JsonArr2Vec<std::string>(ParseJson(R"([1,true,null])")),
            (std::vector<std::string>{"1", "true", ""}));
  EXPECT_TRUE(JsonArr2Vec<std::string>(ParseJson(R"({"a":"b"})")).empty());
  try {
    JsonArr2Vec<std::string>(ParseJson(R"(["a",{}])"));
    ADD_FAILURE() << "an object element was accepted";
  } catch (const Error& e) {
    EXPECT_EQ(e.GetCode(), kErrBadArgument);
    EXPECT_STREQ(e.what(), R"(Not a string, data=["a",{}])");
  }
}

TEST(JsonApplyChangesTest, MergesObjectsRemovesNullsReplacesTheRest) {
  struct Case {
    std::string target, changes, expected;
  } cases[] = {
      {R"({"a":1,"b":{"c":2,"d":3}})", R"({"a":null,"b":{"c":5}})", R"({"b":{"c":5,"d":3}})"},
      {R"({"a":[1,2,3]})", R"({"a":[4]})", R"({"a":[4]})"},
      {R"({"a":{"x":1}})", R"({"a":[]})", R"({"a":[]})"},
      {R"({"a":7})", R"({"a":{"b":{"c":1}}})", R"({"a":{"b":{"c":1}}})"},
      {R"({"a":1})", R"({"gone":null,"b":{"c":null}})", R"({"a":1,"b":{}})"},
      {R"({"a":1})", R"({"b":{}})", R"({"a":1,"b":{}})"},
      {R"({"a":5})", R"({"a":{}})", R"({"a":{}})"},
      {R"({"a":1})", R"([1])", R"({"a":1})"},
  };
  for (const auto& c : cases) {
    Json::Value target = ParseJson(c.target);
    JsonApplyChanges(target, ParseJson(c.changes));
    EXPECT_EQ(JsonToString(target), c.expected) << c.target << " + " << c.changes;
  }
}

TEST(JsonFromStringTest, RefusesMalformedText) {
  const std::string cases[] = {
      "",
      "   ",
      "{} x",
      "1 2",
      "[1,]",
      "{'a':1}",
      "// note\n{}",
      "{} /* note */",
      "[NaN]",
      std::string("\"a\0b\"", 5),
      std::string("{}\0", 3),
      "\"\xff\"",
      "\"\xc0\xaf\"",          // overlong "/"
      "\"\xe0\x80\xaf\"",      // overlong "/" in three bytes
      "\"\xed\xa0\x80\"",      // an encoded surrogate
      "\"\xe2\x82\"",          // a truncated sequence
      "\"\xf4\x90\x80\x80\"",  // above U+10FFFF
      Nested(1001),
  };
  for (const auto& text : cases) {
    Json::Value v;
    EXPECT_FALSE(JsonFromString(v, text)) << text.substr(0, 40);
  }
}

TEST(JsonFromStringTest, AcceptsUtf8AndDeepButBoundedNesting) {
  Json::Value v;
  ASSERT_TRUE(JsonFromString(v, " {\"k\":\"h\xc3\xa9 \xe2\x82\xac \xf0\x9f\x98\x80\"}\n"));
  EXPECT_EQ(v["k"].asString(), "h\xc3\xa9 \xe2\x82\xac \xf0\x9f\x98\x80");
  EXPECT_TRUE(JsonFromString(v, Nested(1000)));
  ASSERT_TRUE(JsonFromString(v, R"("a\u0000b")"));  // an escaped NUL is valid JSON
  EXPECT_EQ(v.asString(), std::string("a\0b", 3));
}

TEST(JsonToStringTest, OneLineKeyOrderUtf8Kept) {
  const Json::Value v =
      ParseJson("{\"b\":[true,null],\"a\":\"\xc3\xa9\\n\\u0001\",\"c\":{\"z\":1,\"y\":2}}");
  const std::string text = JsonToString(v);
  EXPECT_EQ(text, "{\"a\":\"\xc3\xa9\\n\\u0001\",\"b\":[true,null],\"c\":{\"y\":2,\"z\":1}}");
  EXPECT_EQ(text.find('\n'), std::string::npos);
  EXPECT_EQ(ParseJson(text), v);
}

class JsonFileTest : public ::testing::Test {
 protected:
  void SetUp() override { testing::MakeDirs(dir_); }

  std::vector<std::string> Entries(const std::string& dir) {
    std::vector<std::string> names;
    DIR* d = opendir(dir.c_str());
    if (d == nullptr) return names;
    while (dirent* e = readdir(d)) {
      std::string name = e->d_name;
      if (name != "." && name != "..") names.push_back(name);
    }
    closedir(d);
    return names;
  }

  TempRoot root_;
  std::string dir_ = root_.Path("/etc");
  std::string path_ = dir_ + "/status.json";
  Json::Value value_ = ParseJson("{\"name\":\"\xc3\xa9t\xc3\xa9\",\"list\":[1,2],\"n\":null}");
};

TEST_F(JsonFileTest, WritesAtomicallyReadableMode0644) {
  WriteFile(path_, "old content");
  const mode_t old_mask = umask(077);
  const bool ok = JsonToFile(value_, path_);
  umask(old_mask);
  ASSERT_TRUE(ok);
  struct stat st;
  ASSERT_EQ(stat(path_.c_str(), &st), 0);
  EXPECT_EQ(st.st_mode & 07777, 0644u);
  Json::Value back;
  ASSERT_TRUE(JsonFromFile(back, path_));
  EXPECT_EQ(back, value_);
  EXPECT_EQ(Entries(dir_), std::vector<std::string>{"status.json"});
}

TEST_F(JsonFileTest, FailedSaveKeepsOldStateAndLeavesNoTemporary) {
  // The destination is a folder: the rename fails after the temporary was
  // written.
  testing::MakeDirs(path_);
  WriteFile(path_ + "/inner", "x");
  EXPECT_FALSE(JsonToFile(value_, path_));
  EXPECT_EQ(ReadFile(path_ + "/inner"), "x");
  EXPECT_EQ(Entries(dir_), std::vector<std::string>{"status.json"});
  // The folder is missing: nothing is created.
  const std::string missing = root_.Path("/nowhere/status.json");
  EXPECT_FALSE(JsonToFile(value_, missing));
  EXPECT_EQ(errno, ENOENT);
  EXPECT_FALSE(access(root_.Path("/nowhere").c_str(), F_OK) == 0);
}

TEST_F(JsonFileTest, ReadRefusesWhatIsNotARegularJsonFile) {
  const std::string fifo = dir_ + "/fifo.json";
  ASSERT_EQ(mkfifo(fifo.c_str(), 0644), 0);
  WriteFile(dir_ + "/trailing.json", "{\"a\":1} {");
  WriteFile(dir_ + "/truncated.json", "{\"a\":[1,");
  WriteFile(dir_ + "/empty.json", "");
  for (const std::string& p : {fifo, dir_, dir_ + "/missing.json", dir_ + "/trailing.json",
                               dir_ + "/truncated.json", dir_ + "/empty.json"}) {
    Json::Value v;
    EXPECT_FALSE(JsonFromFile(v, p)) << p;
  }
}

TEST_F(JsonFileTest, ReadFollowsALinkToAFile) {
  ASSERT_TRUE(JsonToFile(value_, path_));
  const std::string link = dir_ + "/link.json";
  ASSERT_EQ(symlink(path_.c_str(), link.c_str()), 0);
  Json::Value back;
  ASSERT_TRUE(JsonFromFile(back, link));
  EXPECT_EQ(back, value_);
}

}  // namespace
}  // namespace vellis
