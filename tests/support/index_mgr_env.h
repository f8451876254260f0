// A temporary root for the tests of the management operations: scripted
// shares and services (FakeServicesPlatform), a fake search daemon and a
// fake indexing daemon on their sockets, and readers of everything the
// operations change.
#pragma once

#include <json/json.h>

#include <map>
#include <memory>
#include <string>
#include <vector>

#include "common/error.h"
#include "tests/support/fake_index_daemon.h"
#include "tests/support/fake_search_daemon.h"
#include "tests/support/fake_services_platform.h"
#include "tests/support/temp_root.h"
#include "tests/support/thrown.h"

namespace vellis::testing {

// The service calls made when the last indexed folder goes: file sharing
// stops offering search, and the indexing services stop.
std::vector<FakeServicesPlatform::ServiceCall> ServicesStoppedCalls();

class IndexMgrEnv {
 public:
  IndexMgrEnv();
  ~IndexMgrEnv();

  // Registers share `name` at "<root>/<volume>/<name>" and creates its
  // folder; returns its full path.
  std::string AddShare(const std::string& name, const std::string& volume = "volume1");
  // "<root>/<volume>".
  std::string Volume(const std::string& volume = "volume1") const;
  // The live queue of share `name`, on the volume it was added to.
  std::string QueuePath(const std::string& name) const;
  // The events queued for share `name`, one object per line.
  std::vector<Json::Value> QueueEvents(const std::string& name) const;
  // A folder object as the folder record reads it.
  static Json::Value FolderJson(const std::string& path, bool document = true, bool audio = true,
                                bool video = true, bool photo = true);

  // The folders file as saved (null when there is none) and its paths.
  Json::Value FoldersFile() const;
  std::vector<std::string> FolderPaths() const;
  // Rewrites the folders file with the same list in another layout (a
  // leading space), so that FoldersFileSaved() tells whether it was saved
  // since.
  void MarkFoldersFile() const;
  bool FoldersFileSaved() const;
  // The queues registered with the monitor for the application "fileindex"
  // (an object keyed by queue path; null when none was ever written).
  Json::Value MonitorQueues() const;

  // "<command> <index id>" of each request the search daemon received.
  std::vector<std::string> SearchCommands() const;
  // "<type> <share_name>" of each daemon command ("<type>" alone when it
  // has no share name), and the commands themselves.
  std::vector<std::string> DaemonCommands() const;
  std::vector<Json::Value> DaemonCommandObjects() const;
  // Forgets what was sent and called so far (the set-up's own requests):
  // the New* lists below start again, and the platform's recorded calls
  // and service calls are cleared.
  void ForgetSent();
  // SearchCommands() / DaemonCommands() since the last ForgetSent().
  std::vector<std::string> NewSearchCommands() const;
  std::vector<std::string> NewDaemonCommands() const;
  // How often the platform call `call` was made.
  size_t CallCount(const std::string& call) const;

  FakeServicesPlatform& platform() { return *platform_; }
  const FakeServicesPlatform& platform() const { return *platform_; }
  FakeSearchDaemon& search() { return *search_; }
  FakeIndexDaemon& daemon() { return *daemon_; }
  const TempRoot& root() const { return root_; }

 private:
  TempRoot root_;
  std::unique_ptr<FakeServicesPlatform> platform_;
  std::unique_ptr<ScopedPlatform> scoped_;
  std::unique_ptr<FakeSearchDaemon> search_;
  std::unique_ptr<FakeIndexDaemon> daemon_;
  std::map<std::string, std::string> share_volumes_;
  size_t search_forgotten_ = 0;
  size_t daemon_forgotten_ = 0;
};

}  // namespace vellis::testing
