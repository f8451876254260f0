// The base fixture of the management operation tests: scripted shares and
// services, fake search and indexing daemons, and readers of what changes.
#pragma once

#include <gtest/gtest.h>
#include <json/json.h>

#include <string>
#include <vector>

#include "tests/support/fake_index_daemon.h"
#include "tests/support/fake_search_daemon.h"
#include "tests/support/fake_services_platform.h"
#include "tests/support/temp_root.h"
#include "tests/support/thrown.h"

namespace vellis::testing {

using Strings = std::vector<std::string>;
using ServiceCall = FakeServicesPlatform::ServiceCall;

class IndexMgrTest : public ::testing::Test {
 public:
  // A folder as the folder record reads it, and lists of them.
  static Json::Value FolderJson(const std::string& path, bool document = true, bool audio = true,
                                bool video = true, bool photo = true);
  static Json::Value List(const std::vector<Json::Value>& folders);
  static Json::Value List(const Strings& paths);

 protected:
  IndexMgrTest();

  // Registers share `name` at "<root>/<volume>/<name>" and creates its
  // folder, its data folder and `dirs` below it; returns its full path.
  std::string AddShare(const std::string& name, const Strings& dirs = {},
                       const std::string& volume = "volume1");
  std::string Volume(const std::string& v = "volume1") const { return root_.Path("/" + v); }
  std::string QueuePath(const std::string& name) const;
  // The events queued for share `name`: "<event> <path>[ <- <path_old>][
  // <data>]", the paths without "<root>/<volume>".
  Strings Events(const std::string& name) const;
  // Adds `paths`, then forgets what that sent (ForgetSent).
  void Given(const Strings& paths);

  // The folders file (null when there is none) and its paths.
  Json::Value FoldersFile() const;
  Strings FolderPaths() const;
  // FoldersFileSaved() tells whether the list was saved since MarkFoldersFile().
  void MarkFoldersFile() const;
  bool FoldersFileSaved() const;
  // The monitor's queues (null when never written); the folders it watches.
  Json::Value MonitorQueues() const;
  Json::Value MonitorPaths(const std::string& name) const;

  // Since the last ForgetSent(): "<type> <share_name>" per daemon command,
  // then "<command> <index id>" per search request, then the monitor calls.
  Strings Sent() const;
  void ForgetSent();
  size_t LogCount(const std::string& text) const { return platform_.LogsContaining(text).size(); }

  TempRoot root_;
  FakeServicesPlatform platform_;
  ScopedPlatform scoped_{&platform_};
  FakeSearchDaemon search_;
  FakeIndexDaemon daemon_;

 private:
  size_t search_forgotten_ = 0;
  size_t daemon_forgotten_ = 0;
};

// The service calls made when the last indexed folder goes.
std::vector<ServiceCall> ServicesStoppedCalls();

}  // namespace vellis::testing
