#include "sdk/linux/content_extract.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>
#include <tuple>

#include "fileindex/elastic/schema.h"
#include "sdk/platform.h"
#include "tests/support/fake_platform.h"
#include "tests/support/parse_json.h"
#include "tests/support/temp_root.h"

namespace vellis::sdk {
namespace {

namespace fe = vellis::fileindex::elastic;

TEST(ContentExtractTest, FileSystemFieldsComeFromTheFacts) {
  FileFacts file{S_IFREG | 0640, 5000, 16, 1600000000, 1600000100, true, 1500000000, 1026, 100};
  Json::Value doc;
  doc[fe::kQORUMDTitle] = "kept";
  FillFileSystemFields("/volume1/share/dir/Report.PDF", file, &doc);
  // The fields derived from the facts, not merely copied.
  const Json::Value expected = testing::ParseJson(
      R"({"QORUMDFSName":"Report.PDF","QORUMDParent":"/volume1/share/dir","QORUMDKind":"pdf",)"
      R"("QORUMDPhysicalSize":8192,"QORUMDFSCreationDate":1500000000,"QORUMDOwnerUserID":"1026",)"
      R"("QORUMDPrivilege":"0640","QORUMDTitle":"kept"})");
  for (const auto& field : expected.getMemberNames())
    EXPECT_EQ(doc[field], expected[field]) << field;
  FileFacts dir{};
  dir.mode = S_IFDIR | 01777;
  FillFileSystemFields("/volume1/share/photos", dir, &doc);
  EXPECT_EQ(doc[fe::kQORUMDIsDir], true);
  EXPECT_EQ(doc[fe::kQORUMDPrivilege], "1777");
  EXPECT_FALSE(doc.isMember(fe::kQORUMDFSCreationDate)) << "no creation time recorded";
}

TEST(ContentExtractTest, TextIsValidUtf8CutAtACharacterBoundary) {
  const std::string fill(kMaxTextContentBytes - 1, 'a');
  const std::tuple<std::string, bool, size_t> cases[] = {
      {"h\xC3\xA9llo", true, 6},
      {"bad \xFF byte", false, 0},
      {"overlong \xC0\xAF", false, 0},
      {std::string("nul\0inside", 10), false, 0},
      {fill + "\xC3\xA9zz", true, kMaxTextContentBytes - 1},  // é straddles the limit
      {fill + "\xF0\x9F\x98\x80", true, kMaxTextContentBytes - 1},
      {fill + "b\xFF", true, kMaxTextContentBytes},  // bytes past the limit are not read
      {fill + "\xFF", false, 0}};
  for (const auto& [bytes, ok, size] : cases) {
    std::string text = "old";
    ASSERT_EQ(TextContentFromBytes(bytes, &text), ok) << bytes.substr(0, 20);
    EXPECT_TRUE(text == (ok ? bytes.substr(0, size) : "old")) << bytes.substr(0, 20);
  }
}

// Through the platform seam, as the library calls it.
TEST(ParseFileTest, ReadsTheStartOfPlainTextFilesWithoutFollowingLinksOrWaitingOnFifos) {
  testing::FakePlatform platform;
  testing::ScopedPlatform scoped(&platform);
  testing::TempRoot root;
  const std::string dir = root.Path("/volume1/share");
  for (const char* name : {"/notes.txt", "/data.bin"})
    testing::WriteFile(dir + name, "caf\xC3\xA9 menu");
  testing::WriteFile(dir + "/latin1.txt", "caf\xE9");
  testing::WriteFile(dir + "/big.log", std::string(3 * kMaxTextContentBytes, 'x'));
  testing::WriteFile(root.Path("/outside/secret.txt"), "secret");
  ASSERT_EQ(symlink(root.Path("/outside/secret.txt").c_str(), (dir + "/link.txt").c_str()), 0);
  ASSERT_EQ(symlink(root.Path("/outside").c_str(), (dir + "/linkdir").c_str()), 0);
  ASSERT_EQ(mkfifo((dir + "/pipe.txt").c_str(), 0644), 0);
  const std::tuple<std::string, bool, int, std::string> cases[] = {
      {"/notes.txt", true, 0, "caf\xC3\xA9 menu"},
      {"/notes.txt", false, 0, "-"},
      {"/data.bin", true, 0, "-"},
      {"/latin1.txt", true, 0, "-"},
      {"/big.log", true, 0, std::string(kMaxTextContentBytes, 'x')},
      {"/link.txt", true, 0, "-"},  // the link is described as itself
      {"/pipe.txt", true, 0, "-"},
      {"", true, 0, "-"},
      {"/linkdir/secret.txt", true, ELOOP, ""},
      {"/missing.txt", true, ENOENT, ""}};
  for (const auto& [name, need_meta, err, text] : cases) {
    Json::Value doc, options;
    options[fe::kCENeedMeta] = need_meta;
    errno = 0;
    ASSERT_EQ(GetPlatform()->ParseFile(dir + name, options, &doc), err ? -1 : 0) << name;
    EXPECT_EQ(errno, err) << name;
    if (err != 0) continue;
    EXPECT_EQ(doc.get(fe::kQORUMDTextContent, "-").asString(), text) << name;
    EXPECT_EQ(doc[fe::kQORUMDIsDir], name.empty()) << name;
  }
}

}  // namespace
}  // namespace vellis::sdk
