#include "common/json_util.h"

#include <errno.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <string>
#include <vector>

#include "tests/support/parse_json.h"
#include "tests/support/temp_root.h"
#include "tests/support/thrown.h"

namespace vellis {
namespace {

using testing::ParseJson;
using testing::Thrown;

// GetJsonValue<T> of `key` in `obj` into a T that starts as `init`.
template <typename T>
T Value(const Json::Value& obj, const std::string& key, bool required, T init = T{}) {
  GetJsonValue(init, obj, key, required);
  return init;
}

// "<code> <reason>" of GetJsonValue<T> of `key` in the object of text `obj`.
template <typename T>
std::string Refusal(const std::string& obj, const std::string& key, bool required) {
  return Thrown([&] { Value<T>(ParseJson(obj), key, required); });
}

TEST(GetJsonValueTest, RefusesWithReasonAndData) {
  EXPECT_EQ(Refusal<int>(R"({"a":"x"})", "a", true), R"(120 Not a string, data={"a":"x"})");
  EXPECT_EQ(Refusal<unsigned int>(R"({"a":-1})", "a", true), R"(120 Not a string, data={"a":-1})");
  EXPECT_EQ(Refusal<Json::Value>(R"({"a":1})", "b", true),
            R"(120 Missing property: b, data={"a":1})");
  EXPECT_EQ(Refusal<int>("null", "a", false), "120 Not an object, data=null");
  EXPECT_EQ(Refusal<Json::Value>(R"("s")", "a", false), R"(120 Not an object, data="s")");
}

// The conversions are the JSON library's own rules (isConvertibleTo and
// asString/asBool/...): the helpers must not make them stricter. A null
// gives the empty value; an optional member that is missing or does not
// convert leaves the output untouched.
TEST(GetJsonValueTest, ConvertsByTheJsonLibraryRules) {
  const Json::Value obj =
      ParseJson(R"({"one":1,"real":2.0,"big":3000000000,"huge":9007199254740993,)"
                R"("n":null,"neg":-5,"s":"x","arr":[1]})");
  EXPECT_EQ(Value<std::string>(obj, "big", true), "3000000000");
  EXPECT_TRUE(Value<bool>(obj, "one", true));
  EXPECT_EQ(Value<int>(obj, "real", true), 2);
  EXPECT_EQ(Value<unsigned int>(obj, "big", true), 3000000000u);
  EXPECT_EQ(Value<long long>(obj, "huge", true), 9007199254740993LL);
  EXPECT_EQ(Value<double>(obj, "n", true, 1.5), 0.0);
  for (const char* key : {"missing", "arr", "s"})
    EXPECT_EQ(Value<int>(obj, key, false, 7), 7) << key;
  EXPECT_EQ(Value<unsigned int>(obj, "neg", false, 7u), 7u);
}

TEST(JsonArrTest, ConvertsStringVectorsBothWays) {
  const std::vector<std::string> vec = {"a", "", "\xc3\xa9"};
  EXPECT_EQ(JsonToString(Vec2JsonArr(vec)), "[\"a\",\"\",\"\xc3\xa9\"]");
  EXPECT_EQ(JsonArr2Vec<std::string>(Vec2JsonArr(vec)), vec);
  EXPECT_EQ(JsonArr2Vec<std::string>(ParseJson(R"([1,true,null])")),
            (std::vector<std::string>{"1", "true", ""}));
  EXPECT_TRUE(JsonArr2Vec<std::string>(ParseJson(R"({"a":"b"})")).empty());
  EXPECT_EQ(Thrown([] { JsonArr2Vec<std::string>(ParseJson(R"(["a",{}])")); }),
            R"(120 Not a string, data=["a",{}])");
}

TEST(JsonApplyChangesTest, MergesObjectsRemovesNullsReplacesTheRest) {
  const char* cases[][3] = {
      {R"({"a":1,"b":{"c":2,"d":3}})", R"({"a":null,"b":{"c":5}})", R"({"b":{"c":5,"d":3}})"},
      {R"({"a":[1,2,3]})", R"({"a":[4]})", R"({"a":[4]})"},
      {R"({"a":{"x":1}})", R"({"a":[]})", R"({"a":[]})"},
      {R"({"a":7})", R"({"a":{"b":{"c":1}}})", R"({"a":{"b":{"c":1}}})"},
      {R"({"a":1})", R"({"gone":null,"b":{"c":null}})", R"({"a":1,"b":{}})"},
      {R"({"a":5})", R"({"a":{}})", R"({"a":{}})"},
      {R"([1])", R"({"a":1})", R"({"a":1})"},
      {R"({"a":1})", R"([1])", R"({"a":1})"}};
  for (const auto& [target, changes, expected] : cases) {
    Json::Value v = ParseJson(target);
    JsonApplyChanges(v, ParseJson(changes));
    EXPECT_EQ(JsonToString(v), expected) << target << " + " << changes;
  }
}

// Trailing text, comments, NaN, NUL bytes, malformed UTF-8 (overlong "/",
// a surrogate, a truncated sequence, above U+10FFFF) and deep nesting.
TEST(JsonFromStringTest, RefusesMalformedTextAndAcceptsBoundedNesting) {
  std::vector<std::string> bad = {"", "{} x", "[1,]", "{'a':1}", "/* c */ {}", "[NaN]"};
  for (const char* utf8 :
       {"\xff", "\xc0\xaf", "\xe0\x80\xaf", "\xed\xa0\x80", "\xe2\x82", "\xf4\x90\x80\x80"}) {
    bad.push_back(std::string(1, '"') + utf8 + '"');
  }
  bad.insert(bad.end(), {std::string("\"a\0b\"", 5), std::string("{}\0", 3),
                         std::string(1001, '[') + std::string(1001, ']')});
  Json::Value v;
  for (const auto& text : bad) EXPECT_FALSE(JsonFromString(v, text)) << text.substr(0, 40);
  EXPECT_TRUE(JsonFromString(v, std::string(1000, '[') + std::string(1000, ']')));
  ASSERT_TRUE(JsonFromString(v, " {\"k\":\"h\xc3\xa9 \xf0\x9f\x98\x80\",\"nul\":\"a\\u0000b\"}\n"));
  EXPECT_EQ(v["k"].asString() + v["nul"].asString(),
            "h\xc3\xa9 \xf0\x9f\x98\x80" + std::string("a\0b", 3));
}

class JsonFileTest : public ::testing::Test {
 protected:
  // The names in the folder, so that a leftover temporary shows.
  std::vector<std::string> Entries() {
    std::vector<std::string> names;
    for (const auto& e : std::filesystem::directory_iterator(dir_))
      names.push_back(e.path().filename());
    return names;
  }

  testing::TempRoot root_;
  std::string dir_ = root_.Path("/etc");
  std::string path_ = dir_ + "/status.json";
  Json::Value value_ = ParseJson("{\"name\":\"\xc3\xa9t\xc3\xa9\",\"list\":[1,2],\"n\":null}");
};

TEST_F(JsonFileTest, WritesAtomicallyReadableMode0644AndReadsThroughALink) {
  testing::WriteFile(path_, "old content");
  const mode_t old_mask = umask(077);
  const bool ok = JsonToFile(value_, path_);
  umask(old_mask);
  ASSERT_TRUE(ok);
  struct stat st;
  ASSERT_EQ(stat(path_.c_str(), &st), 0);
  EXPECT_EQ(st.st_mode & 07777, 0644u);
  EXPECT_EQ(Entries(), std::vector<std::string>{"status.json"});
  ASSERT_EQ(symlink(path_.c_str(), (dir_ + "/link.json").c_str()), 0);
  Json::Value back;
  ASSERT_TRUE(JsonFromFile(back, dir_ + "/link.json"));
  EXPECT_EQ(back, value_);
}

TEST_F(JsonFileTest, FailedSaveKeepsOldStateAndLeavesNoTemporary) {
  // The destination is a folder: the rename fails after the temporary was
  // written. Then the folder is missing: nothing is created.
  testing::WriteFile(path_ + "/inner", "x");
  EXPECT_FALSE(JsonToFile(value_, path_));
  EXPECT_EQ(Entries(), std::vector<std::string>{"status.json"});
  EXPECT_EQ(testing::ReadFile(path_ + "/inner"), "x");
  EXPECT_FALSE(JsonToFile(value_, root_.Path("/nowhere/status.json")));
  EXPECT_EQ(errno, ENOENT);
}

TEST_F(JsonFileTest, ReadRefusesWhatIsNotARegularJsonFile) {
  testing::WriteFile(dir_ + "/trailing.json", "{\"a\":1} {");
  testing::WriteFile(dir_ + "/empty.json", "");
  ASSERT_EQ(mkfifo((dir_ + "/fifo.json").c_str(), 0644), 0);
  Json::Value v;
  for (std::string name : {"/fifo.json", "", "/missing.json", "/trailing.json", "/empty.json"})
    EXPECT_FALSE(JsonFromFile(v, dir_ + name)) << name;
}

}  // namespace
}  // namespace vellis
