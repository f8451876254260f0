// Classification of files by extension.
#include <gtest/gtest.h>

#include <cctype>
#include <map>
#include <set>
#include <sstream>
#include <string>

#include "fileindex/util.h"

namespace vellis::fileindex {
namespace {

std::set<std::string> QueryWords(const std::string& category) {
  std::set<std::string> words;
  std::istringstream in(GetCategoryQuery(category));
  for (std::string word; in >> word;) {
    if (word != "OR") words.insert(word);
  }
  return words;
}

TEST(FileTypeTest, TableHoldsEachListWithItsCount) {
  const std::map<std::string, FileType>& table = FileExtensionTable();
  std::map<FileType, int> counts;
  for (const auto& entry : table) ++counts[entry.second];
  EXPECT_EQ(counts[kDocument], 646);
  EXPECT_EQ(counts[kAudio], 25);
  EXPECT_EQ(counts[kVideo], 31);
  EXPECT_EQ(counts[kImage], 33);
  EXPECT_EQ(table.size(), 735u);
  ASSERT_FALSE(FileExtensionPairs().empty());
  EXPECT_EQ(std::string(FileExtensionPairs().front().first), "");
  EXPECT_EQ(FileExtensionPairs().front().second, kDocument);
}

TEST(FileTypeTest, EveryPairAgreesWithTheTableAndIsLowerCase) {
  for (const auto& pair : FileExtensionPairs()) {
    std::string ext = pair.first;
    EXPECT_EQ(FileExtensionTable().at(ext), pair.second) << ext;
    for (char c : ext) EXPECT_FALSE(isupper(static_cast<unsigned char>(c))) << ext;
  }
}

TEST(FileTypeTest, FirstPairOfARepeatedExtensionWins) {
  std::map<std::string, FileType> table = BuildExtensionTable(
      {{"x", kAudio}, {"y", kImage}, {"x", kVideo}, {"", kDocument}, {"", kImage}});
  EXPECT_EQ(table.size(), 3u);
  EXPECT_EQ(table.at("x"), kAudio);
  EXPECT_EQ(table.at(""), kDocument);
}

TEST(FileTypeTest, ClassifiesByTheLowerCasedExtensionOfTheLastComponent) {
  struct Case {
    std::string path;
    FileType type;
  } cases[] = {
      {"/volume1/photo/IMG.JPG", kImage},
      {"/volume1/doc/README", kDocument},
      {"/volume1/doc/archive.", kDocument},
      {"/volume1/v/a.rm", kVideo},
      {"/volume1/v/a.rmvb", kVideo},
      {"/volume1/v/a.DVR-MS", kVideo},
      {"/volume1/x/a.exe", kUnknownFileType},
      {"/volume1/a.b/file", kDocument},
      {"/volume1/a.mp3/file.flac", kAudio},
      {"/volume1/t/notes.tx?", kDocument},
      {"/volume1/t/faq.q&a", kDocument},
      {"/volume1/t/x.tar.gz", kDocument},
      {"/volume1/t/.profile", kUnknownFileType},
      {"/volume1/t/a.jpg ", kUnknownFileType},
      {"/volume1/t/a.\xC3\x89", kUnknownFileType},
      {"", kDocument},
  };
  for (const Case& c : cases) EXPECT_EQ(GetFileTypeByFullPath(c.path), c.type) << c.path;
}

TEST(FileTypeTest, MediaQueriesNameExactlyTheTableExtensionsOfTheirType) {
  struct Case {
    std::string category;
    FileType type;
  } cases[] = {{"audio", kAudio}, {"video", kVideo}, {"image", kImage}};
  for (const Case& c : cases) {
    std::set<std::string> of_type;
    for (const auto& entry : FileExtensionTable()) {
      if (entry.second == c.type) of_type.insert(entry.first);
    }
    EXPECT_EQ(QueryWords(c.category), of_type) << c.category;
  }
}

TEST(FileTypeTest, DocumentQueryIsKeptAsItStands) {
  std::set<std::string> words = QueryWords("document");
  EXPECT_EQ(words.count("msgc"), 1u);
  EXPECT_EQ(words.count("msg"), 0u);
  EXPECT_EQ(words.count("wri"), 1u);  // not in the extension table
  EXPECT_EQ(FileExtensionTable().count("wri"), 0u);
  // "cs" stands in it twice.
  std::string text = GetCategoryQuery("document");
  EXPECT_NE(text.find(" OR cs OR cxx OR "), std::string::npos);
  EXPECT_NE(text.find(" OR coffee OR cs OR css OR "), std::string::npos);
  EXPECT_EQ(GetCategoryQuery("photo"), "");
  EXPECT_EQ(std::string(kCategoryQueries[0].category), "document");
}

}  // namespace
}  // namespace vellis::fileindex
