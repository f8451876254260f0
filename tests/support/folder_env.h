// A temporary root with scripted shares, for tests of the folder
// configuration, folder status and custom events.
#pragma once

#include <json/json.h>

#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>
#include <string>

#include "fileindex/folder.h"
#include "tests/support/fake_share_platform.h"
#include "tests/support/parse_json.h"
#include "tests/support/temp_root.h"
#include "tests/support/thrown.h"

namespace vellis::testing {

// FakeSharePlatform whose sleeps really wait (on the real platform), for
// tests in which several processes contend for a lock file. USleep waits
// the asked time divided by SetUSleepDivisor (1 unless set), so that many
// contending processes retry quickly.
class SleepingSharePlatform : public FakeSharePlatform {
 public:
  void Sleep(unsigned int seconds) override { target()->Sleep(seconds); }
  void USleep(uint64_t microseconds) override { target()->USleep(microseconds / divisor_); }
  void SetUSleepDivisor(uint64_t divisor) { divisor_ = divisor; }

 private:
  std::atomic<uint64_t> divisor_{1};
};

// Owns a TempRoot and installs a SleepingSharePlatform for its lifetime.
// Shares live in "<root>/volume1"; their queues are where the platform
// composes them ("<root>/volume1/@fileindex/<share>/queue").
class FolderEnv {
 public:
  FolderEnv();

  // Registers share `name` at "<root>/volume1/<name>", creates its folder
  // and its queue's folder, and returns the share's full path.
  std::string AddShare(const std::string& name);

  // "<root>/volume1": the volume part of every full path.
  std::string Volume() const { return root_.Path("/volume1"); }
  // The folders file and the status file under the root.
  std::string FoldersFile() const;
  std::string StatusFile() const;
  // The live queue of share `name`.
  std::string QueuePath(const std::string& name) const;

  SleepingSharePlatform& platform() { return platform_; }
  const TempRoot& root() const { return root_; }

 private:
  TempRoot root_;
  SleepingSharePlatform platform_;
  ScopedPlatform scoped_;
};

// A folder record with privileged and paused off.
std::shared_ptr<fileindex::Folder> MakeFolder(const std::string& path,
                                              const std::string& name = "n", bool document = true,
                                              bool audio = true, bool video = true,
                                              bool photo = true);

}  // namespace vellis::testing
