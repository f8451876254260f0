// The share queries answered alike by the fake and by the Linux platform's
// share registry, so that the two cannot drift apart.
#include <gtest/gtest.h>

#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "common/error.h"
#include "sdk/linux/share_registry.h"
#include "sdk/platform.h"
#include "sdk/share.h"
#include "tests/support/fake_share_platform.h"
#include "tests/support/temp_root.h"

namespace vellis::sdk {
namespace {

using testing::FakePlatform;
using testing::FakeSharePlatform;
using testing::ScopedPlatform;
using testing::TempRoot;

// Shares kept by one of the two implementations.
class Backend {
 public:
  virtual ~Backend() = default;
  virtual void Add(const ShareInfo& share) = 0;
  virtual Platform* platform() = 0;
};

class RealBackend : public Backend {
 public:
  void Add(const ShareInfo& share) override {
    testing::MakeDirs(share.szPath);
    RegisterShare(share);
  }
  Platform* platform() override { return &platform_; }

 private:
  FakePlatform platform_;  // the real platform behind a captured log
};

class FakeBackend : public Backend {
 public:
  void Add(const ShareInfo& share) override { platform_.AddShare(share); }
  Platform* platform() override { return &platform_; }

 private:
  FakeSharePlatform platform_;
};

class ShareContractTest : public ::testing::TestWithParam<bool> {
 protected:
  void SetUp() override {
    if (GetParam()) {
      backend_ = std::make_unique<RealBackend>();
    } else {
      backend_ = std::make_unique<FakeBackend>();
    }
    scoped_ = std::make_unique<ScopedPlatform>(backend_->platform());
    volume_ = root_.Path("/volume1");
    Add("photo");
    Add("photo2");
    Add("locked", [](ShareInfo& s) { s.encryption = true; });
    Add("ro", [](ShareInfo& s) { s.read_only = true; });
    Add("bin", [](ShareInfo& s) {
      s.recycle_bin = true;
      s.hide_unreadable = true;
      s.ftp_privilege = 7;
    });
  }
  void TearDown() override { scoped_.reset(); }

  void Add(const std::string& name, const std::function<void(ShareInfo&)>& change = nullptr) {
    ShareInfo share;
    share.szName = name;
    share.szPath = volume_ + "/" + name;
    if (change) change(share);
    backend_->Add(share);
  }

  // The share holding `full_path` as "name|path", or "fails".
  std::string Holder(const std::string& full_path) {
    char name[492] = {0};
    char path[4096] = {0};
    if (GetPlatform()->QORUShareNamePathGet(full_path, name, sizeof(name), path, sizeof(path)) <
        0) {
      return "fails";
    }
    return std::string(name) + "|" + path;
  }

  TempRoot root_;
  std::string volume_;
  std::unique_ptr<Backend> backend_;
  std::unique_ptr<ScopedPlatform> scoped_;
};

TEST_P(ShareContractTest, RecordCarriesNamePathAndSettings) {
  SDKShare bin("bin");
  EXPECT_EQ(bin.GetName(), "bin");
  EXPECT_EQ(bin.GetPath(), volume_ + "/bin");
  EXPECT_TRUE(bin.IsEnableRecycleBin());
  EXPECT_TRUE(bin.IsHideUnReadable());
  EXPECT_EQ(bin.GetFTPPrivilege(), 7);
  SDKShare photo("photo");
  EXPECT_FALSE(photo.IsEnableRecycleBin());
  EXPECT_FALSE(photo.IsHideUnReadable());
}

TEST_P(ShareContractTest, OnlyPlainWritableUnlockedSharesCanBeIndexed) {
  struct Case {
    std::string share;
    bool can_be_indexed;
    bool encryption;
  } cases[] = {
      {"photo", true, false},
      {"ro", false, false},
      {"locked", false, true},  // encrypted and not mounted: locked
  };
  for (const Case& c : cases) {
    SDKShare share(c.share);
    EXPECT_EQ(share.CanBeIndexed(), c.can_be_indexed) << c.share;
    EXPECT_EQ(share.IsEncryption(), c.encryption) << c.share;
  }
}

TEST_P(ShareContractTest, UnknownShareIsError800) {
  for (const std::string& name :
       {std::string("nosuch"), std::string("Photo"), std::string(""), std::string("photo\0x", 7)}) {
    try {
      SDKShare share(name);
      ADD_FAILURE() << "opened share \"" << name << "\"";
    } catch (const Error& e) {
      EXPECT_EQ(e.GetCode(), kErrShareNotFound) << name;
    }
  }
}

TEST_P(ShareContractTest, EnumListsSharesInRegistrationOrder) {
  EXPECT_EQ(SDKShare::Enum(), (std::vector<std::string>{"photo", "photo2", "locked", "ro", "bin"}));
}

TEST_P(ShareContractTest, IndexPathsAreStableDistinctAndOnTheShareVolume) {
  SDKShare photo("photo");
  SDKShare photo2("photo2");
  EXPECT_EQ(photo.GetQueuePath(), volume_ + "/@fileindex/photo/queue");
  EXPECT_EQ(photo.GetDBPath(), volume_ + "/@fileindex/photo/db");
  EXPECT_EQ(photo.GetDBName(), "fileindex_photo");
  EXPECT_EQ(SDKShare("photo").GetQueuePath(), photo.GetQueuePath());
  EXPECT_NE(photo2.GetQueuePath(), photo.GetQueuePath());
  EXPECT_NE(photo2.GetDBPath(), photo.GetDBPath());
  // The index data lies outside every share, so the monitor never sees it.
  EXPECT_EQ(Holder(photo.GetQueuePath()), "fails");
}

TEST_P(ShareContractTest, HolderOfAFullPathGoesByWholeComponents) {
  struct Case {
    std::string full_path;
    std::string holder;
  } cases[] = {
      {volume_ + "/photo", "photo|" + volume_ + "/photo"},
      {volume_ + "/photo/2019/a.jpg", "photo|" + volume_ + "/photo"},
      {volume_ + "/photo2/a.jpg", "photo2|" + volume_ + "/photo2"},
      {volume_ + "/photo3/a.jpg", "fails"},
      {volume_ + "/pho", "fails"},
      {volume_, "fails"},
      {"/etc/passwd", "fails"},
      {"", "fails"},
      {"photo/a.jpg", "fails"},
  };
  for (const Case& c : cases) EXPECT_EQ(Holder(c.full_path), c.holder) << c.full_path;
}

TEST_P(ShareContractTest, HolderThatDoesNotFitTheBufferFails) {
  char name[3] = {0};
  char path[4096] = {0};
  EXPECT_GT(0, GetPlatform()->QORUShareNamePathGet(volume_ + "/photo/a", name, sizeof(name), path,
                                                   sizeof(path)));
}

INSTANTIATE_TEST_SUITE_P(FakeAndReal, ShareContractTest, ::testing::Values(false, true),
                         [](const ::testing::TestParamInfo<bool>& info) {
                           return std::string(info.param ? "Real" : "Fake");
                         });

}  // namespace
}  // namespace vellis::sdk
