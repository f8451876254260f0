// Registering shares with the Linux platform: bad names and paths are
// refused with a clear reason and the registry is never damaged.
#include "sdk/linux/share_registry.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "common/error.h"
#include "common/root_path.h"
#include "sdk/share.h"
#include "tests/support/fake_platform.h"
#include "tests/support/temp_root.h"

namespace vellis::sdk {
namespace {

using testing::FakePlatform;
using testing::ScopedPlatform;
using testing::TempRoot;

class ShareRegistryTest : public ::testing::Test {
 protected:
  ShareRegistryTest() : scoped_(&platform_) {}

  void SetUp() override {
    v_ = root_.Path("/volume1");
    testing::MakeDirs(v_ + "/photo/inner");
    testing::MakeDirs(v_ + "/music");
    Register("photo", v_ + "/photo");
  }

  void Register(const std::string& name, const std::string& path) {
    ShareInfo share;
    share.szName = name;
    share.szPath = path;
    RegisterShare(share);
  }

  // "<code> <reason>" of the refusal, or "registered".
  std::string Refusal(const std::string& name, const std::string& path) {
    try {
      Register(name, path);
    } catch (const Error& e) {
      return std::to_string(e.GetCode()) + " " + e.what();
    }
    return "registered";
  }

  std::string RegistryText() { return testing::ReadFile(RootPath(kShareRegistryPath)); }

  FakePlatform platform_;
  ScopedPlatform scoped_;
  TempRoot root_;
  std::string v_;
};

TEST_F(ShareRegistryTest, BadNamesAreRefusedWithTheirReason) {
  struct Case {
    std::string name;
    std::string reason;
  } cases[] = {
      {"", "share name is empty"},
      {".", "share name may not be \".\""},
      {"..", "share name may not be \"..\""},
      {"a/b", "share name contains \"/\""},
      {std::string("a\0b", 3), "share name contains a NUL byte"},
      {"a\nb", "share name contains a newline"},
      {"-rf", "share name may not begin with \"-\""},
      {std::string(256, 'n'), "share name is longer than 255 bytes"},
      {"bad\xFF", "share name is not valid UTF-8"},
  };
  std::string before = RegistryText();
  for (const Case& c : cases) {
    std::string path = v_ + "/" + c.name;
    EXPECT_EQ(Refusal(c.name, path), "120 " + c.reason) << c.reason;
  }
  EXPECT_EQ(RegistryText(), before);
}

TEST_F(ShareRegistryTest, BadPathsAreRefusedWithTheirReason) {
  struct Case {
    std::string path;
    std::string reason_start;
  } cases[] = {
      {"", "share path is not absolute"},
      {"volume1/music", "share path is not absolute"},
      {v_ + "/../volume1/music", "share path contains \"..\""},
      {v_ + "/./music", "share path contains \".\""},
      {v_ + "//music", "share path contains \"//\""},
      {v_ + "/music/", "share path ends in \"/\""},
      {v_ + "/mus\nic/music", "share path contains a newline"},
      {std::string("/vol\0/music", 11), "share path contains a NUL byte"},
      {v_ + "/photo", "share path " + v_ + "/photo does not end in the share's name"},
      {v_ + "/nowhere/music", "share path is not a directory"},
  };
  std::string before = RegistryText();
  for (const Case& c : cases) {
    std::string got = Refusal("music", c.path);
    EXPECT_EQ(got.substr(0, 4 + c.reason_start.size()), "120 " + c.reason_start) << got;
  }
  EXPECT_EQ(RegistryText(), before);
}

TEST_F(ShareRegistryTest, LinksClashesAndNestingAreRefused) {
  testing::MakeDirs(v_ + "/real/music");
  ASSERT_EQ(0, symlink((v_ + "/real").c_str(), (v_ + "/linked").c_str()));
  testing::MakeDirs(v_ + "/other/Photo");
  testing::MakeDirs(v_ + "/photo/inner/x");
  struct Case {
    std::string name, path, reason_start;
  } cases[] = {
      {"music", v_ + "/linked/music", "share path leads through a symbolic link"},
      {"Photo", v_ + "/other/Photo", "a share named \"photo\" exists already"},
      {"inner", v_ + "/photo/inner", "share path " + v_ + "/photo/inner overlaps share"},
      {"volume1", v_, "share path " + v_ + " overlaps share"},
  };
  for (const Case& c : cases) {
    std::string got = Refusal(c.name, c.path);
    EXPECT_EQ(got.substr(0, 4 + c.reason_start.size()), "120 " + c.reason_start) << got;
  }
  EXPECT_EQ(SDKShare::Enum(), std::vector<std::string>{"photo"});
}

TEST_F(ShareRegistryTest, RegistrationsSurviveAReadBackInOrder) {
  Register("music", v_ + "/music");
  EXPECT_EQ(SDKShare::Enum(), (std::vector<std::string>{"photo", "music"}));
  UnregisterShare("photo");
  EXPECT_EQ(SDKShare::Enum(), std::vector<std::string>{"music"});
  EXPECT_EQ(Refusal("photo", v_ + "/photo"), "registered");
  EXPECT_EQ(SDKShare::Enum(), (std::vector<std::string>{"music", "photo"}));
  try {
    UnregisterShare("nosuch");
    ADD_FAILURE() << "removed a share that does not exist";
  } catch (const Error& e) {
    EXPECT_EQ(e.GetCode(), kErrShareNotFound);
  }
}

TEST_F(ShareRegistryTest, CorruptRegistryIsReportedAndNeverOverwritten) {
  const char* corrupt[] = {"{\"shares\": [", "[]", "{\"shares\": [{\"name\": 1}]}",
                           "{\"shares\": [{\"name\": \"a\", \"path\": \"/x/b\"}]}",
                           "{\"shares\": [{\"name\": \"a\", \"path\": \"/x/a\"}, "
                           "{\"name\": \"A\", \"path\": \"/y/A\"}]}"};
  for (const char* text : corrupt) {
    testing::WriteFile(RootPath(kShareRegistryPath), text);
    std::string got = Refusal("music", v_ + "/music");
    EXPECT_EQ(got.substr(0, 4), "504 ") << text;
    EXPECT_EQ(RegistryText(), text);
    EXPECT_THROW(SDKShare::Enum(), Error) << text;
    EXPECT_THROW(SDKShare("a"), Error) << text;
  }
}

TEST_F(ShareRegistryTest, MissingRegistryHasNoShares) {
  ASSERT_EQ(0, unlink(RootPath(kShareRegistryPath).c_str()));
  EXPECT_TRUE(SDKShare::Enum().empty());
}

TEST_F(ShareRegistryTest, ParseReadsBackWhatWasWritten) {
  std::vector<ShareInfo> shares(2);
  shares[0].szName = "a";
  shares[0].szPath = "/v/a";
  shares[0].read_only = true;
  shares[0].ftp_privilege = 3;
  shares[1].szName = "b";
  shares[1].szPath = "/v/b";
  shares[1].encryption = shares[1].recycle_bin = shares[1].hide_unreadable = true;
  std::vector<ShareInfo> back;
  std::string problem;
  ASSERT_TRUE(ParseShareRegistry(ShareRegistryToJson(shares), &back, &problem)) << problem;
  ASSERT_EQ(back.size(), 2u);
  EXPECT_EQ(ShareRegistryToJson(back), ShareRegistryToJson(shares));
}

}  // namespace
}  // namespace vellis::sdk
