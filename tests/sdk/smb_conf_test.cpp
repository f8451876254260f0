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
  // The text and the value ("-": absent).
  const char* cases[][2] = {{"[global]\n\tspotlight = yes\n", "yes"},
                            {"[Global]\n  Spot Light=No  \n", "No"},
                            {"[global]\n# spotlight = yes\n; spotlight = yes\n", "-"},
                            {"[global]\nspotlight = yes\n[homes]\nspotlight = no\n", "yes"},
                            {"[homes]\nspotlight = yes\n", "-"},
                            {"[global]\nworkgroup = W \\\n  spotlight = yes\n", "-"},
                            {"[global]\nspotlight = \\\nyes\n", "yes"}};
  for (const auto& [text, value] : cases)
    EXPECT_EQ(GetIniOption(text, "global", "spotlight").value_or("-"), value) << text;
}

TEST(IniOptionTest, SetsTheOptionKeepingEverythingElse) {
  const char* cases[][3] = {
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
  for (const auto& [what, text, expected] : cases) {
    std::string out = SetIniOption(text, "global", "spotlight", "yes");
    EXPECT_EQ(out, expected) << what;
    EXPECT_EQ(GetIniOption(out, "global", "spotlight").value_or(""), "yes") << what;
    EXPECT_EQ(SetIniOption(out, "global", "spotlight", "yes"), out) << what << ": idempotent";
  }
}

// The switch of the Linux platform edits an existing regular configuration
// in place, keeping its mode, and never makes one up.
TEST(SmbConfPlatformTest, SwitchingRewritesOnlyTheOptionOfARegularConfiguration) {
  testing::TempRoot root;
  testing::FakePlatform fake;
  testing::ScopedPlatform scoped(&fake);
  LinuxPlatform platform;
  const std::string conf = root.Path("/etc/samba/smb.conf");
  EXPECT_EQ(platform.QORUSMBIsEnableSpotlight(), 0);
  EXPECT_LT(platform.QORUSMBSetSpotlight(1), 0);
  EXPECT_EQ(platform.QLIBCErrGet(), ENOENT);
  EXPECT_EQ(platform.QLIBCErrorGetFile(), "smb_conf.cpp");
  EXPECT_NE(access(conf.c_str(), F_OK), 0) << "no configuration was made up";
  testing::MakeDirs(conf);
  EXPECT_EQ(platform.QORUSMBIsEnableSpotlight(), 0);
  EXPECT_LT(platform.QORUSMBSetSpotlight(1), 0);
  EXPECT_EQ(platform.QLIBCErrGet(), EINVAL);

  ASSERT_EQ(rmdir(conf.c_str()), 0);
  WriteFile(conf, "# site settings\n[global]\n\tworkgroup = HOME\n[data]\n\tpath = /d\n");
  ASSERT_EQ(chmod(conf.c_str(), 0640), 0);
  EXPECT_EQ(platform.QORUSMBIsEnableSpotlight(), 0);
  ASSERT_EQ(platform.QORUSMBSetSpotlight(1), 0);
  EXPECT_EQ(platform.QORUSMBIsEnableSpotlight(), 1);
  EXPECT_EQ(
      ReadFile(conf),
      "# site settings\n[global]\n\tworkgroup = HOME\n\tspotlight = yes\n[data]\n\tpath = /d\n");
  struct stat st;
  ASSERT_EQ(stat(conf.c_str(), &st), 0);
  EXPECT_EQ(st.st_mode & 07777, 0640u);
  ASSERT_EQ(platform.QORUSMBSetSpotlight(0), 0);
  EXPECT_EQ(platform.QORUSMBIsEnableSpotlight(), 0);
}

}  // namespace
}  // namespace vellis::sdk
