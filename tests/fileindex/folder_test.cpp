// The folder record: its JSON form, its share and its full path.
#include "fileindex/folder.h"

#include <gtest/gtest.h>

#include <functional>
#include <string>
#include <vector>

#include "common/error.h"
#include "common/json_util.h"
#include "tests/support/folder_env.h"

namespace vellis::fileindex {
namespace {

using testing::FolderEnv;
using testing::ParseJson;
using testing::Thrown;

constexpr char kMusic[] =
    R"({"path":"/music","name":"music","document":true,"audio":true,"video":false,)"
    R"("photo":true})";

TEST(FolderJsonTest, LoadingAndGetDataAreInverses) {
  Folder plain("/music", "music", true, true, false, true, false, false);
  Folder flagged("/photo/2019", "Trip", false, false, true, false, true, true);
  Folder cleaning = plain;
  cleaning.SetVolumeToBeClean("/volume2");
  for (const Folder& f : {plain, flagged, cleaning}) {
    Json::Value data = f.GetData();
    EXPECT_EQ(data.size(), 9u) << JsonToString(data);
    Folder back(data);
    EXPECT_TRUE(back == f) << JsonToString(data);
    EXPECT_EQ(back.GetData(), data);
  }
}

TEST(FolderJsonTest, OptionalKeysDefaultAndAreWrittenBack) {
  Folder f(ParseJson(kMusic));
  EXPECT_FALSE(f.IsPrivileged());
  EXPECT_FALSE(f.IsPaused());
  EXPECT_EQ(f.GetVolumeToBeClean(), "");
  EXPECT_EQ(JsonToString(f.GetData()),
            R"({"audio":true,"document":true,"name":"music","path":"/music","paused":false,)"
            R"("photo":true,"privileged":false,"video":false,"volume_to_be_clean":""})");
}

TEST(FolderJsonTest, MissingRequiredKeyIsRefusedByName) {
  for (const char* key : {"path", "name", "document", "audio", "video", "photo"}) {
    Json::Value data = ParseJson(kMusic);
    data.removeMember(key);
    std::string thrown = Thrown([&] { Folder f(data); });
    EXPECT_EQ(thrown.rfind(std::string("120 Missing property: ") + key, 0), 0u)
        << key << ": " << thrown;
  }
}

TEST(FolderJsonTest, MistypedRequiredKeyOrNonObjectIsRefused) {
  struct Case {
    const char* key;
    const char* value;
  } cases[] = {{"path", "{}"}, {"name", "[]"}, {"document", R"("yes")"}, {"photo", "{}"}};
  for (const Case& c : cases) {
    Json::Value data = ParseJson(kMusic);
    data[c.key] = ParseJson(c.value);
    std::string thrown = Thrown([&] { Folder f(data); });
    EXPECT_EQ(thrown.substr(0, 4), "120 ") << c.key << "=" << c.value << ": " << thrown;
  }
  EXPECT_EQ(Thrown([] { Folder f(ParseJson("[1]")); }).substr(0, 4), "120 ");
}

TEST(FolderJsonTest, MistypedOptionalKeysKeepTheirDefaults) {
  Json::Value data = ParseJson(kMusic);
  data["paused"] = "true";
  data["privileged"] = Json::Value(Json::objectValue);
  data["volume_to_be_clean"] = Json::Value(Json::arrayValue);
  data["unknown"] = 1;
  Folder f(data);
  EXPECT_FALSE(f.IsPaused());
  EXPECT_FALSE(f.IsPrivileged());
  EXPECT_EQ(f.GetVolumeToBeClean(), "");
  EXPECT_FALSE(f.GetData().isMember("unknown"));
}

class FolderShareTest : public ::testing::Test {
 protected:
  FolderEnv env_;
};

TEST_F(FolderShareTest, SetShareReplacesTheFirstWholeShareComponent) {
  struct Case {
    const char* path;
    const char* old_share;
    const char* new_share;
    const char* expected;
  } cases[] = {
      {"/music/live", "music", "music2", "/music2/live"},
      {"/music", "music", "tunes", "/tunes"},
      {"/a/x/a", "a", "b", "/b/x/a"},                // the share name appears twice
      {"/music/music", "music", "m2", "/m2/music"},  // and as a folder below it
  };
  for (const Case& c : cases) {
    Folder f(c.path, "n", true, true, true, true, false, false);
    ASSERT_EQ(f.GetShare(), c.old_share) << c.path;
    f.SetShare(c.new_share);
    EXPECT_EQ(f.GetPath(), c.expected) << c.path;
    EXPECT_EQ(f.GetShare(), c.new_share) << c.path;
  }
}

TEST_F(FolderShareTest, FullPathIsTheSharesVolumeFollowedByThePath) {
  env_.AddShare("music");
  Folder live("/music/live", "live", true, true, true, true, false, false);
  EXPECT_EQ(live.GetFullPath(), env_.Volume() + "/music/live");
  Folder missing("/nosuch/a", "a", true, true, true, true, false, false);
  EXPECT_EQ(Thrown([&] { missing.GetFullPath(); }).substr(0, 4), "800 ");
  Folder relative("music/a", "a", true, true, true, true, false, false);
  EXPECT_EQ(Thrown([&] { relative.GetShare(); }), "120 music/a");
}

}  // namespace
}  // namespace vellis::fileindex
