// Which full paths may be indexed, on a real tree of folders.
#include <gtest/gtest.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "common/error.h"
#include "fileindex/util.h"
#include "sdk/linux/share_registry.h"
#include "tests/support/fake_share_platform.h"
#include "tests/support/temp_root.h"

namespace vellis::fileindex {
namespace {

using testing::FakePlatform;
using testing::FakeSharePlatform;
using testing::ScopedPlatform;
using testing::TempRoot;

// The rule that refuses `full_path` by name, or "error <code>".
std::string Rule(const std::string& full_path) {
  try {
    return IndexRuleName(CheckFullPathIndexable(full_path));
  } catch (const Error& e) {
    return "error " + std::to_string(e.GetCode());
  }
}

// A tree of shares under a temporary root:
//   photo (recycle bin on), photo2, music (recycle bin off),
//   homes (recycle bin on), locked (encrypted, not mounted), ro (read-only)
// The shares are registered with the Linux platform or, as a parameter,
// kept by the fake; both must give the same answers.
class IndexabilityTreeTest : public ::testing::TestWithParam<bool> {
 protected:
  void SetUp() override {
    v_ = root_.Path("/volume1");
    for (const char* dir :
         {"/photo/2019/#recycle", "/photo/dir", "/photo/#recycle", "/photo/#snapshot/GMT-1",
          "/photo2", "/music/#recycle", "/homes/alice/#recycle", "/locked", "/ro", "/loose"}) {
      testing::MakeDirs(v_ + dir);
    }
    for (const char* file :
         {"/photo/2019/a.jpg", "/photo/#recycle/a.jpg", "/photo/#snapshot/GMT-1/a.jpg",
          "/photo2/b.jpg", "/music/#recycle/a.mp3", "/homes/alice/#recycle/x.txt",
          "/homes/alice/doc.txt", "/locked/a.txt", "/ro/a.txt", "/loose/a.txt"}) {
      testing::WriteFile(v_ + file, "x");
    }
    ASSERT_EQ(0, symlink((v_ + "/photo/dir").c_str(), (v_ + "/photo/link").c_str()));
    ASSERT_EQ(0, symlink("/etc", (v_ + "/photo/etc").c_str()));

    if (GetParam()) {
      platform_ = std::make_unique<FakePlatform>();
    } else {
      fake_ = new FakeSharePlatform();
      platform_.reset(fake_);
    }
    scoped_ = std::make_unique<ScopedPlatform>(platform_.get());
    Add("photo", [](sdk::ShareInfo& s) { s.recycle_bin = true; });
    Add("photo2", nullptr);
    Add("music", nullptr);
    Add("homes", [](sdk::ShareInfo& s) { s.recycle_bin = true; });
    Add("locked", [](sdk::ShareInfo& s) { s.encryption = true; });
    Add("ro", [](sdk::ShareInfo& s) { s.read_only = true; });
  }
  void TearDown() override { scoped_.reset(); }

  void Add(const std::string& name, const std::function<void(sdk::ShareInfo&)>& change) {
    sdk::ShareInfo share;
    share.szName = name;
    share.szPath = v_ + "/" + name;
    if (change) change(share);
    if (fake_) {
      fake_->AddShare(share);
    } else {
      sdk::RegisterShare(share);
    }
  }

  TempRoot root_;
  std::string v_;
  FakeSharePlatform* fake_ = nullptr;  // owned by platform_ when set
  std::unique_ptr<sdk::Platform> platform_;
  std::unique_ptr<ScopedPlatform> scoped_;
};

TEST_P(IndexabilityTreeTest, EachPathIsJudgedByTheFirstRuleThatRefusesIt) {
  struct Case {
    std::string rel;  // below the volume
    std::string rule;
  } cases[] = {
      {"/photo", "indexable"},
      {"/photo/2019/a.jpg", "indexable"},
      {"/photo/dir", "indexable"},
      {"/photo2/b.jpg", "indexable"},
      {"/photo/dir/", "not-canonical"},
      {"/photo//dir", "not-canonical"},
      {"/photo/./dir", "not-canonical"},
      {"/photo/dir/../dir", "not-canonical"},
      {"/photo/link", "not-canonical"},
      {"/photo/etc", "not-canonical"},
      {"/photo/etc/passwd", "not-canonical"},
      {"/photo/missing", "file-system-unknown"},
      {"/photo/#recycle/a.jpg", "recycle-bin"},
      {"/photo/#recycle", "recycle-bin"},
      {"/photo/2019/#recycle", "indexable"},   // not at the top: an ordinary name
      {"/music/#recycle/a.mp3", "indexable"},  // the bin is off
      {"/homes/alice/doc.txt", "indexable"},
      {"/homes/alice/#recycle/x.txt", "recycle-bin"},
      {"/photo/#snapshot/GMT-1/a.jpg", "snapshot"},
      {"/locked/a.txt", "share-not-indexable"},
      {"/ro/a.txt", "share-not-indexable"},
      {"/loose/a.txt", "error 502"},  // in no share
  };
  for (const Case& c : cases) {
    EXPECT_EQ(Rule(v_ + c.rel), c.rule) << c.rel;
    if (c.rule.compare(0, 5, "error") != 0) {
      EXPECT_EQ(CanFullPathBeIndexed(v_ + c.rel), c.rule == "indexable") << c.rel;
    }
  }
}

TEST_P(IndexabilityTreeTest, RecycleBinsOfSharesAndHomeFolders) {
  struct Case {
    std::string rel;
    bool in_bin;
  } cases[] = {
      {"/photo/#recycle/a.jpg", true},       {"/music/#recycle/a.mp3", false},
      {"/homes/alice/#recycle/x.txt", true}, {"/homes/alice/doc.txt", false},
      {"/photo/2019/a.jpg", false},          {"/photo/a#recycle", false},
  };
  for (const Case& c : cases) EXPECT_EQ(IsFullPathInRecycleBin(v_ + c.rel), c.in_bin) << c.rel;
}

TEST_P(IndexabilityTreeTest, SharePathsAreJudgedThroughTheirFullPath) {
  EXPECT_TRUE(CanPathBeIndexed("/photo/2019/a.jpg"));
  EXPECT_FALSE(CanPathBeIndexed("/photo/link"));
  EXPECT_FALSE(CanPathBeIndexed("/ro"));
  EXPECT_THROW(CanPathBeIndexed("/nosuch/a"), Error);
  EXPECT_THROW(CanPathBeIndexed("photo"), Error);
}

INSTANTIATE_TEST_SUITE_P(FakeAndReal, IndexabilityTreeTest, ::testing::Values(false, true),
                         [](const ::testing::TestParamInfo<bool>& info) {
                           return std::string(info.param ? "Real" : "Fake");
                         });

// The rules that need a scripted platform: file-system types, mount points
// and failing queries.
class IndexabilityScriptedTest : public ::testing::Test {
 protected:
  IndexabilityScriptedTest() : scoped_(&platform_) {}

  void SetUp() override {
    v_ = root_.Path("/volume1");
    for (const char* dir : {"/photo/nfs", "/photo/iso", "/photo/sys", "/photo/tmp", "/photo/mnt",
                            "/vault/sub", "/homes/bob", "/photo/#recycle", "/photo/#snapshot"}) {
      testing::MakeDirs(v_ + dir);
    }
    for (const char* name : {"photo", "vault", "homes"}) {
      sdk::ShareInfo share;
      share.szName = name;
      share.szPath = v_ + "/" + name;
      share.encryption = share.szName == "vault";
      platform_.AddShare(share);
    }
    platform_.SetMountPoint(v_ + "/vault", 1);  // unlocked: mounted at its path
    platform_.SetMountPoint(v_ + "/vault/sub", 1);
    platform_.SetMountPoint(v_ + "/photo/mnt", 1);
  }

  TempRoot root_;
  std::string v_;
  FakeSharePlatform platform_;
  ScopedPlatform scoped_;
};

TEST_F(IndexabilityScriptedTest, FileSystemTypesAndMountPoints) {
  platform_.SetFsType(v_ + "/photo/nfs", sdk::kFsNfs);
  platform_.SetFsType(v_ + "/photo/iso", sdk::kFsIso9660);
  platform_.SetFsType(v_ + "/photo/sys", 12);
  platform_.SetFsType(v_ + "/photo/tmp", sdk::kFsTmpfs);
  platform_.SetFsType(v_ + "/photo/ghost", sdk::kFsExt);  // gone after the type was read
  platform_.FailCall("QORUGetFSType", EACCES, v_ + "/photo");
  struct Case {
    std::string rel;
    std::string rule;
  } cases[] = {
      {"/photo/nfs", "remote-fs"},       {"/photo/iso", "image-fs"},
      {"/photo/sys", "system-fs"},       {"/photo/tmp", "indexable"},
      {"/photo", "file-system-unknown"}, {"/photo/mnt", "mount-point"},
      {"/vault", "indexable"},           {"/vault/sub", "indexable"},
      {"/photo/ghost", "unresolvable"},
  };
  for (const Case& c : cases) EXPECT_EQ(Rule(v_ + c.rel), c.rule) << c.rel;
}

TEST_F(IndexabilityScriptedTest, LockedEncryptedShareIsRefusedEvenAtItsMountPoint) {
  platform_.SetMountPoint(v_ + "/vault", 0);
  EXPECT_EQ(Rule(v_ + "/vault"), "share-not-indexable");
}

TEST_F(IndexabilityScriptedTest, CostlyQueriesAreMadeOnlyWhenTheTextAsksForThem) {
  struct Case {
    std::string rel;
    std::string query;
    bool asked;
  } cases[] = {
      {"/photo/tmp", "QLIBFhsPathInSnapshot", false},
      {"/photo/tmp", "QORUShareIsShareRecycle", false},
      {"/photo/tmp", "QORURecycleUserHomePathIsExist", false},
      {"/homes/bob", "QORURecycleUserHomePathIsExist", true},
      {"/photo/#snapshot", "QLIBFhsPathInSnapshot", true},
      {"/photo/#recycle", "QORUShareIsShareRecycle", true},
  };
  for (const Case& c : cases) {
    platform_.ClearCalls();
    Rule(v_ + c.rel);
    std::vector<std::string> calls = platform_.Calls();
    EXPECT_EQ(std::count(calls.begin(), calls.end(), c.query) > 0, c.asked) << c.rel << c.query;
  }
}

TEST_F(IndexabilityScriptedTest, FailingTestsCountAsNoButShareLookupsPropagate) {
  platform_.FailCall("QLIBFhsPathInSnapshot", EIO);
  platform_.FailCall("QORUShareIsShareRecycle", EIO);
  platform_.FailCall("QORUFSDirIsMntPoint", EIO, v_ + "/photo/mnt");
  EXPECT_EQ(Rule(v_ + "/photo/#snapshot"), "indexable");
  EXPECT_EQ(Rule(v_ + "/photo/mnt"), "indexable");
  platform_.FailCall("QLIBShareIsReadOnlyGet", EIO);
  EXPECT_EQ(Rule(v_ + "/photo/tmp"), "error 502");
  platform_.ClearFailures();
  platform_.FailCall("QORUShareGet", ENOENT);
  EXPECT_EQ(Rule(v_ + "/photo/tmp"), "error 800");
}

TEST_F(IndexabilityScriptedTest, PreservedNamesAreWholeAndCaseSensitive) {
  struct Case {
    std::string name;
    bool preserved;
  } cases[] = {
      {".DS_Store", true},  {".TemporaryItems", true}, {".QORUPPSDB", true}, {"@eaDir", true},
      {".ds_store", false}, {"@eadir", false},         {"", false},          {".DS_Store2", false},
  };
  for (const Case& c : cases) EXPECT_EQ(IsSystemPreservedFileName(c.name), c.preserved) << c.name;
  platform_.FailCall("QORUEAIsHiddenDir", EIO);
  EXPECT_TRUE(IsSystemPreservedFileName(".DS_Store"));
  EXPECT_FALSE(IsSystemPreservedFileName("@eaDir"));
}

}  // namespace
}  // namespace vellis::fileindex
