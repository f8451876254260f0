// SDKShare: the share queries answered alike by the fake and by the Linux
// platform's share registry (so that the two cannot drift apart), and its
// answers when the platform's queries fail or report no space.
#include "sdk/share.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <functional>
#include <string>
#include <vector>

#include "sdk/linux/share_registry.h"
#include "tests/support/fake_share_platform.h"
#include "tests/support/temp_root.h"
#include "tests/support/thrown.h"

namespace vellis::sdk {
namespace {

using testing::Thrown;

ShareInfo Share(const std::string& name, const std::string& volume = "/volume1") {
  return {name, volume + "/" + name};
}

// Runs against the fake (false) and the real registry (true).
class ShareContractTest : public ::testing::TestWithParam<bool> {
 protected:
  void SetUp() override {
    ShareInfo locked = Share("locked", volume_), ro = Share("ro", volume_),
              bin = Share("bin", volume_);
    locked.encryption = true;
    ro.read_only = true;
    bin.recycle_bin = bin.hide_unreadable = true;
    bin.ftp_privilege = 7;
    for (const ShareInfo& s :
         {Share("photo", volume_), Share("photo2", volume_), locked, ro, bin}) {
      if (GetParam()) {
        testing::MakeDirs(s.szPath);
        RegisterShare(s);
      } else {
        fake_.AddShare(s);
      }
    }
  }

  // The share holding `full_path` as "name|path", or "fails".
  std::string Holder(const std::string& full_path, size_t name_size = 492) {
    std::vector<char> name(name_size), path(4096);
    if (GetPlatform()->QORUShareNamePathGet(full_path, name.data(), name.size(), path.data(),
                                            path.size()) < 0) {
      return "fails";
    }
    return std::string(name.data()) + "|" + path.data();
  }

  testing::TempRoot root_;
  std::string volume_ = root_.Path("/volume1");
  testing::FakePlatform real_;  // the real platform behind a captured log
  testing::FakeSharePlatform fake_;
  testing::ScopedPlatform scoped_{GetParam() ? static_cast<Platform*>(&real_) : &fake_};
};

TEST_P(ShareContractTest, RecordsCarryTheirSettingsInRegistrationOrder) {
  struct Case {
    std::string name;
    bool can_be_indexed, encryption, recycle_bin, hide_unreadable;
    int ftp;
  } cases[] = {{"photo", true, false, false, false, 0},
               {"ro", false, false, false, false, 0},
               {"locked", false, true, false, false, 0},  // encrypted and not mounted: locked
               {"bin", true, false, true, true, 7}};
  for (const Case& c : cases) {
    SDKShare share(c.name);
    EXPECT_EQ(share.GetPath(), volume_ + "/" + c.name);
    EXPECT_EQ(share.CanBeIndexed(), c.can_be_indexed) << c.name;
    EXPECT_EQ(share.IsEncryption(), c.encryption) << c.name;
    EXPECT_EQ(share.IsEnableRecycleBin(), c.recycle_bin) << c.name;
    EXPECT_EQ(share.IsHideUnReadable(), c.hide_unreadable) << c.name;
    EXPECT_EQ(share.GetFTPPrivilege(), c.ftp) << c.name;
  }
  EXPECT_EQ(SDKShare::Enum(), (std::vector<std::string>{"photo", "photo2", "locked", "ro", "bin"}));
}

TEST_P(ShareContractTest, UnknownShareIsError800) {
  for (const std::string& name :
       {std::string("nosuch"), std::string("Photo"), std::string(""), std::string("photo\0x", 7)}) {
    EXPECT_EQ(Thrown([&] { SDKShare share(name); }).substr(0, 4), "800 ") << name;
  }
}

TEST_P(ShareContractTest, IndexPathsAreStableDistinctAndOutsideEveryShare) {
  SDKShare photo("photo");
  EXPECT_EQ(photo.GetQueuePath(), volume_ + "/@fileindex/photo/queue");
  EXPECT_EQ(photo.GetDBPath(), volume_ + "/@fileindex/photo/db");
  EXPECT_EQ(photo.GetDBName(), "fileindex_photo");
  EXPECT_NE(SDKShare("photo2").GetDBPath(), photo.GetDBPath());
  // The index data lies outside every share, so the monitor never sees it.
  EXPECT_EQ(Holder(photo.GetQueuePath()), "fails");
}

TEST_P(ShareContractTest, HolderOfAFullPathGoesByWholeComponents) {
  struct Case {
    std::string full_path, holder;
  } cases[] = {{volume_ + "/photo", "photo|" + volume_ + "/photo"},
               {volume_ + "/photo/2019/a.jpg", "photo|" + volume_ + "/photo"},
               {volume_ + "/photo2/a.jpg", "photo2|" + volume_ + "/photo2"},
               {volume_ + "/photo3/a.jpg", "fails"},
               {volume_ + "/pho", "fails"},
               {volume_, "fails"},
               {"", "fails"},
               {"photo/a.jpg", "fails"}};
  for (const Case& c : cases) EXPECT_EQ(Holder(c.full_path), c.holder) << c.full_path;
  EXPECT_EQ(Holder(volume_ + "/photo/a", 3), "fails") << "the name does not fit the buffer";
}

INSTANTIATE_TEST_SUITE_P(FakeAndReal, ShareContractTest, ::testing::Values(false, true),
                         [](const ::testing::TestParamInfo<bool>& info) {
                           return std::string(info.param ? "Real" : "Fake");
                         });

class ShareTest : public ::testing::Test {
 protected:
  ShareTest() { platform_.AddShare(Share("photo")); }

  testing::FakeSharePlatform platform_;
  testing::ScopedPlatform scoped_{&platform_};
};

TEST_F(ShareTest, OnlyTheTwoNoSpaceErrorsMeanNoSpace) {
  struct Case {
    bool enough;
    int err;
    bool expected;
  } cases[] = {{true, 0, true},
               {false, kPlatformErrNoSpace, false},
               {false, kPlatformErrNoInodes, false},
               {false, EIO, true},
               {false, 0, true},
               {false, 0x2901, true}};
  SDKShare share("photo");
  for (const Case& c : cases) {
    platform_.SetQuota(c.enough, c.err);
    EXPECT_EQ(share.IsSpaceEnough(), c.expected) << "enough=" << c.enough << " err=" << c.err;
  }
}

TEST_F(ShareTest, FailingQueriesThrowWithTheShareName) {
  struct Case {
    std::string call;
    std::function<void(const SDKShare&)> run;
    std::string error;
  } cases[] = {
      {"QLIBShareIsEncryptedGet", [](const SDKShare& s) { s.CanBeIndexed(); },
       "502 QLIBShareis_encryptedGet failed, share=photo"},
      {"QLIBShareIsReadOnlyGet", [](const SDKShare& s) { s.CanBeIndexed(); },
       "502 QLIBShareis_readonlyGet failed, share=photo"},
      {"FILEIDXDBPathCompose", [](const SDKShare& s) { s.GetDBPath(); },
       "502 FILEIDXDBPathCompose failed, share=photo"},
      {"FILEIDXGetIndexID", [](const SDKShare& s) { s.GetDBName(); },
       "502 FILEIDXGetIndexID failed, share=photo"},
      {"QLIBShareEnum", [](const SDKShare&) { SDKShare::Enum(); }, "121 QLIBShareEnum failed"}};
  SDKShare share("photo");
  for (const Case& c : cases) {
    platform_.ClearFailures();
    platform_.FailCall(c.call, EIO);
    EXPECT_EQ(Thrown([&] { c.run(share); }), c.error) << c.call;
  }
  // These never throw: a failure answers no, or enough space.
  platform_.FailCall("QLIBShareHideUnreadableGet", EIO);
  platform_.FailCall("QORUQuotaIsEnough", EIO);
  EXPECT_FALSE(share.IsHideUnReadable());
  EXPECT_TRUE(share.IsSpaceEnough());
}

TEST_F(ShareTest, ComposedPathsThatDoNotFitTheirBufferFail) {
  platform_.AddShare(Share("deep", "/volume1/" + std::string(4070, 'd')));
  SDKShare share("deep");
  EXPECT_EQ(Thrown([&] { share.GetQueuePath(); }),
            "502 FILEIDXQueuePathCompose failed, share=deep");
  EXPECT_EQ(Thrown([&] { share.GetDBPath(); }), "502 FILEIDXDBPathCompose failed, share=deep");
  EXPECT_EQ(share.GetDBName(), "fileindex_deep");
}

}  // namespace
}  // namespace vellis::sdk
