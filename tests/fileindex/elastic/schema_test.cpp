#include "fileindex/elastic/schema.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <string>
#include <vector>

#include "common/json_util.h"

namespace vellis::fileindex::elastic {
namespace {

TEST(SchemaTest, MappingsListFiftyThreeFieldsInTheirFixedOrder) {
  const Json::Value mappings = GetFileIndexMappings();
  // The JSON library hands members back sorted by key, so the order that the
  // daemon sees is read off the template text.
  const std::string text = kFileIndexMappingsText;
  // Each property sits on its own line: `    "<name>": {...`.
  const std::string start = "\n    \"";
  std::vector<std::string> keys;
  for (size_t at = text.find(start); at != std::string::npos; at = text.find(start, at + 1)) {
    const size_t name = at + start.size();
    keys.push_back(text.substr(name, text.find('"', name) - name));
  }
  EXPECT_EQ(mappings["property_id"], kQORUMDPath);
  ASSERT_EQ(keys.size(), static_cast<size_t>(kFileIndexMappedFields));
  std::vector<std::string> sorted = keys;
  std::sort(sorted.begin(), sorted.end());
  EXPECT_EQ(sorted, mappings["properties"].getMemberNames()) << "the same fields, none twice";
  const std::vector<std::string> markers = {
      "QORUMDPath",        "QORUMDFSName",         "QORUMDTextContent", "QORUMDKeywords",
      "QORUMDFinderLabel", "QORUMDSearchFileName", "_QORUMDUserTags",   "QORUMDSpotlightBoost"};
  std::vector<std::string> in_order;
  std::copy_if(keys.begin(), keys.end(), std::back_inserter(in_order), [&](const std::string& k) {
    return std::count(markers.begin(), markers.end(), k) > 0;
  });
  EXPECT_EQ(in_order, markers);
  EXPECT_EQ(keys.front(), "QORUMDPath");
  EXPECT_EQ(keys.back(), "QORUMDSpotlightBoost");
}

TEST(SchemaTest, SettingsAreAnEmptyObjectAndTheHandlerIsThePackagesLibrary) {
  EXPECT_EQ(JsonToString(GetFileIndexSettings()), "{}");
  Json::Value handler;
  handler["lib_path"] = kEventHandlerLibPath;
  EXPECT_EQ(GetFileIndexEventHandler(), handler);
}

}  // namespace
}  // namespace vellis::fileindex::elastic
