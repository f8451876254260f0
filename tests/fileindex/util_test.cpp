// Share paths and full paths, which full paths may be indexed, file types
// and the category queries, and notifications.
#include "fileindex/util.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <memory>
#include <set>
#include <sstream>

#include "common/error.h"
#include "sdk/linux/process.h"
#include "sdk/linux/share_registry.h"
#include "tests/support/fake_share_platform.h"
#include "tests/support/parse_json.h"
#include "tests/support/temp_root.h"
#include "tests/support/thrown.h"

namespace vellis::fileindex {
namespace {

using testing::Thrown;

// The rule that refuses `full_path` by name, or "error <code>".
std::string Rule(const std::string& full_path) {
  try {
    return IndexRuleName(CheckFullPathIndexable(full_path));
  } catch (const Error& e) {
    return "error " + std::to_string(e.GetCode());
  }
}

sdk::ShareInfo Share(const std::string& path) {
  sdk::ShareInfo share;
  share.szPath = path;
  share.szName = path.substr(path.rfind('/') + 1);
  return share;
}

// Shares registered with the Linux platform or, as a parameter, kept by the
// fake: both must give the same answers.
class IndexabilityTreeTest : public ::testing::TestWithParam<bool> {
 protected:
  void SetUp() override {
    for (const char* file : {"/photo/2019/a.jpg", "/photo/2019/#recycle/x", "/photo/dir/x",
                             "/photo/#recycle/a.jpg", "/photo2/b.jpg", "/music/#recycle/a.mp3",
                             "/homes/alice/#recycle/x.txt", "/homes/alice/doc.txt", "/ro/a.txt",
                             "/loose/a.txt", "/photo/#snapshot/GMT-1/a.jpg", "/locked/a.txt"}) {
      testing::WriteFile(v_ + file, "x");
    }
    ASSERT_EQ(0, symlink((v_ + "/photo/dir").c_str(), (v_ + "/photo/link").c_str()));
    ASSERT_EQ(0, symlink("/etc", (v_ + "/photo/etc").c_str()));
    if (!GetParam()) fake_ = new testing::FakeSharePlatform();
    platform_.reset(fake_ ? fake_ : new testing::FakePlatform());
    scoped_ = std::make_unique<testing::ScopedPlatform>(platform_.get());
    for (const char* name : {"photo", "photo2", "music", "homes", "locked", "ro"}) {
      sdk::ShareInfo share = Share(v_ + "/" + name);
      share.recycle_bin = share.szName == "photo" || share.szName == "homes";
      share.encryption = share.szName == "locked";
      share.read_only = share.szName == "ro";
      fake_ ? fake_->AddShare(share) : static_cast<void>(sdk::RegisterShare(share));
    }
  }
  void TearDown() override { scoped_.reset(); }

  testing::TempRoot root_;
  std::string v_ = root_.Path("/volume1");
  testing::FakeSharePlatform* fake_ = nullptr;  // owned by platform_ when set
  std::unique_ptr<sdk::Platform> platform_;
  std::unique_ptr<testing::ScopedPlatform> scoped_;
};

// "#recycle" below the top of a share is an ordinary name, and music's bin
// is off; /loose lies in no share.
TEST_P(IndexabilityTreeTest, EachPathIsJudgedByTheFirstRuleThatRefusesIt) {
  struct Case {
    std::string rel, rule;
  } cases[] = {{"/photo", "indexable"},
               {"/photo/2019/a.jpg", "indexable"},
               {"/photo2/b.jpg", "indexable"},
               {"/photo/dir/", "not-canonical"},
               {"/photo/dir/../dir", "not-canonical"},
               {"/photo/link", "not-canonical"},
               {"/photo/etc/passwd", "not-canonical"},
               {"/photo/missing", "file-system-unknown"},
               {"/photo/#recycle/a.jpg", "recycle-bin"},
               {"/photo/2019/#recycle", "indexable"},
               {"/music/#recycle/a.mp3", "indexable"},
               {"/homes/alice/doc.txt", "indexable"},
               {"/homes/alice/#recycle/x.txt", "recycle-bin"},
               {"/photo/#snapshot/GMT-1/a.jpg", "snapshot"},
               {"/locked/a.txt", "share-not-indexable"},
               {"/ro/a.txt", "share-not-indexable"},
               {"/loose/a.txt", "error 502"}};
  for (const Case& c : cases) {
    EXPECT_EQ(Rule(v_ + c.rel), c.rule) << c.rel;
    if (c.rule == "indexable" || c.rule == "recycle-bin") {
      EXPECT_TRUE(CanFullPathBeIndexed(v_ + c.rel) == (c.rule == "indexable") &&
                  IsFullPathInRecycleBin(v_ + c.rel) == (c.rule == "recycle-bin"))
          << c.rel;
    }
  }
}

INSTANTIATE_TEST_SUITE_P(FakeAndReal, IndexabilityTreeTest, ::testing::Values(false, true),
                         [](const ::testing::TestParamInfo<bool>& info) {
                           return std::string(info.param ? "Real" : "Fake");
                         });

// The rules that need a scripted platform, and share path conversions.
class UtilTest : public ::testing::Test {
 protected:
  void SetUp() override {
    for (const char* dir : {"/photo/nfs", "/photo/iso", "/photo/sys", "/photo/tmp", "/photo/mnt",
                            "/vault/sub", "/homes/bob", "/photo/#recycle", "/photo/#snapshot"}) {
      testing::MakeDirs(v_ + dir);
    }
    for (const char* name : {"/photo", "/photo2", "/vault", "/homes"}) {
      sdk::ShareInfo share = Share(v_ + name);
      share.encryption = share.szName == "vault";
      platform_.AddShare(share);
    }
    platform_.AddShare(Share(root_.Path("/volume10/music")));
    for (const char* mount : {"/vault", "/vault/sub", "/photo/mnt"}) {
      platform_.SetMountPoint(v_ + mount, 1);
    }
  }

  testing::TempRoot root_;
  std::string v_ = root_.Path("/volume1");
  testing::FakeSharePlatform platform_;
  testing::ScopedPlatform scoped_{&platform_};
};

// An unlocked encrypted share is mounted at its own path.
TEST_F(UtilTest, FileSystemTypesMountPointsAndFailingTests) {
  platform_.SetFsType(v_ + "/photo/nfs", sdk::kFsNfs);
  platform_.SetFsType(v_ + "/photo/iso", sdk::kFsIso9660);
  platform_.SetFsType(v_ + "/photo/sys", 12);
  platform_.SetFsType(v_ + "/photo/tmp", sdk::kFsTmpfs);
  platform_.SetFsType(v_ + "/photo/ghost", sdk::kFsExt);  // gone after the type was read
  struct Case {
    std::string rel, rule;
  } cases[] = {
      {"/photo/nfs", "remote-fs"}, {"/photo/iso", "image-fs"},       {"/photo/sys", "system-fs"},
      {"/photo/tmp", "indexable"}, {"/photo/mnt", "mount-point"},    {"/vault", "indexable"},
      {"/vault/sub", "indexable"}, {"/photo/ghost", "unresolvable"},
  };
  for (const Case& c : cases) EXPECT_EQ(Rule(v_ + c.rel), c.rule) << c.rel;
  platform_.SetMountPoint(v_ + "/vault", 0);  // locked
  EXPECT_EQ(Rule(v_ + "/vault"), "share-not-indexable");
  // Failing tests count as "no"; failing share lookups propagate.
  platform_.FailCall("QLIBFhsPathInSnapshot", EIO);
  platform_.FailCall("QORUShareIsShareRecycle", EIO);
  platform_.FailCall("QORUFSDirIsMntPoint", EIO, v_ + "/photo/mnt");
  platform_.FailCall("QORUGetFSType", EACCES, v_ + "/photo/nfs");
  EXPECT_EQ(Rule(v_ + "/photo/#snapshot"), "indexable");
  EXPECT_EQ(Rule(v_ + "/photo/mnt"), "indexable");
  EXPECT_EQ(Rule(v_ + "/photo/nfs"), "file-system-unknown");
  platform_.FailCall("QLIBShareIsReadOnlyGet", EIO);
  EXPECT_EQ(Rule(v_ + "/photo/tmp"), "error 502");
  platform_.ClearFailures();
  platform_.FailCall("QORUShareGet", ENOENT);
  EXPECT_EQ(Rule(v_ + "/photo/tmp"), "error 800");
}

TEST_F(UtilTest, CostlyQueriesAreMadeOnlyWhenTheTextAsksForThem) {
  for (const auto& [rel, asked] : {std::pair{"/photo/tmp", ""},
                                   {"/photo/#snapshot", "QLIBFhsPathInSnapshot"},
                                   {"/photo/#recycle", "QORUShareIsShareRecycle"},
                                   {"/homes/bob", "QORURecycleUserHomePathIsExist"}}) {
    platform_.ClearCalls();
    Rule(v_ + rel);
    const std::vector<std::string> calls = platform_.Calls();
    for (const std::string query :
         {"QLIBFhsPathInSnapshot", "QORUShareIsShareRecycle", "QORURecycleUserHomePathIsExist"}) {
      EXPECT_EQ(std::count(calls.begin(), calls.end(), query) > 0, query == asked) << rel << query;
    }
  }
}

// Whole names, case and all; the platform's hidden folders count too.
TEST_F(UtilTest, PreservedNamesAreWholeAndCaseSensitive) {
  for (const auto& [name, preserved] : {std::pair{".DS_Store", true},
                                        {".TemporaryItems", true},
                                        {"@eaDir", true},
                                        {".ds_store", false},
                                        {"", false},
                                        {"@eaDir2", false}}) {
    EXPECT_EQ(IsSystemPreservedFileName(name), preserved) << name;
  }
  platform_.FailCall("QORUEAIsHiddenDir", EIO);
  EXPECT_FALSE(IsSystemPreservedFileName("@eaDir")) << "@eaDir is the platform's";
}

TEST_F(UtilTest, HoldingShareIsFoundByWholeComponents) {
  struct Case {
    std::string full_path, expected;
  } cases[] = {
      {"/volume1/photo", "photo /volume1/photo"},
      {"/volume1/photo2/a.jpg", "photo2 /volume1/photo2"},
      {"/volume10/music/a.mp3", "music /volume10/music"},
      {"/volume1/music/a.mp3", "502 QORUShareNamePathGet failed, full_path=/volume1/music/a.mp3"},
      {"/volume1/photo3", "502 QORUShareNamePathGet failed, full_path=/volume1/photo3"},
      {std::string("/volume1/photo\0/x", 17), "120 path contains a NUL byte"},
  };
  for (const Case& c : cases) {
    std::string name, path;
    std::string got =
        Thrown([&] { GetShareNamePathByFullPath(name, path, root_.path() + c.full_path); });
    if (got == "no error") got = name + " " + path;
    for (size_t at; (at = got.find(root_.path())) != std::string::npos;) {
      got.erase(at, root_.path().size());
    }
    EXPECT_EQ(got, c.expected);
  }
  EXPECT_EQ(platform_.LogsContaining("Failed [0 > QORUShareNamePathGet(full_path.c_str(), ").size(),
            2u);
}

// The share "a" in "/v/a/x/a/y" is the first whole component "a".
TEST(SharePathTest, ReplaceShareSwapsTheFirstWholeComponent) {
  for (const auto& [path, expected] : {std::pair{"/v/a/x/a/y", "/v/b/x/a/y"},
                                       {"/a", "/b"},
                                       {"/v/xa/a", "/v/xa/b"},
                                       {"/v/ab/x", "120 Cannot find share: a"},
                                       {"", "120 Cannot find share: a"}}) {
    std::string got;
    const std::string error = Thrown([&, p = path] { got = ReplacePathShare(p, "b", "a"); });
    EXPECT_EQ(error == "no error" ? got : error, expected) << path;
  }
}

TEST(FileTypeTest, MediaQueriesNameExactlyTheTableExtensionsOfTheirType) {
  for (const auto& [category, type] :
       {std::pair{"audio", kAudio}, {"video", kVideo}, {"image", kImage}}) {
    std::set<std::string> words, of_type;
    std::istringstream in(GetCategoryQuery(category));
    for (std::string word; in >> word;) words.insert(word);
    words.erase("OR");
    for (const auto& [ext, t] : FileExtensionTable()) {
      if (t == type) of_type.insert(ext);
    }
    EXPECT_EQ(words, of_type) << category;
  }
  EXPECT_NE(GetCategoryQuery("document").find(" OR pdf OR "), std::string::npos);
  EXPECT_EQ(GetCategoryQuery("photo"), "");
}

// The built vellis-notify appends one line per notification; a missing
// notifier loses the notification quietly.
TEST_F(UtilTest, NotifierDeliversOneLinePerNotification) {
  char exe[4096] = {};
  ASSERT_GT(readlink("/proc/self/exe", exe, sizeof(exe) - 1), 0);
  const std::string notifier = Dirname(Dirname(exe)) + "/bin/vellis-notify";
  platform_.SetExecResult(0, true);
  setenv(sdk::kNotifierEnv, root_.Path("/no/such/notifier").c_str(), 1);
  EXPECT_LT(NotifyLackOfMemory(), 0);
  setenv(sdk::kNotifierEnv, notifier.c_str(), 1);
  EXPECT_EQ(SendHMXNotify(), 0) << notifier;
  unsetenv(sdk::kNotifierEnv);
  const Json::Value line = testing::ParseJson(
      testing::ReadFile(root_.Path("/var/packages/Vellis/var/notifications.jsonl")));
  EXPECT_EQ(line["to"], "@administrators");
  EXPECT_EQ(line["message"], "error:index_no_space");
  EXPECT_EQ(line["params"][0].asString().rfind("<a data-qoru-app=", 0), 0u);
}

}  // namespace
}  // namespace vellis::fileindex
