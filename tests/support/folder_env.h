// The base fixture of the folder and queue tests: a temporary root with
// scripted shares in "<root>/volume1", their queues in "@fileindex/<share>".
#pragma once

#include <gtest/gtest.h>

#include <atomic>
#include <cstdint>
#include <memory>
#include <string>

#include "fileindex/folder.h"
#include "tests/support/fake_share_platform.h"
#include "tests/support/temp_root.h"
#include "tests/support/thrown.h"

namespace vellis::testing {

// FakeSharePlatform whose sleeps really wait, for processes that contend for
// a lock file; USleep waits the time asked divided by SetUSleepDivisor.
class SleepingSharePlatform : public FakeSharePlatform {
 public:
  void Sleep(unsigned int seconds) override { target()->Sleep(seconds); }
  void USleep(uint64_t microseconds) override { target()->USleep(microseconds / divisor_); }
  void SetUSleepDivisor(uint64_t divisor) { divisor_ = divisor; }

 private:
  std::atomic<uint64_t> divisor_{1};
};

class FolderEnvTest : public ::testing::Test {
 protected:
  // Registers share `name` at "<root>/volume1/<name>"; returns that path.
  std::string AddShare(const std::string& name) {
    sdk::ShareInfo share;
    share.szName = name;
    share.szPath = Volume() + "/" + name;
    MakeDirs(share.szPath);
    MakeDirs(Volume() + "/@fileindex/" + name);
    platform_.AddShare(share);
    return share.szPath;
  }
  std::string Volume() const { return root_.Path("/volume1"); }
  std::string FoldersFile() const {
    return root_.Path("/var/packages/Vellis/etc/fileindex.folders");
  }
  std::string StatusFile() const { return root_.Path("/var/packages/Vellis/etc/fileindex.status"); }
  std::string QueuePath(const std::string& name) const {
    return Volume() + "/@fileindex/" + name + "/queue";
  }

  TempRoot root_;
  SleepingSharePlatform platform_;
  ScopedPlatform scoped_{&platform_};
};

// A folder record with privileged and paused off.
inline std::shared_ptr<fileindex::Folder> MakeFolder(const std::string& path,
                                                     const std::string& name = "n",
                                                     bool document = true, bool audio = true,
                                                     bool video = true, bool photo = true) {
  return std::make_shared<fileindex::Folder>(path, name, document, audio, video, photo, false,
                                             false);
}

}  // namespace vellis::testing
