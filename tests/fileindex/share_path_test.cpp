// Conversions between share paths and full paths.
#include <gtest/gtest.h>

#include <functional>
#include <string>

#include "common/error.h"
#include "fileindex/util.h"
#include "tests/support/fake_share_platform.h"
#include "tests/support/thrown.h"

namespace vellis::fileindex {
namespace {

using testing::Thrown;

using testing::FakeSharePlatform;
using testing::ScopedPlatform;

class SharePathTest : public ::testing::Test {
 protected:
  SharePathTest() : scoped_(&platform_) {
    for (const char* name : {"photo", "photo2"}) {
      sdk::ShareInfo share;
      share.szName = name;
      share.szPath = std::string("/volume1/") + name;
      platform_.AddShare(share);
    }
    sdk::ShareInfo music;
    music.szName = "music";
    music.szPath = "/volume10/music";
    platform_.AddShare(music);
  }


  FakeSharePlatform platform_;
  ScopedPlatform scoped_;
};

TEST_F(SharePathTest, ShareNameIsTheFirstComponent) {
  struct Case {
    std::string share_path;
    std::string name;
  } cases[] = {
      {"/photo/2019/a.jpg", "photo"},
      {"/photo", "photo"},
      {"/photo/", "photo"},
      {"/", ""},
      {"//photo", ""},
  };
  for (const Case& c : cases) {
    std::string name = "stale";
    GetShareNameByPath(name, c.share_path);
    EXPECT_EQ(name, c.name) << c.share_path;
  }
}

TEST_F(SharePathTest, SharePathWithoutLeadingSlashIsError120) {
  for (const std::string path : {"", "photo/a", " /photo"}) {
    std::string name;
    EXPECT_EQ(Thrown([&] { GetShareNameByPath(name, path); }), "120 " + path);
  }
  EXPECT_EQ(
      platform_.LogsContaining("Failed [1 > share_path.size() || '/' != share_path.at(0)]").size(),
      3u);
}

TEST_F(SharePathTest, FullPathPutsTheShareVolumeInFront) {
  EXPECT_EQ(GetFullPath("/photo"), "/volume1/photo");
  EXPECT_EQ(GetFullPath("/photo/2019/a.jpg"), "/volume1/photo/2019/a.jpg");
  EXPECT_EQ(GetFullPath("/music/a.mp3"), "/volume10/music/a.mp3");
  EXPECT_EQ(Thrown([] { GetFullPath("/nosuch/a"); }).substr(0, 4), "800 ");
  EXPECT_EQ(Thrown([] { GetFullPath("/"); }).substr(0, 4), "800 ");
  EXPECT_EQ(Thrown([] { GetFullPath("photo"); }), "120 photo");
}

TEST_F(SharePathTest, HoldingShareIsFoundByWholeComponents) {
  struct Case {
    std::string full_path;
    std::string expected;  // "<name> <path>" or "error <code> <reason>"
  } cases[] = {
      {"/volume1/photo", "photo /volume1/photo"},
      {"/volume1/photo/2019/a.jpg", "photo /volume1/photo"},
      {"/volume1/photo2/a.jpg", "photo2 /volume1/photo2"},
      {"/volume10/music/a.mp3", "music /volume10/music"},
      {"/volume1/music/a.mp3",
       "error 502 QORUShareNamePathGet failed, full_path=/volume1/music/a.mp3"},
      {"/volume1/photo3", "error 502 QORUShareNamePathGet failed, full_path=/volume1/photo3"},
      {"relative/photo", "error 502 QORUShareNamePathGet failed, full_path=relative/photo"},
      {std::string("/volume1/photo\0/x", 17), "error 120 path contains a NUL byte"},
  };
  for (const Case& c : cases) {
    std::string name, path, got;
    try {
      GetShareNamePathByFullPath(name, path, c.full_path);
      got = name + " " + path;
    } catch (const Error& e) {
      got = "error " + std::to_string(e.GetCode()) + " " + e.what();
    }
    EXPECT_EQ(got, c.expected) << c.full_path;
  }
  EXPECT_EQ(platform_
                .LogsContaining("Failed [0 > QORUShareNamePathGet(full_path.c_str(), "
                                "szShareName, sizeof(szShareName), szSharePath, "
                                "sizeof(szSharePath))]")
                .size(),
            3u);
}

TEST_F(SharePathTest, ReplaceShareSwapsTheFirstWholeComponent) {
  struct Case {
    std::string path, new_share, old_share, expected;
  } cases[] = {
      {"/volume1/a", "b", "a", "/volume1/b"},
      {"/volume1/a/x/a/y", "b", "a", "/volume1/b/x/a/y"},
      {"/a", "bb", "a", "/bb"},
      {"/volume1/photo/2019", "pictures", "photo", "/volume1/pictures/2019"},
      {"/volume1/ab/x", "c", "a", "error 120 Cannot find share: a"},
      {"/volume1/xa/a", "c", "a", "/volume1/xa/c"},
      {"", "c", "a", "error 120 Cannot find share: a"},
  };
  for (const Case& c : cases) {
    std::string got;
    try {
      got = ReplacePathShare(c.path, c.new_share, c.old_share);
    } catch (const Error& e) {
      got = "error " + std::to_string(e.GetCode()) + " " + e.what();
    }
    EXPECT_EQ(got, c.expected) << c.path << " " << c.old_share << "->" << c.new_share;
  }
}

TEST_F(SharePathTest, PathPiecesFollowTheLastSlash) {
  EXPECT_EQ(Dirname("a"), "a");
  EXPECT_EQ(Dirname("/a"), "");
  EXPECT_EQ(Dirname("/a/b"), "/a");
  EXPECT_EQ(Basename("/a/"), "");
  EXPECT_EQ(Basename("a"), "a");
  EXPECT_TRUE(StringStartWith("/volume1", ""));
  EXPECT_FALSE(StringStartWith("/vol", "/volume1"));
}

}  // namespace
}  // namespace vellis::fileindex
