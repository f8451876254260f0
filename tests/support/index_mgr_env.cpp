#include "tests/support/index_mgr_env.h"

#include <sys/stat.h>

#include <fstream>
#include <sstream>

#include "common/json_util.h"
#include "common/root_path.h"
#include "fileindex/elastic/comm.h"
#include "fileindex/elastic/communication.h"
#include "fileindex/folder_mgr.h"
#include "sdk/linux/monitor_queues.h"

namespace vellis::testing {

IndexMgrEnv::IndexMgrEnv()
    : platform_(std::make_unique<FakeServicesPlatform>()),
      scoped_(std::make_unique<ScopedPlatform>(platform_.get())),
      search_(std::make_unique<FakeSearchDaemon>(RootPath(kElasticSocketPath))),
      daemon_(std::make_unique<FakeIndexDaemon>(RootPath(fileindex::kFileIndexDaemonSocketPath))) {}

IndexMgrEnv::~IndexMgrEnv() {
  daemon_.reset();
  search_.reset();
  scoped_.reset();
}

std::string IndexMgrEnv::AddShare(const std::string& name, const std::string& volume) {
  sdk::ShareInfo share;
  share.szName = name;
  share.szPath = Volume(volume) + "/" + name;
  MakeDirs(share.szPath);
  MakeDirs(Volume(volume) + "/@fileindex/" + name);
  platform_->AddShare(share);
  share_volumes_[name] = volume;
  return share.szPath;
}

std::string IndexMgrEnv::Volume(const std::string& volume) const {
  return root_.Path("/" + volume);
}

std::string IndexMgrEnv::QueuePath(const std::string& name) const {
  auto it = share_volumes_.find(name);
  std::string volume = it == share_volumes_.end() ? "volume1" : it->second;
  return Volume(volume) + "/@fileindex/" + name + "/queue";
}

std::vector<Json::Value> IndexMgrEnv::QueueEvents(const std::string& name) const {
  std::vector<Json::Value> events;
  std::ifstream in(QueuePath(name));
  for (std::string line; std::getline(in, line);) {
    Json::Value v;
    if (!JsonFromString(v, line)) v = Json::Value("unparsable: " + line);
    events.push_back(v);
  }
  return events;
}

Json::Value IndexMgrEnv::FolderJson(const std::string& path, bool document, bool audio, bool video,
                                    bool photo) {
  Json::Value f(Json::objectValue);
  f["path"] = path;
  f["name"] = path.substr(path.rfind('/') + 1);
  f["document"] = document;
  f["audio"] = audio;
  f["video"] = video;
  f["photo"] = photo;
  return f;
}

Json::Value IndexMgrEnv::FoldersFile() const {
  Json::Value v;
  if (!JsonFromFile(v, RootPath(fileindex::kFileIndexFoldersCfgPath))) {
    return Json::Value();
  }
  return v;
}

std::vector<std::string> IndexMgrEnv::FolderPaths() const {
  std::vector<std::string> paths;
  for (const Json::Value& f : FoldersFile()) paths.push_back(f["path"].asString());
  return paths;
}

void IndexMgrEnv::MarkFoldersFile() const {
  WriteFile(RootPath(fileindex::kFileIndexFoldersCfgPath),
            " " + JsonToString(FoldersFile()) + "\n");
}

bool IndexMgrEnv::FoldersFileSaved() const {
  std::string text = ReadFile(RootPath(fileindex::kFileIndexFoldersCfgPath));
  return text.empty() || text[0] != ' ';
}

Json::Value IndexMgrEnv::MonitorQueues() const {
  Json::Value v;
  if (!JsonFromFile(v, sdk::MonitorQueueFile("fileindex"))) return Json::Value();
  return v["queues"];
}

std::vector<std::string> IndexMgrEnv::SearchCommands() const {
  std::vector<std::string> out;
  for (const Json::Value& r : search_->Requests()) {
    out.push_back(r["command"].asString() + " " + r["data"]["id"].asString());
  }
  return out;
}

std::vector<std::string> IndexMgrEnv::DaemonCommands() const {
  std::vector<std::string> out;
  for (const Json::Value& c : daemon_->Commands()) {
    std::string text = c["type"].asString();
    if (c["data"].isObject() && c["data"].isMember("share_name")) {
      text += " " + c["data"]["share_name"].asString();
    }
    out.push_back(text);
  }
  return out;
}

std::vector<Json::Value> IndexMgrEnv::DaemonCommandObjects() const { return daemon_->Commands(); }

void IndexMgrEnv::ForgetSent() {
  search_forgotten_ = SearchCommands().size();
  daemon_forgotten_ = DaemonCommands().size();
  platform_->ClearCalls();
  platform_->ClearServiceCalls();
}

std::vector<std::string> IndexMgrEnv::NewSearchCommands() const {
  std::vector<std::string> all = SearchCommands();
  return {all.begin() + static_cast<long>(search_forgotten_), all.end()};
}

std::vector<std::string> IndexMgrEnv::NewDaemonCommands() const {
  std::vector<std::string> all = DaemonCommands();
  return {all.begin() + static_cast<long>(daemon_forgotten_), all.end()};
}

size_t IndexMgrEnv::CallCount(const std::string& call) const {
  size_t n = 0;
  for (const std::string& c : platform_->Calls()) n += c == call;
  return n;
}

std::vector<FakeServicesPlatform::ServiceCall> ServicesStoppedCalls() {
  return {{"QORUSMBSetSpotlight", "0"},
          {"QLIBServiceRestart", "samba"},
          {"QLIBServiceStop", "qorucontentextractd"},
          {"QLIBServicectlStop", "pkg-Vellis-fileindexd"}};
}

}  // namespace vellis::testing
