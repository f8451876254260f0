#include "sdk/linux/content_extract.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include "fileindex/elastic/schema.h"
#include "sdk/platform.h"
#include "tests/support/fake_platform.h"
#include "tests/support/temp_root.h"

namespace vellis::sdk {
namespace {

namespace fe = vellis::fileindex::elastic;

TEST(ContentExtractTest, FileSystemFieldsComeFromTheFacts) {
  FileFacts file;
  file.mode = S_IFREG | 0640;
  file.size = 5000;
  file.blocks = 16;
  file.mtime = 1600000000;
  file.ctime = 1600000100;
  file.has_btime = true;
  file.btime = 1500000000;
  file.uid = 1026;
  file.gid = 100;
  Json::Value doc;
  doc[fe::kQORUMDTitle] = "kept";
  FillFileSystemFields("/volume1/share/dir/Report.PDF", file, &doc);
  struct Case {
    const char* field;
    Json::Value value;
  } cases[] = {
      {fe::kQORUMDPath, "/volume1/share/dir/Report.PDF"},
      {fe::kQORUMDFSName, "Report.PDF"},
      {fe::kQORUMDParent, "/volume1/share/dir"},
      {fe::kQORUMDExtension, "PDF"},
      {fe::kQORUMDKind, "pdf"},
      {fe::kQORUMDIsDir, false},
      {fe::kQORUMDFSSize, 5000},
      {fe::kQORUMDLogicalSize, 5000},
      {fe::kQORUMDPhysicalSize, 8192},
      {fe::kQORUMDFSContentChangeDate, 1600000000},
      {fe::kQORUMDAttributeChangeDate, 1600000100},
      {fe::kQORUMDFSCreationDate, 1500000000},
      {fe::kQORUMDOwnerUserID, "1026"},
      {fe::kQORUMDOwnerGroupID, "100"},
      {fe::kQORUMDPrivilege, "0640"},
      {fe::kQORUMDTitle, "kept"},
  };
  for (const auto& c : cases) EXPECT_EQ(doc[c.field], c.value) << c.field;

  FileFacts dir;
  dir.mode = S_IFDIR | 01777;
  FillFileSystemFields("/volume1/share/photos", dir, &doc);
  EXPECT_EQ(doc[fe::kQORUMDIsDir], true);
  EXPECT_EQ(doc[fe::kQORUMDPrivilege], "1777");
  EXPECT_EQ(doc[fe::kQORUMDExtension], "");
  EXPECT_FALSE(doc.isMember(fe::kQORUMDFSCreationDate)) << "no creation time recorded";
}

TEST(ContentExtractTest, TextIsValidUtf8CutAtACharacterBoundary) {
  const std::string fill(kMaxTextContentBytes - 1, 'a');
  struct Case {
    std::string bytes;
    bool ok;
    size_t size;
  } cases[] = {
      {"h\xC3\xA9llo", true, 6},
      {"", true, 0},
      {"bad \xFF byte", false, 0},
      {"overlong \xC0\xAF", false, 0},
      {std::string("nul\0inside", 10), false, 0},
      {fill + "\xC3\xA9zz", true, kMaxTextContentBytes - 1},  // é straddles the limit
      {fill + "\xF0\x9F\x98\x80", true, kMaxTextContentBytes - 1},
      {fill + "bcd", true, kMaxTextContentBytes},
      {fill + "b\xFF", true, kMaxTextContentBytes},  // bytes past the limit are not read
      {fill + "\xFF", false, 0},
  };
  for (const auto& c : cases) {
    std::string text = "old";
    ASSERT_EQ(TextContentFromBytes(c.bytes, &text), c.ok) << c.bytes.substr(0, 20);
    if (c.ok) {
      EXPECT_EQ(text.size(), c.size) << c.bytes.substr(0, 20);
      EXPECT_EQ(text, c.bytes.substr(0, c.size));
    }
  }
}

class ParseFileTest : public ::testing::Test {
 protected:
  // Through the seam, as the library calls it.
  int Parse(const std::string& path, bool need_meta, Json::Value* doc) {
    Json::Value options;
    options[fe::kCENeedMeta] = need_meta;
    return GetPlatform()->ParseFile(path, options, doc);
  }

  testing::FakePlatform platform_;
  testing::ScopedPlatform scoped_{&platform_};
  testing::TempRoot root_;
  std::string dir_ = root_.Path("/volume1/share");
};

TEST_F(ParseFileTest, ReadsTheTextOfPlainTextFilesOnlyWhenAsked) {
  testing::WriteFile(dir_ + "/notes.txt", "caf\xC3\xA9 menu");
  testing::WriteFile(dir_ + "/data.bin", "caf\xC3\xA9 menu");
  testing::WriteFile(dir_ + "/latin1.txt", "caf\xE9");
  Json::Value doc;
  ASSERT_EQ(Parse(dir_ + "/notes.txt", true, &doc), 0);
  EXPECT_EQ(doc[fe::kQORUMDTextContent], "caf\xC3\xA9 menu");
  EXPECT_EQ(doc[fe::kQORUMDFSSize], 10);
  EXPECT_EQ(doc[fe::kQORUMDPath], dir_ + "/notes.txt");
  ASSERT_EQ(Parse(dir_ + "/notes.txt", false, &doc), 0);
  EXPECT_FALSE(doc.isMember(fe::kQORUMDTextContent)) << "need_meta false";
  ASSERT_EQ(Parse(dir_ + "/data.bin", true, &doc), 0);
  EXPECT_FALSE(doc.isMember(fe::kQORUMDTextContent)) << "not a text extension";
  ASSERT_EQ(Parse(dir_ + "/latin1.txt", true, &doc), 0);
  EXPECT_FALSE(doc.isMember(fe::kQORUMDTextContent)) << "not UTF-8";
  ASSERT_EQ(Parse(dir_, true, &doc), 0);
  EXPECT_EQ(doc[fe::kQORUMDIsDir], true);
}

TEST_F(ParseFileTest, LinksAreNeverFollowedAndFifosNeverWaitedOn) {
  testing::MakeDirs(dir_);
  testing::WriteFile(root_.Path("/outside/secret.txt"), "secret");
  ASSERT_EQ(symlink(root_.Path("/outside/secret.txt").c_str(), (dir_ + "/link.txt").c_str()), 0);
  ASSERT_EQ(symlink(root_.Path("/outside").c_str(), (dir_ + "/linkdir").c_str()), 0);
  ASSERT_EQ(mkfifo((dir_ + "/pipe.txt").c_str(), 0644), 0);

  Json::Value doc;
  ASSERT_EQ(Parse(dir_ + "/link.txt", true, &doc), 0) << "the link is described as itself";
  EXPECT_FALSE(doc.isMember(fe::kQORUMDTextContent));
  EXPECT_EQ(doc[fe::kQORUMDFSSize].asUInt64(), root_.Path("/outside/secret.txt").size());
  EXPECT_EQ(doc[fe::kQORUMDIsDir], false);

  EXPECT_EQ(Parse(dir_ + "/linkdir/secret.txt", true, &doc), -1) << "a link on the way";
  EXPECT_EQ(errno, ELOOP);

  ASSERT_EQ(Parse(dir_ + "/pipe.txt", true, &doc), 0);
  EXPECT_FALSE(doc.isMember(fe::kQORUMDTextContent));

  EXPECT_EQ(Parse(dir_ + "/missing.txt", true, &doc), -1);
  EXPECT_EQ(errno, ENOENT);
}

TEST_F(ParseFileTest, ReadsAtMostTheFirstMebibyte) {
  testing::WriteFile(dir_ + "/big.log", std::string(3 * kMaxTextContentBytes, 'x'));
  Json::Value doc;
  ASSERT_EQ(Parse(dir_ + "/big.log", true, &doc), 0);
  EXPECT_EQ(doc[fe::kQORUMDTextContent].asString().size(), kMaxTextContentBytes);
  EXPECT_EQ(doc[fe::kQORUMDFSSize].asUInt64(), 3 * kMaxTextContentBytes);
}

}  // namespace
}  // namespace vellis::sdk
