#include "fileindex/elastic/schema.h"

#include <gtest/gtest.h>

#include <string>

#include "common/json_util.h"

namespace vellis::fileindex::elastic {
namespace {

TEST(SchemaTest, MappingsListFiftyThreeFieldsInTheTemplateOrder) {
  Json::Value mappings = GetFileIndexMappings();
  EXPECT_EQ(mappings["property_id"], kQORUMDPath);
  ASSERT_EQ(mappings["properties"].size(), static_cast<Json::ArrayIndex>(kFileIndexMappedFields));

  // The JSON library hands members back sorted by key, so the order that the
  // daemon sees is checked on the template text itself: each property key
  // occurs once, after the one before it.
  const std::string text = kFileIndexMappingsText;
  const char* ordered[] = {kQORUMDPath,
                           kQORUMDFSName,
                           kQORUMDTextContent,
                           kQORUMDKeywords,
                           "QORUMDFinderLabel",
                           kQORUMDSearchFileName,
                           kUnderscoreQORUMDUserTags,
                           "QORUMDSpotlightBoost"};
  size_t last = text.find("\"properties\"");
  for (const char* field : ordered) {
    const std::string key = std::string("\"") + field + "\":";
    size_t at = text.find(key);
    ASSERT_NE(at, std::string::npos) << field;
    EXPECT_GT(at, last) << field << " out of order";
    EXPECT_EQ(text.find(key, at + 1), std::string::npos) << field << " twice";
    last = at;
  }
  const std::string first = "\"properties\": {\n    \"QORUMDPath\": {";
  EXPECT_NE(text.find(first), std::string::npos) << "first property";
  const std::string last_key = "\"QORUMDSpotlightBoost\": {";
  EXPECT_EQ(text.find("\": {", text.find(last_key) + last_key.size()), std::string::npos)
      << "last property";
}

TEST(SchemaTest, MappingsKeepTheDaemonsSpellings) {
  const Json::Value props = GetFileIndexMappings()["properties"];
  struct Case {
    const char* field;
    const char* member;
    Json::Value value;
  } cases[] = {
      {kQORUMDPath, "required", true},
      {kQORUMDPath, "_all", false},
      {kQORUMDAuthors, "analyzer", "white space"},
      {kQORUMDIsDir, "type", "bool"},
      {kQORUMDDurationSecond, "type", "double"},
      {"QORUMDFinderLabel", "type", "int"},  // no underscore in the mappings
      {"QORUMDGroupId", "analyzer", "keyword"},
      {kUnderscoreQORUMDUserTags, "type", "text"},
  };
  for (const auto& c : cases) {
    EXPECT_EQ(props[c.field][c.member], c.value) << c.field << "." << c.member;
  }
  EXPECT_EQ(props[kQORUMDKeywords], Json::Value(Json::objectValue));
  EXPECT_FALSE(props.isMember(kUnderscoreQORUMDFinderLabel));
  int with_preprocess = 0;
  for (const auto& name : props.getMemberNames())
    with_preprocess += props[name].isMember("preprocess");
  EXPECT_EQ(with_preprocess, 1);
  EXPECT_EQ(JsonToString(props[kQORUMDSearchFileName]["preprocess"]), R"(["tolower","ngram"])");
  EXPECT_EQ(
      JsonToString(GetFileIndexMappings()["default"]),
      R"({"_all":true,"analyzer":"qorustandard","required":false,"stored":true,"type":"string"})");
}

TEST(SchemaTest, SettingsAndEventHandler) {
  EXPECT_EQ(JsonToString(GetFileIndexSettings()), "{}");
  EXPECT_EQ(JsonToString(GetFileIndexEventHandler()),
            R"({"lib_path":"/var/packages/Vellis/target/handler/fileindex_event_handler.so"})");
}

}  // namespace
}  // namespace vellis::fileindex::elastic
