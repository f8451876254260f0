#include "tests/support/index_mgr_env.h"

#include <fstream>

#include "common/json_util.h"
#include "common/root_path.h"
#include "fileindex/elastic/comm.h"
#include "fileindex/elastic/communication.h"
#include "fileindex/index_mgr.h"
#include "sdk/linux/monitor_queues.h"
#include "sdk/share.h"

namespace vellis::testing {

IndexMgrTest::IndexMgrTest()
    : search_(RootPath(kElasticSocketPath)),
      daemon_(RootPath(fileindex::kFileIndexDaemonSocketPath)) {}

std::string IndexMgrTest::AddShare(const std::string& name, const Strings& dirs,
                                   const std::string& volume) {
  sdk::ShareInfo share;
  share.szName = name;
  share.szPath = Volume(volume) + "/" + name;
  MakeDirs(Volume(volume) + "/@fileindex/" + name);
  MakeDirs(share.szPath);
  for (const std::string& dir : dirs) MakeDirs(share.szPath + dir);
  platform_.AddShare(share);
  return share.szPath;
}

std::string IndexMgrTest::QueuePath(const std::string& name) const {
  return sdk::SDKShare(name).GetQueuePath();
}

Strings IndexMgrTest::Events(const std::string& name) const {
  Strings events;
  std::ifstream in(QueuePath(name));
  for (std::string line; std::getline(in, line);) {
    Json::Value e;
    EXPECT_TRUE(JsonFromString(e, line)) << line;
    auto cut = [&](const Json::Value& p) {
      const std::string s = p.asString();
      return s.rfind(root_.path(), 0) == 0 ? s.substr(s.find('/', root_.path().size() + 1)) : s;
    };
    events.push_back(e["event"].asString() + " " + cut(e["path"]) +
                     (e["path_old"].asString().empty() ? "" : " <- " + cut(e["path_old"])) +
                     (e["data"].isNull() ? "" : " " + JsonToString(e["data"])));
  }
  return events;
}

Json::Value IndexMgrTest::FolderJson(const std::string& path, bool document, bool audio, bool video,
                                     bool photo) {
  Json::Value f(Json::objectValue);
  f["path"] = path;
  f["name"] = path.substr(path.rfind('/') + 1);
  const char* keys[] = {"document", "audio", "video", "photo"};
  const bool flags[] = {document, audio, video, photo};
  for (int i = 0; i < 4; ++i) f[keys[i]] = flags[i];
  return f;
}

Json::Value IndexMgrTest::List(const std::vector<Json::Value>& folders) {
  Json::Value list(Json::arrayValue);
  for (const Json::Value& f : folders) list.append(f);
  return list;
}

Json::Value IndexMgrTest::List(const Strings& paths) {
  Json::Value list(Json::arrayValue);
  for (const std::string& p : paths) list.append(FolderJson(p));
  return list;
}

void IndexMgrTest::Given(const Strings& paths) {
  fileindex::FolderAdd(List(paths), false);
  ForgetSent();
}

Json::Value IndexMgrTest::FoldersFile() const {
  Json::Value v;
  return JsonFromFile(v, RootPath(fileindex::kFileIndexFoldersCfgPath)) ? v : Json::Value();
}

Strings IndexMgrTest::FolderPaths() const {
  Strings paths;
  for (const Json::Value& f : FoldersFile()) paths.push_back(f["path"].asString());
  return paths;
}

void IndexMgrTest::MarkFoldersFile() const {
  WriteFile(RootPath(fileindex::kFileIndexFoldersCfgPath), " " + JsonToString(FoldersFile()));
}

bool IndexMgrTest::FoldersFileSaved() const {
  return ReadFile(RootPath(fileindex::kFileIndexFoldersCfgPath)).rfind(" ", 0) != 0;
}

Json::Value IndexMgrTest::MonitorQueues() const {
  Json::Value v;
  return JsonFromFile(v, sdk::MonitorQueueFile("fileindex")) ? v["queues"] : Json::Value();
}

Json::Value IndexMgrTest::MonitorPaths(const std::string& name) const {
  const Json::Value queues = MonitorQueues();
  Json::Value paths(Json::arrayValue);
  for (const Json::Value& c : queues[QueuePath(name)]["config"]) paths.append(c["path"]);
  return paths;
}

Strings IndexMgrTest::Sent() const {
  Strings out;
  const std::vector<Json::Value> commands = daemon_.Commands();
  for (size_t i = daemon_forgotten_; i < commands.size(); ++i) {
    out.push_back(commands[i]["type"].asString() + " " +
                  commands[i]["data"]["share_name"].asString());
  }
  const std::vector<Json::Value> requests = search_.Requests();
  for (size_t i = search_forgotten_; i < requests.size(); ++i) {
    out.push_back(requests[i]["command"].asString() + " " + requests[i]["data"]["id"].asString());
  }
  for (const std::string& call : platform_.Calls()) {
    if (call.rfind("MonitorQueue", 0) == 0) out.push_back(call);
  }
  return out;
}

void IndexMgrTest::ForgetSent() {
  search_forgotten_ = search_.Requests().size();
  daemon_forgotten_ = daemon_.Commands().size();
  platform_.ClearCalls();
  platform_.ClearServiceCalls();
}

std::vector<ServiceCall> ServicesStoppedCalls() {
  return {{"QORUSMBSetSpotlight", "0"},
          {"QLIBServiceRestart", "samba"},
          {"QLIBServiceStop", "qorucontentextractd"},
          {"QLIBServicectlStop", "pkg-Vellis-fileindexd"}};
}

}  // namespace vellis::testing
