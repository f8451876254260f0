// Quantities that outgrow 32 bits: the library runs on 32-bit x86 too, where
// long is 32 bits and off_t and time_t are 64 bits only when built for it.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include "common/error.h"
#include "common/fs_util.h"
#include "common/json_util.h"
#include "fileindex/status_mgr.h"
#include "sdk/metadata_fields.h"
#include "sdk/platform.h"
#include "tests/support/fake_platform.h"
#include "tests/support/temp_root.h"

namespace vellis::fileindex {
namespace {

constexpr int64_t kIn2040 = 2208988800;       // 2040-01-01, past the 32-bit time_t
constexpr int64_t kFiveGiB = int64_t{5} << 30;  // past the 32-bit off_t and size_t

TEST(WideValuesTest, APauseEndingAfter2038IsKept) {
  testing::TempRoot root;
  testing::FakePlatform platform;
  testing::ScopedPlatform scoped(&platform);
  platform.SetTime(kIn2040);
  try {
    StatusMgr().Pause(2);
  } catch (const Error& e) {
    EXPECT_EQ(e.GetCode(), kErrInternal) << "only the absent daemon may fail: " << e.what();
  }
  EXPECT_EQ(StatusMgr().GetPauseInfo(), kIn2040 + 2 * 3600);
}

TEST(WideValuesTest, FilesOverFourGiBDatedAfter2038AreReadAndDescribed) {
  testing::TempRoot root;
  const std::string path = root.Path("/big.json");
  testing::WriteFile(path, "{\"a\": 1}");
  int fd = open(path.c_str(), O_WRONLY | O_CLOEXEC);
  ASSERT_GE(fd, 0);
  timespec times[2] = {{kIn2040, 0}, {kIn2040, 0}};
  ASSERT_EQ(futimens(fd, times), 0);
  Json::Value value;
  EXPECT_TRUE(JsonFromFile(value, path)) << "a file dated 2040 is read";
  ASSERT_EQ(ftruncate(fd, kFiveGiB), 0) << "sparse: no disk space is used";
  ASSERT_EQ(futimens(fd, times), 0);
  close(fd);

  EXPECT_TRUE(IsFileExist(path));
  fd = OpenRegularFile(path, O_RDONLY);
  EXPECT_GE(fd, 0) << strerror(errno);
  if (fd >= 0) close(fd);
  Json::Value options(Json::objectValue);
  Json::Value doc;
  ASSERT_EQ(sdk::GetPlatform()->ParseFile(path, options, &doc), 0);
  EXPECT_EQ(doc[sdk::metadata::kQORUMDFSSize].asInt64(), kFiveGiB);
  EXPECT_EQ(doc[sdk::metadata::kQORUMDFSContentChangeDate].asInt64(), kIn2040);
}

}  // namespace
}  // namespace vellis::fileindex
