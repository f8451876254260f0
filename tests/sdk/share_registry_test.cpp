#include "sdk/linux/share_registry.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <string>
#include <tuple>

#include "common/root_path.h"
#include "sdk/share.h"
#include "tests/support/fake_platform.h"
#include "tests/support/temp_root.h"
#include "tests/support/thrown.h"

namespace vellis::sdk {
namespace {

class ShareRegistryTest : public ::testing::Test {
 protected:
  void SetUp() override {
    testing::MakeDirs(v_ + "/photo/inner/x");
    testing::MakeDirs(v_ + "/music");
    ASSERT_EQ(Register("photo", v_ + "/photo"), "no error");
  }

  // "<code> <reason>" of the refusal, or "no error".
  std::string Register(const std::string& name, const std::string& path) {
    return testing::Thrown([&] { RegisterShare({name, path}); });
  }
  std::string RegistryText() { return testing::ReadFile(RootPath(kShareRegistryPath)); }

  testing::FakePlatform platform_;
  testing::ScopedPlatform scoped_{&platform_};
  testing::TempRoot root_;
  std::string v_ = root_.Path("/volume1");
};

TEST_F(ShareRegistryTest, BadNamesAndPathsAreRefusedWithTheirReason) {
  testing::MakeDirs(v_ + "/real/music");
  ASSERT_EQ(0, symlink((v_ + "/real").c_str(), (v_ + "/linked").c_str()));
  testing::MakeDirs(v_ + "/other/Photo");
  const std::tuple<std::string, std::string, std::string> cases[] = {
      {"", v_ + "/", "share name is empty"},
      {".", v_ + "/.", "share name may not be \".\""},
      {"..", v_ + "/..", "share name may not be \"..\""},
      {"a/b", v_ + "/a/b", "share name contains \"/\""},
      {std::string("a\0b", 3), v_ + "/a", "share name contains a NUL byte"},
      {"a\nb", v_ + "/a\nb", "share name contains a newline"},
      {"-rf", v_ + "/-rf", "share name may not begin with \"-\""},
      {std::string(256, 'n'), v_ + "/n", "share name is longer than 255 bytes"},
      {"bad\xFF", v_ + "/bad\xFF", "share name is not valid UTF-8"},
      {"music", "", "share path is not absolute"},
      {"music", "volume1/music", "share path is not absolute"},
      {"music", v_ + "/../volume1/music", "share path contains \"..\""},
      {"music", v_ + "/./music", "share path contains \".\""},
      {"music", v_ + "//music", "share path contains \"//\""},
      {"music", v_ + "/music/", "share path ends in \"/\""},
      {"music", v_ + "/mus\nic/music", "share path contains a newline"},
      {"music", std::string("/vol\0/music", 11), "share path contains a NUL byte"},
      {"music", v_ + "/photo", "share path " + v_ + "/photo does not end in the share's name"},
      {"music", v_ + "/nowhere/music", "share path is not a directory"},
      {"music", v_ + "/linked/music", "share path leads through a symbolic link"},
      {"Photo", v_ + "/other/Photo", "a share named \"photo\" exists already"},
      {"inner", v_ + "/photo/inner", "share path " + v_ + "/photo/inner overlaps share"},
      {"volume1", v_, "share path " + v_ + " overlaps share"}};
  const std::string before = RegistryText();
  for (const auto& [name, path, reason] : cases)
    EXPECT_EQ(Register(name, path).substr(0, 4 + reason.size()), "120 " + reason) << path;
  EXPECT_EQ(RegistryText(), before);
}

TEST_F(ShareRegistryTest, CorruptRegistryIsReportedAndNeverOverwritten) {
  const char* corrupt[] = {"{\"shares\": [", "[]", "{\"shares\": [{\"name\": 1}]}",
                           "{\"shares\": [{\"name\": \"a\", \"path\": \"/x/b\"}]}",
                           "{\"shares\": [{\"name\": \"a\", \"path\": \"/x/a\"}, "
                           "{\"name\": \"A\", \"path\": \"/y/A\"}]}"};
  for (const char* text : corrupt) {
    testing::WriteFile(RootPath(kShareRegistryPath), text);
    EXPECT_EQ(Register("music", v_ + "/music").substr(0, 4), "504 ") << text;
    EXPECT_EQ(RegistryText(), text);
    EXPECT_NE(testing::Thrown([] { SDKShare::Enum(); }), "no error") << text;
    EXPECT_NE(testing::Thrown([] { SDKShare("a"); }), "no error") << text;
  }
}

}  // namespace
}  // namespace vellis::sdk
