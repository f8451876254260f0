#include "tools/vellis/daemon_probe.h"

#include <signal.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <climits>
#include <fstream>
#include <thread>

#include "common/error.h"
#include "common/root_path.h"
#include "fileindex/elastic/comm.h"
#include "fileindex/elastic/communication.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/index_mgr.h"
#include "sdk/domain_socket.h"
#include "sdk/linux/services.h"

namespace vellis::cli {
namespace {

// A probe is a status question: an answer within this long counts.
constexpr int kProbeTimeoutMs = 2000;

struct Known {
  const char* program;
  const char* service;
  bool needs_folders;
};

constexpr Known kDaemons[] = {
    {"vellis-searchd", sdk::kSearchService, false},
    {"vellis-monitord", sdk::kMonitorService, true},
    {"vellis-extractd", fileindex::kContentExtractService, true},
    {"vellis-fileindexd", fileindex::kFileIndexService, true},
};

// The pid in the daemon's own pid file when that process is alive.
int LivePid(const std::string& program) {
  std::ifstream in(RootPath("/var/run/" + program + ".pid"));
  long long pid = 0;
  if (!(in >> pid) || pid <= 0 || pid > INT_MAX) return 0;
  if (kill(static_cast<pid_t>(pid), 0) != 0 && errno != EPERM) return 0;
  return static_cast<int>(pid);
}

// The answer's data, or null when the daemon has no socket we know or
// does not answer.
bool Ask(const std::string& program, Json::Value* data) {
  Json::Value request(Json::objectValue);
  std::string socket;
  if (program == "vellis-searchd") {
    socket = RootPath(kElasticSocketPath);
    request["command"] = "index_list";
    request["data"] = Json::Value(Json::objectValue);
  } else if (program == "vellis-fileindexd") {
    socket = RootPath(fileindex::kFileIndexDaemonSocketPath);
    request["type"] = "status";
    request["data"] = Json::Value(Json::objectValue);
  } else {
    return false;
  }
  try {
    Json::Value answer = sdk::Exchange(socket, request, kProbeTimeoutMs);
    if (!answer["success"].asBool()) return false;
    *data = answer["data"];
    return true;
  } catch (const Error&) {
    return false;
  }
}

// Daemons without a socket of ours answer by running.
bool NoSocket(const std::string& program) {
  return program == "vellis-extractd" || program == "vellis-monitord";
}

bool FoldersIndexed() {
  try {
    return !fileindex::FolderMgr().GetFolders().empty();
  } catch (const Error&) {
    return false;  // no readable list: nothing to index
  }
}

}  // namespace

std::vector<DaemonState> ProbeDaemons() {
  const bool folders = FoldersIndexed();
  std::vector<DaemonState> out;
  for (const Known& k : kDaemons) {
    DaemonState d;
    d.program = k.program;
    d.service = k.service;
    const std::string path = sdk::ServiceProgramPath(k.program);
    d.installed = !path.empty() && access(path.c_str(), X_OK) == 0;
    d.should_run = d.installed && (!k.needs_folders || folders);
    d.pid = LivePid(k.program);
    Json::Value data;
    // A daemon without a socket of its own answers by running.
    d.answers = NoSocket(d.program) ? d.pid > 0 : Ask(k.program, &data);
    if (d.answers && d.program == "vellis-fileindexd") d.status = data;
    out.push_back(d);
  }
  return out;
}

bool WaitUntilAnswers(const std::string& program, int timeout_ms) {
  const auto deadline = std::chrono::steady_clock::now() + std::chrono::milliseconds(timeout_ms);
  for (;;) {
    Json::Value data;
    if (NoSocket(program) ? LivePid(program) > 0 : Ask(program, &data)) return true;
    if (std::chrono::steady_clock::now() >= deadline) return false;
    std::this_thread::sleep_for(std::chrono::milliseconds(50));
  }
}

}  // namespace vellis::cli
