// The base fixtures of the folder, queue and management operation tests: a
// temporary root with scripted shares, their data in
// "<volume>/@fileindex/<share>"; for the management operations also fake
// search and indexing daemons, and readers of what changes.
#pragma once

#include <gtest/gtest.h>
#include <json/json.h>

#include <fstream>
#include <string>
#include <tuple>
#include <vector>

#include "common/json_util.h"
#include "common/root_path.h"
#include "fileindex/elastic/comm.h"
#include "fileindex/elastic/communication.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/index_mgr.h"
#include "fileindex/status_mgr.h"
#include "sdk/linux/monitor_queues.h"
#include "sdk/share.h"
#include "tests/support/fake_index_daemon.h"
#include "tests/support/fake_search_daemon.h"
#include "tests/support/fake_services_platform.h"
#include "tests/support/temp_root.h"
#include "tests/support/thrown.h"

namespace vellis::testing {

using Strings = std::vector<std::string>;

class FolderEnvTest : public ::testing::Test {
 protected:
  // Registers share `name` at "<root>/<volume>/<name>" and creates its
  // folder, its data folder and `dirs` below it; returns its full path.
  std::string AddShare(const std::string& name, const Strings& dirs = {},
                       const std::string& volume = "volume1") {
    sdk::ShareInfo share;
    share.szName = name;
    share.szPath = Volume(volume) + "/" + name;
    MakeDirs(Volume(volume) + "/@fileindex/" + name);
    MakeDirs(share.szPath);
    for (const std::string& dir : dirs) MakeDirs(share.szPath + dir);
    platform_.AddShare(share);
    return share.szPath;
  }
  std::string Volume(const std::string& v = "volume1") const { return root_.Path("/" + v); }
  std::string QueuePath(const std::string& name) const {
    return sdk::SDKShare(name).GetQueuePath();
  }
  std::string FoldersPath() const { return RootPath(fileindex::kFileIndexFoldersCfgPath); }
  std::string StatusPath() const { return RootPath(fileindex::kFileIndexStatusCfgPath); }

  TempRoot root_;
  FakeServicesPlatform platform_;
  ScopedPlatform scoped_{&platform_};
};

class IndexMgrTest : public FolderEnvTest {
 public:
  // A folder as the folder record reads it, and lists of them.
  static Json::Value FolderJson(const std::string& path, bool document = true, bool audio = true,
                                bool video = true, bool photo = true) {
    Json::Value f(Json::objectValue);
    f["path"] = path;
    f["name"] = path.substr(path.rfind('/') + 1);
    std::tie(f["document"], f["audio"], f["video"], f["photo"]) =
        std::make_tuple(document, audio, video, photo);
    return f;
  }
  static Json::Value List(const std::vector<Json::Value>& folders) {
    Json::Value list(Json::arrayValue);
    for (const Json::Value& f : folders) list.append(f);
    return list;
  }
  static Json::Value List(const Strings& paths) {
    std::vector<Json::Value> folders;
    for (const std::string& p : paths) folders.push_back(FolderJson(p));
    return List(folders);
  }

 protected:
  // The events queued for share `name`: "<event> <path>[ <- <path_old>][
  // <data>]", the paths without "<root>/<volume>".
  Strings Events(const std::string& name) const {
    Strings events;
    std::ifstream in(QueuePath(name));
    auto cut = [&](const Json::Value& p) {
      const std::string s = p.asString();
      return s.rfind(root_.path(), 0) == 0 ? s.substr(s.find('/', root_.path().size() + 1)) : s;
    };
    for (std::string line; std::getline(in, line);) {
      Json::Value e;
      EXPECT_TRUE(JsonFromString(e, line)) << line;
      events.push_back(e["event"].asString() + " " + cut(e["path"]) +
                       (e["path_old"].asString().empty() ? "" : " <- " + cut(e["path_old"])) +
                       (e["data"].isNull() ? "" : " " + JsonToString(e["data"])));
    }
    return events;
  }
  // Adds `paths`, then forgets what that sent (ForgetSent).
  void Given(const Strings& paths) {
    fileindex::FolderAdd(List(paths), false);
    ForgetSent();
  }

  // The folders file (null when there is none) and its paths.
  Json::Value FoldersFile() const {
    Json::Value v;
    return JsonFromFile(v, FoldersPath()) ? v : Json::Value();
  }
  Strings FolderPaths() const {
    Strings paths;
    for (const Json::Value& f : FoldersFile()) paths.push_back(f["path"].asString());
    return paths;
  }
  // FoldersFileSaved() tells whether the list was saved since MarkFoldersFile().
  void MarkFoldersFile() const { WriteFile(FoldersPath(), " " + JsonToString(FoldersFile())); }
  bool FoldersFileSaved() const { return ReadFile(FoldersPath()).rfind(" ", 0) != 0; }
  // The monitor's queues (null when never written); the folders it watches.
  Json::Value MonitorQueues() const {
    Json::Value v;
    return JsonFromFile(v, sdk::MonitorQueueFile("fileindex")) ? v["queues"] : Json::Value();
  }
  Json::Value MonitorPaths(const std::string& name) const {
    const Json::Value queues = MonitorQueues();
    Json::Value paths(Json::arrayValue);
    for (const Json::Value& c : queues[QueuePath(name)]["config"]) paths.append(c["path"]);
    return paths;
  }

  // Since the last ForgetSent(): "<type> <share_name>" per daemon command,
  // then "<command> <index id>" per search request, then the monitor calls.
  Strings Sent() const {
    Strings out;
    const std::vector<Json::Value> commands = daemon_.Commands(), requests = search_.Requests();
    for (size_t i = daemon_forgotten_; i < commands.size(); ++i) {
      out.push_back(commands[i]["type"].asString() + " " +
                    commands[i]["data"]["share_name"].asString());
    }
    for (size_t i = search_forgotten_; i < requests.size(); ++i) {
      out.push_back(requests[i]["command"].asString() + " " + requests[i]["data"]["id"].asString());
    }
    for (const std::string& call : platform_.Calls()) {
      if (call.rfind("MonitorQueue", 0) == 0) out.push_back(call);
    }
    return out;
  }
  void ForgetSent() {
    search_forgotten_ = search_.Requests().size();
    daemon_forgotten_ = daemon_.Commands().size();
    platform_.ClearCalls();
    platform_.ClearServiceCalls();
  }
  size_t LogCount(const std::string& text) const { return platform_.LogsContaining(text).size(); }

  FakeSearchDaemon search_{RootPath(kElasticSocketPath)};
  FakeIndexDaemon daemon_{RootPath(fileindex::kFileIndexDaemonSocketPath)};

 private:
  size_t search_forgotten_ = 0;
  size_t daemon_forgotten_ = 0;
};

}  // namespace vellis::testing
