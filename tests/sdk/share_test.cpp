// SDKShare's answers when the platform's queries fail or report no space.
#include "sdk/share.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <functional>
#include <string>

#include "common/error.h"
#include "tests/support/fake_share_platform.h"
#include "tests/support/thrown.h"

namespace vellis::sdk {
namespace {

using testing::Thrown;

using testing::FakeSharePlatform;
using testing::ScopedPlatform;

class ShareTest : public ::testing::Test {
 protected:
  ShareTest() : scoped_(&platform_) {
    ShareInfo photo;
    photo.szName = "photo";
    photo.szPath = "/volume1/photo";
    platform_.AddShare(photo);
    ShareInfo ro = photo;
    ro.szName = "ro";
    ro.szPath = "/volume1/ro";
    ro.read_only = true;
    platform_.AddShare(ro);
  }


  FakeSharePlatform platform_;
  ScopedPlatform scoped_;
};

TEST_F(ShareTest, OnlyTheTwoNoSpaceErrorsMeanNoSpace) {
  struct Case {
    bool enough;
    int err;
    bool expected;
  } cases[] = {
      {true, 0, true},
      {false, kPlatformErrNoSpace, false},
      {false, kPlatformErrNoInodes, false},
      {false, EIO, true},
      {false, 0, true},
      {false, 0x2901, true},
  };
  SDKShare share("photo");
  for (const Case& c : cases) {
    platform_.SetQuota(c.enough, c.err);
    EXPECT_EQ(share.IsSpaceEnough(), c.expected) << "enough=" << c.enough << " err=" << c.err;
  }
}

TEST_F(ShareTest, ReadOnlyShareIsRefusedAfterAskingForEncryptionFirst) {
  SDKShare share("ro");
  platform_.ClearCalls();
  EXPECT_FALSE(share.CanBeIndexed());
  std::vector<std::string> calls = platform_.Calls();
  ASSERT_GE(calls.size(), 2u);
  EXPECT_EQ(calls[0], "QLIBShareIsEncryptedGet");
  EXPECT_EQ(calls.back(), "QLIBShareIsReadOnlyGet");
}

TEST_F(ShareTest, FailingQueriesThrow502WithTheShareName) {
  struct Case {
    std::string call;
    std::function<void(const SDKShare&)> run;
    std::string error;
    std::string condition;
  } cases[] = {
      {"QLIBShareIsEncryptedGet", [](const SDKShare& s) { s.CanBeIndexed(); },
       "502 QLIBShareis_encryptedGet failed, share=photo",
       "0 > QLIBShareIsEncryptedGet(share_info_, &is_encrypted)"},
      {"QLIBShareIsReadOnlyGet", [](const SDKShare& s) { s.CanBeIndexed(); },
       "502 QLIBShareis_readonlyGet failed, share=photo",
       "0 > QLIBShareIsReadOnlyGet(share_info_, &is_readonly)"},
      {"QLIBShareIsEncryptionGet", [](const SDKShare& s) { s.IsEncryption(); },
       "502 QLIBShareIsEncryptionGet failed, share=photo",
       "0 > QLIBShareIsEncryptionGet(share_info_, &is_encryption)"},
      {"QLIBShareRecycleStatusGet", [](const SDKShare& s) { s.IsEnableRecycleBin(); },
       "502 QLIBShareRecycleStatusGet failed, share=photo",
       "0 > QLIBShareRecycleStatusGet(share_info_, &is_enabled)"},
      {"FILEIDXQueuePathCompose", [](const SDKShare& s) { s.GetQueuePath(); },
       "502 FILEIDXQueuePathCompose failed, share=photo",
       "0 > FILEIDXQueuePathCompose(share_info_->szPath, path, sizeof(path))"},
      {"FILEIDXDBPathCompose", [](const SDKShare& s) { s.GetDBPath(); },
       "502 FILEIDXDBPathCompose failed, share=photo",
       "0 > FILEIDXDBPathCompose(share_info_->szPath, path, sizeof(path))"},
      {"FILEIDXGetIndexID", [](const SDKShare& s) { s.GetDBName(); },
       "502 FILEIDXGetIndexID failed, share=photo",
       "0 > FILEIDXGetIndexID(share_info_->szName, name, sizeof(name))"},
  };
  SDKShare share("photo");
  for (const Case& c : cases) {
    platform_.ClearFailures();
    platform_.ClearLogs();
    platform_.FailCall(c.call, EIO);
    EXPECT_EQ(Thrown([&] { c.run(share); }), c.error) << c.call;
    std::vector<std::string> logs = platform_.LogsContaining("share.cpp:");
    ASSERT_EQ(logs.size(), 1u) << c.call;
    EXPECT_NE(logs[0].find("Failed [" + c.condition + "]"), std::string::npos) << logs[0];
  }
}

TEST_F(ShareTest, ComposedPathsThatDoNotFitTheirBufferFail) {
  ShareInfo deep;
  deep.szName = "deep";
  deep.szPath = "/volume1/" + std::string(4070, 'd') + "/deep";
  platform_.AddShare(deep);
  SDKShare share("deep");
  EXPECT_EQ(Thrown([&] { share.GetQueuePath(); }),
            "502 FILEIDXQueuePathCompose failed, share=deep");
  EXPECT_EQ(Thrown([&] { share.GetDBPath(); }), "502 FILEIDXDBPathCompose failed, share=deep");
  EXPECT_EQ(share.GetDBName(), "fileindex_deep");
}

TEST_F(ShareTest, QueriesThatNeverThrowAnswerNoOnFailure) {
  SDKShare share("photo");
  platform_.FailCall("QLIBShareHideUnreadableGet", EIO);
  platform_.FailCall("QORUQuotaIsEnough", EIO);
  EXPECT_FALSE(share.IsHideUnReadable());
  EXPECT_TRUE(share.IsSpaceEnough());
}

TEST_F(ShareTest, MissingShareLogsTheLookupAndThrows800) {
  EXPECT_EQ(Thrown([] { SDKShare share("nosuch"); }), "800 QORUShareGet failed, share=nosuch");
  std::vector<std::string> logs = platform_.LogsContaining(
      "Failed [0 > QORUShareGet(share_name.c_str(), &share_info_) || !share_info_]");
  EXPECT_EQ(logs.size(), 1u);
}

TEST_F(ShareTest, FailedEnumerationIsError121) {
  platform_.FailCall("QLIBShareEnum", EIO);
  EXPECT_EQ(Thrown([] { SDKShare::Enum(); }), "121 QLIBShareEnum failed");
}

}  // namespace
}  // namespace vellis::sdk
