#include "daemons/fileindexd/indexing_service.h"

#include <syslog.h>

#include <fstream>

#include "common/error.h"
#include "common/json_util.h"
#include "common/root_path.h"
#include "fileindex/elastic/comm.h"
#include "fileindex/elastic/elastic_control.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/status_mgr.h"
#include "sdk/domain_socket.h"
#include "sdk/platform.h"

namespace vellis::fileindexd {
namespace {

constexpr int kStatusQueryTimeoutMs = 2000;

void Log(int priority, const std::string& text) {
  sdk::GetPlatform()->Syslog(priority, "fileindexd: " + text);
}

Json::Value ErrorAnswer(int code, const std::string& msg) {
  Json::Value a(Json::objectValue);
  a["success"] = false;
  a["error"]["code"] = code;
  a["error"]["msg"] = msg;
  return a;
}

// A member the command needs; Error 120 naming it otherwise.
const Json::Value& Member(const Json::Value& data, const char* key, bool (Json::Value::*is)() const,
                          const char* type) {
  static const Json::Value kNull;
  const Json::Value& v = data.isObject() ? data[key] : kNull;
  if (!(v.*is)()) {
    throw Error(kErrBadArgument, std::string("data.") + key + " must be " + type);
  }
  return v;
}

std::string ShareName(const Json::Value& data) {
  std::string share = Member(data, "share_name", &Json::Value::isString, "a string").asString();
  if (share.empty() || share.find('/') != std::string::npos) {
    throw Error(kErrBadArgument, "data.share_name is not a share name: " + share);
  }
  return share;
}

// Lines of a queue file: the events that wait in it.
int64_t CountLines(const std::string& path) {
  std::ifstream in(path, std::ios::binary);
  int64_t lines = 0;
  char buf[65536];
  while (in.read(buf, sizeof(buf)) || in.gcount() > 0) {
    lines += std::count(buf, buf + in.gcount(), '\n');
  }
  return lines;
}

}  // namespace

IndexingService::IndexingService(WorkerOptions options, ShareWorker::Clock clock, bool run_threads)
    : options_(std::move(options)), clock_(std::move(clock)), run_threads_(run_threads) {}

IndexingService::~IndexingService() {
  std::map<std::string, std::unique_ptr<ShareWorker>> workers;
  {
    std::lock_guard<std::mutex> lock(mu_);
    workers.swap(workers_);
  }
  workers.clear();  // each stops and joins
}

int64_t IndexingService::HeldUntilMs() const {
  std::lock_guard<std::mutex> lock(mu_);
  return resume_ms_;
}

ShareWorker* IndexingService::Worker(const std::string& share) {
  std::lock_guard<std::mutex> lock(mu_);
  auto it = workers_.find(share);
  return it == workers_.end() ? nullptr : it->second.get();
}

void IndexingService::Load() {
  try {
    const long long resume_time = fileindex::StatusMgr().GetPauseInfo();
    if (resume_time >= 0) Pause(resume_time);
  } catch (const Error& e) {
    Log(LOG_ERR,
        "status file not read: code=" + std::to_string(e.GetCode()) + ", reason=" + e.what());
  }
  try {
    for (const std::string& share : fileindex::FolderMgr().GetIndexedShares()) EnsureWorker(share);
  } catch (const Error& e) {
    Log(LOG_ERR,
        "folder list not read: code=" + std::to_string(e.GetCode()) + ", reason=" + e.what());
  }
}

void IndexingService::Pause(int64_t resume_time) {
  {
    std::lock_guard<std::mutex> lock(mu_);
    // 0 holds until a resume; a time holds until then, and a time past
    // holds nothing.
    resume_ms_ = resume_time <= 0 ? resume_time : resume_time * 1000;
  }
  WakeAll();
}

void IndexingService::WakeAll() {
  std::lock_guard<std::mutex> lock(mu_);
  for (auto& [share, worker] : workers_) worker->Wake();
}

void IndexingService::EnsureWorker(const std::string& share) {
  std::lock_guard<std::mutex> lock(mu_);
  auto it = workers_.find(share);
  if (it != workers_.end()) {
    it->second->Wake();
    return;
  }
  auto worker = std::make_unique<ShareWorker>(share, options_, *this, clock_);
  if (run_threads_) worker->Start();
  Log(LOG_INFO, "worker started for share " + share);
  workers_.emplace(share, std::move(worker));
}

void IndexingService::DropWorker(const std::string& share) {
  std::unique_ptr<ShareWorker> worker;
  {
    std::lock_guard<std::mutex> lock(mu_);
    auto it = workers_.find(share);
    if (it == workers_.end()) return;
    worker = std::move(it->second);
    workers_.erase(it);
  }
  worker.reset();  // stops after its current batch
  Log(LOG_INFO, "worker stopped for share " + share);
}

Json::Value IndexingService::Status() {
  Json::Value out(Json::objectValue);
  const int64_t held = HeldUntilMs();
  out["paused"] = held == 0 || held > clock_();
  out["resume_time"] = static_cast<Json::Int64>(held <= 0 ? held : held / 1000);
  out["shares"] = Json::Value(Json::objectValue);
  std::vector<std::pair<std::string, WorkerStatus>> statuses;
  {
    std::lock_guard<std::mutex> lock(mu_);
    for (auto& [share, worker] : workers_) statuses.emplace_back(share, worker->status());
  }
  for (const auto& [share, st] : statuses) {
    Json::Value s(Json::objectValue);
    s["state"] = st.state;
    const std::string queue = Worker(share) ? Worker(share)->queue_path() : "";
    s["events_waiting"] = static_cast<Json::Int64>(CountLines(queue) + CountLines(queue + ".tmp"));
    Json::Value stats;
    stats["command"] = "index_stats";
    stats["data"]["id"] = fileindex::elastic::GetFileIndexID(share);
    try {
      Json::Value answer =
          sdk::Exchange(RootPath(kElasticSocketPath), stats, kStatusQueryTimeoutMs);
      s["documents"] = answer["data"]["documents"];
    } catch (const Error&) {
      s["documents"] = Json::Value();  // the search daemon does not answer
    }
    Json::Value& round = s["last_round"];
    round["operations"] = static_cast<Json::UInt64>(st.round.operations);
    round["upserted"] = static_cast<Json::UInt64>(st.round.upserted);
    round["deleted"] = static_cast<Json::UInt64>(st.round.deleted);
    round["failed"] = static_cast<Json::UInt64>(st.round.failed);
    round["unchanged"] = static_cast<Json::UInt64>(st.round.unchanged);
    round["duration_ms"] = static_cast<Json::Int64>(st.round_duration_ms);
    s["rounds"] = static_cast<Json::UInt64>(st.rounds);
    if (st.state == "crawling") {
      s["crawl"]["root"] = st.round.crawling;
      s["crawl"]["crawled"] = static_cast<Json::UInt64>(st.round.crawled);
      s["crawl"]["rate"] = st.crawl_rate;
      // A recrawl knows how many documents there were; a first crawl does not.
      const int64_t known = s["documents"].isInt64() ? s["documents"].asInt64() : 0;
      const int64_t left = known - static_cast<int64_t>(st.round.crawled);
      s["crawl"]["eta_seconds"] = left > 0 && st.crawl_rate > 0
                                      ? Json::Value(static_cast<double>(left) / st.crawl_rate)
                                      : Json::Value();
    }
    s["errors"] = Json::Value(Json::arrayValue);
    for (const std::string& e : st.errors) s["errors"].append(e);
    out["shares"][share] = s;
  }
  return out;
}

Json::Value IndexingService::Run(const std::string& type, const Json::Value& data,
                                 const daemon::Peer& peer) {
  if (type == "status") return Status();
  const bool known = type == "pause" || type == "resume" || type == "notify_setting_changed" ||
                     type == "worker_create" || type == "worker_delete";
  if (!known) throw Error(kErrBadArgument, "unknown command: " + type);
  if (!daemon::IsAdministrator(peer)) {
    Log(LOG_WARNING, "refused " + type + " from uid " + std::to_string(peer.uid));
    throw Error(kErrCredentials, "permission denied: " + type +
                                     " is for root and administrators, not uid " +
                                     std::to_string(peer.uid));
  }
  if (type == "pause") {
    Pause(Member(data, "resume_time", &Json::Value::isInt64, "an integer").asInt64());
  } else if (type == "resume") {
    Pause(-1);
  } else if (type == "notify_setting_changed") {
    const std::string share = ShareName(data);
    Member(data, "is_upsert", &Json::Value::isBool, "a bool");
    if (fileindex::FolderMgr().IsShareIndexed(share)) {
      EnsureWorker(share);
    } else {
      DropWorker(share);
    }
  } else if (type == "worker_create") {
    EnsureWorker(ShareName(data));
  } else {
    DropWorker(ShareName(data));
  }
  return Json::Value();
}

std::string IndexingService::Handle(const std::string& text, const daemon::Peer& peer) {
  Json::Value answer(Json::objectValue);
  try {
    Json::Value command;
    if (!JsonFromString(command, text) || !command.isObject() || !command["type"].isString()) {
      throw Error(kErrBadArgument, "a command is {\"type\": <name>, \"data\": <argument>}");
    }
    Json::Value data = Run(command["type"].asString(), command["data"], peer);
    answer["success"] = true;
    if (!data.isNull()) answer["data"] = std::move(data);
  } catch (const Error& e) {
    answer = ErrorAnswer(e.GetCode(), e.what());
  } catch (const std::exception& e) {
    answer = ErrorAnswer(kErrInternal, e.what());
  }
  return JsonToString(answer);
}

}  // namespace vellis::fileindexd
