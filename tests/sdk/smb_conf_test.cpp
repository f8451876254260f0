// The file-sharing service's search switch: the INI edit as a pure function,
// and the Linux platform reading and changing the real file under the root.
#include "sdk/linux/smb_conf.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <string>

#include "sdk/linux/linux_platform.h"
#include "tests/support/fake_platform.h"
#include "tests/support/temp_root.h"

namespace vellis::sdk {
namespace {

using testing::ReadFile;
using testing::WriteFile;

TEST(IniOptionTest, ReadsTheValueAsTheServiceDoes) {
  struct Case {
    const char* text;
    const char* value;  // "-": absent
  } cases[] = {{"[global]\n\tspotlight = yes\n", "yes"},
               {"[Global]\n  Spot Light=No  \n", "No"},
               {"[global]\n# spotlight = yes\n; spotlight = yes\n", "-"},
               {"[global]\nspotlight = yes\n[homes]\nspotlight = no\n", "yes"},
               {"[homes]\nspotlight = yes\n", "-"},
               {"[global]\nworkgroup = W \\\n  spotlight = yes\n", "-"},
               {"[global]\nspotlight = \\\nyes\n", "yes"}};
  for (const Case& c : cases) {
    EXPECT_EQ(GetIniOption(c.text, "global", "spotlight").value_or("-"), c.value) << c.text;
  }
}

TEST(IniOptionTest, SetsTheOptionKeepingEverythingElse) {
  struct Case {
    const char* what;
    const char* text;
    const char* expected;
  } cases[] = {
      {"replace in place, keeping indentation",
       "# top\n[global]\n   workgroup = W\n   spotlight = no ; old\n[homes]\n\tpath = /h\n",
       "# top\n[global]\n   workgroup = W\n   spotlight = yes\n[homes]\n\tpath = /h\n"},
      {"add after the section's last setting",
       "[global]\n\tworkgroup = W\n\n# comment\n[homes]\n\tspotlight = no\n",
       "[global]\n\tworkgroup = W\n\tspotlight = yes\n\n# comment\n[homes]\n\tspotlight = no\n"},
      {"add to an empty section at the end without a newline", "[global]",
       "[global]\n\tspotlight = yes\n"},
      {"no such section", "[homes]\n\tpath = /h\n",
       "[global]\n\tspotlight = yes\n[homes]\n\tpath = /h\n"},
      {"empty file", "", "[global]\n\tspotlight = yes\n"},
      {"CRLF kept", "[global]\r\n\tworkgroup = W\r\n",
       "[global]\r\n\tworkgroup = W\r\n\tspotlight = yes\r\n"},
      {"continued line rewritten whole", "[global]\n\tspotlight = \\\n no\n\tx = 1\n",
       "[global]\n\tspotlight = yes\n\tx = 1\n"},
      {"every occurrence in repeated sections",
       "[global]\nspotlight = no\n[global]\nSpot Light = no\n",
       "[global]\nspotlight = yes\n[global]\nspotlight = yes\n"},
      {"commented-out setting left alone, the new one right after the header",
       "[global]\n;spotlight = no\n", "[global]\n\tspotlight = yes\n;spotlight = no\n"}};
  for (const Case& c : cases) {
    std::string out = SetIniOption(c.text, "global", "spotlight", "yes");
    EXPECT_EQ(out, c.expected) << c.what;
    EXPECT_EQ(GetIniOption(out, "global", "spotlight").value_or(""), "yes") << c.what;
    EXPECT_EQ(SetIniOption(out, "global", "spotlight", "yes"), out) << c.what << ": idempotent";
  }
}

class SmbConfPlatformTest : public ::testing::Test {
 protected:
  testing::TempRoot root_;
  testing::FakePlatform fake_;
  testing::ScopedPlatform scoped_{&fake_};
  LinuxPlatform linux_;
  std::string conf_ = root_.Path("/etc/samba/smb.conf");
};

TEST_F(SmbConfPlatformTest, SwitchingRewritesOnlyTheOptionAndKeepsTheMode) {
  WriteFile(conf_, "# site settings\n[global]\n\tworkgroup = HOME\n[data]\n\tpath = /d\n");
  ASSERT_EQ(chmod(conf_.c_str(), 0640), 0);
  EXPECT_EQ(linux_.QORUSMBIsEnableSpotlight(), 0);
  ASSERT_EQ(linux_.QORUSMBSetSpotlight(1), 0);
  EXPECT_EQ(linux_.QORUSMBIsEnableSpotlight(), 1);
  EXPECT_EQ(
      ReadFile(conf_),
      "# site settings\n[global]\n\tworkgroup = HOME\n\tspotlight = yes\n[data]\n\tpath = /d\n");
  struct stat st;
  ASSERT_EQ(stat(conf_.c_str(), &st), 0);
  EXPECT_EQ(st.st_mode & 07777, 0640u);
  ASSERT_EQ(linux_.QORUSMBSetSpotlight(0), 0);
  EXPECT_EQ(linux_.QORUSMBIsEnableSpotlight(), 0);
}

TEST_F(SmbConfPlatformTest, AMissingOrIrregularConfigurationIsOffAndNotWritten) {
  EXPECT_EQ(linux_.QORUSMBIsEnableSpotlight(), 0);
  EXPECT_LT(linux_.QORUSMBSetSpotlight(1), 0);
  EXPECT_EQ(linux_.QLIBCErrGet(), ENOENT);
  EXPECT_EQ(linux_.QLIBCErrorGetFile(), "smb_conf.cpp");
  EXPECT_NE(access(conf_.c_str(), F_OK), 0) << "no configuration was made up";
  testing::MakeDirs(conf_);
  EXPECT_EQ(linux_.QORUSMBIsEnableSpotlight(), 0);
  EXPECT_LT(linux_.QORUSMBSetSpotlight(1), 0);
  EXPECT_EQ(linux_.QLIBCErrGet(), EINVAL);
}

}  // namespace
}  // namespace vellis::sdk
