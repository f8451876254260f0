#include "sdk/share.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <string>
#include <tuple>
#include <utility>
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

// Runs against the fake (false) and the real registry (true), so that the
// two cannot drift apart.
class ShareContractTest : public ::testing::TestWithParam<bool> {
 protected:
  void SetUp() override {
    // Name, path, FTP word, read only, encryption, recycle bin, hiding unreadable.
    const ShareInfo shares[] = {{"photo", volume_ + "/photo"},
                                {"photo2", volume_ + "/photo2"},
                                {"locked", volume_ + "/locked", 0, false, true},
                                {"ro", volume_ + "/ro", 0, true},
                                {"bin", volume_ + "/bin", 7, false, false, true, true}};
    for (const ShareInfo& s : shares) {
      testing::MakeDirs(s.szPath);
      GetParam() ? RegisterShare(s) : fake_.AddShare(s);
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
  auto settings = [](const SDKShare& s) {
    return std::string(s.CanBeIndexed() ? "indexable " : "") +
           (s.IsEncryption() ? "encrypted " : "") + (s.IsEnableRecycleBin() ? "recycle-bin " : "") +
           (s.IsHideUnReadable() ? "hides " : "") + "ftp=" + std::to_string(s.GetFTPPrivilege());
  };
  const std::pair<std::string, std::string> cases[] = {
      {"photo", "indexable ftp=0"},
      {"ro", "ftp=0"},
      {"locked", "encrypted ftp=0"},  // encrypted and not mounted: locked
      {"bin", "indexable recycle-bin hides ftp=7"}};
  for (const auto& [name, expected] : cases) {
    SDKShare share(name);
    EXPECT_EQ(share.GetPath(), volume_ + "/" + name);
    EXPECT_EQ(settings(share), expected) << name;
  }
  EXPECT_EQ(SDKShare::Enum(), (std::vector<std::string>{"photo", "photo2", "locked", "ro", "bin"}));
}

TEST_P(ShareContractTest, UnknownShareIsError800) {
  using namespace std::string_literals;
  for (const std::string& name : {"nosuch"s, "Photo"s, ""s, "photo\0x"s})
    EXPECT_EQ(Thrown([&] { SDKShare share(name); }).substr(0, 4), "800 ") << name;
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
  const std::pair<std::string, std::string> cases[] = {
      {volume_ + "/photo", "photo|" + volume_ + "/photo"},
      {volume_ + "/photo/2019/a.jpg", "photo|" + volume_ + "/photo"},
      {volume_ + "/photo2/a.jpg", "photo2|" + volume_ + "/photo2"},
      {volume_ + "/photo3/a.jpg", "fails"},
      {volume_ + "/pho", "fails"},
      {volume_, "fails"},
      {"", "fails"},
      {"photo/a.jpg", "fails"}};
  for (const auto& [full_path, holder] : cases) EXPECT_EQ(Holder(full_path), holder) << full_path;
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
  const std::tuple<bool, int, bool> cases[] = {{true, 0, true},
                                               {false, kPlatformErrNoSpace, false},
                                               {false, kPlatformErrNoInodes, false},
                                               {false, EIO, true},
                                               {false, 0, true},
                                               {false, 0x2901, true}};
  SDKShare share("photo");
  for (const auto& [enough, err, expected] : cases) {
    platform_.SetQuota(enough, err);
    EXPECT_EQ(share.IsSpaceEnough(), expected) << "enough=" << enough << " err=" << err;
  }
}

TEST_F(ShareTest, FailingQueriesThrowWithTheShareName) {
  using Query = void (*)(const SDKShare&);
  const std::tuple<const char*, Query, const char*> cases[] = {
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
  for (const auto& [call, query, error] : cases) {
    platform_.ClearFailures();
    platform_.FailCall(call, EIO);
    EXPECT_EQ(Thrown([&, query = query] { query(share); }), error) << call;
  }
  // These never throw: a failure answers no, or enough space.
  platform_.FailCall("QLIBShareHideUnreadableGet", EIO);
  platform_.FailCall("QORUQuotaIsEnough", EIO);
  EXPECT_FALSE(share.IsHideUnReadable());
  EXPECT_TRUE(share.IsSpaceEnough());
  // A composed path that does not fit its buffer fails alike.
  platform_.AddShare(Share("deep", "/volume1/" + std::string(4070, 'd')));
  SDKShare deep("deep");
  EXPECT_EQ(Thrown([&] { deep.GetQueuePath(); }), "502 FILEIDXQueuePathCompose failed, share=deep");
  EXPECT_EQ(Thrown([&] { deep.GetDBPath(); }), "502 FILEIDXDBPathCompose failed, share=deep");
  EXPECT_EQ(deep.GetDBName(), "fileindex_deep");
}

}  // namespace
}  // namespace vellis::sdk
