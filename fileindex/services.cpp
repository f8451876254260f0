// The outside things that indexing needs, kept in line with the folder list:
// the related services, the file-change monitor's queue configuration and a
// share's local index data.
#include <cerrno>
#include <string>
#include <vector>

#include "common/log.h"
#include "fileindex/index_mgr.h"
#include "fileindex/status_mgr.h"
#include "sdk/monitor_queue.h"
#include "sdk/platform.h"
#include "sdk/share.h"

namespace vellis::fileindex {
namespace {

using sdk::MONITOR_QUEUE_TYPE_APPLICATION;
using sdk::MonitorQueue;

constexpr char kRemoveProgram[] = "/bin/rm";
constexpr size_t kPathBufferSize = 4096;

// The composers in the shape in which the platform exports them.
int FILEIDXQueuePathCompose(const char* share_path, char* buf, size_t size) {
  return sdk::GetPlatform()->FILEIDXQueuePathCompose(share_path, buf, size);
}
int FILEIDXDBPathCompose(const char* share_path, char* buf, size_t size) {
  return sdk::GetPlatform()->FILEIDXDBPathCompose(share_path, buf, size);
}

void RemoveTree(const std::string& path) {
  // Whatever rm answers, the next steps go on: what is left is only disk
  // space, and the share is being forgotten anyway.
  sdk::GetPlatform()->QLIBCExec(kRemoveProgram, {"-rf", path});
}

// The platform's error code and the source site it recorded.
void LogSmbFailure(const char* call) {
  sdk::Platform* p = sdk::GetPlatform();
  VELLIS_LOG_ERRNO("%s failed: err=[0x%04X %s:%d]", call, static_cast<unsigned>(p->QLIBCErrGet()),
                   p->QLIBCErrorGetFile().c_str(), p->QLIBCErrorGetLine());
}

// Switches the file-sharing search support to `enable` when it is not, and
// restarts the file-sharing service only when the switch took.
void SetupSpotlight(bool enable) {
  sdk::Platform* p = sdk::GetPlatform();
  if ((p->QORUSMBIsEnableSpotlight() > 0) == enable) return;
  if (0 > p->QORUSMBSetSpotlight(enable ? 1 : 0)) {
    LogSmbFailure("QORUSMBSetSpotlight");
    return;
  }
  if (0 > p->QLIBServiceRestart(kSambaService)) LogSmbFailure("QLIBServiceRestart");
}

void LogFailed(const char* condition, const char* file, int line, const char* func) {
  internal::LogWithErrno(LOG_ERR, file, line, func, std::string("Failed [") + condition + "]");
}

}  // namespace

void SetupRelatedServices(bool enable) {
  sdk::Platform* p = sdk::GetPlatform();
  SetupSpotlight(enable);
  if (enable) {
    if (0 > p->QLIBServiceStart(kContentExtractService, true)) {
      LogFailed("0 > QLIBServiceStart(\"qorucontentextractd\", TRUE)", __FILE__, __LINE__,
                __func__);
    }
    if (0 > p->QLIBServicectlStart(kFileIndexService, sdk::kServicectlUpstart)) {
      LogFailed("0 > QLIBServicectlStart(\"pkg-Vellis-fileindexd\", QLIB_SERVICECTL_UPSTART)",
                __FILE__, __LINE__, __func__);
    }
  } else {
    if (0 > p->QLIBServiceStop(kContentExtractService, false)) {
      LogFailed("0 > QLIBServiceStop(\"qorucontentextractd\", FALSE)", __FILE__, __LINE__,
                __func__);
    }
    if (0 > p->QLIBServicectlStop(kFileIndexService, sdk::kServicectlUpstart)) {
      LogFailed("0 > QLIBServicectlStop(\"pkg-Vellis-fileindexd\", QLIB_SERVICECTL_UPSTART)",
                __FILE__, __LINE__, __func__);
    }
  }
}

void PrepareServices() {
  bool has_folders = false;
  try {
    has_folders = !FolderMgr().GetFolders().empty();
  } catch (const Error& e) {
    // Start-up must go on: with no readable list there is nothing to index.
    VELLIS_LOG_ERRNO("Cannot load folder list, code=%d, reason=%s", static_cast<int>(e.GetCode()),
                     e.what());
  }
  SetupRelatedServices(has_folders);
}

void UpsertQORUNotifydCfg(const std::string& share, const FolderMgr& folder_mgr) {
  sdk::SDKShare sdk_share(share);
  Json::Value config(Json::arrayValue);
  for (const std::shared_ptr<Folder>& folder : folder_mgr.GetFolders()) {
    if (folder->GetShare() != share) continue;
    Json::Value item(Json::objectValue);
    item["path"] = folder->GetFullPath();
    item["mask"] = kMonitorMask;
    item["ignore"] = Json::Value(Json::arrayValue);
    item["ignore"].append(kMonitorIgnoredName);
    config.append(item);
  }
  Json::Value queue(Json::objectValue);
  queue["queue"] = sdk_share.GetQueuePath();
  queue["config"] = config;
  MonitorQueue monitor_queue(queue);
  VELLIS_THROW_IF(!MonitorQueue::Upsert(monitor_queue, kAppName, MONITOR_QUEUE_TYPE_APPLICATION),
                  kErrInternal, "MonitorQueue::Upsert failed, share=" + share);
}

void DeleteQORUNotifydCfg(const std::string& share_name) {
  sdk::SDKShare share(share_name);
  VELLIS_THROW_IF(
      !MonitorQueue::Delete(share.GetQueuePath(), kAppName, MONITOR_QUEUE_TYPE_APPLICATION),
      kErrInternal, "MonitorQueue::Delete failed, share=" + share_name);
}

void CleanShareIndexData(const std::string& share_name, const std::string& share_path) {
  char path[kPathBufferSize];
  VELLIS_THROW_IF(0 > FILEIDXQueuePathCompose(share_path.c_str(), path, sizeof(path)), kErrInternal,
                  "FILEIDXQueuePathCompose failed, share_path=" + share_path);
  RemoveTree(path);
  RemoveTree(std::string(path) + ".tmp");
  VELLIS_THROW_IF(0 > FILEIDXDBPathCompose(share_path.c_str(), path, sizeof(path)), kErrInternal,
                  "FILEIDXDBPathCompose failed, share_path=" + share_path);
  RemoveTree(path);
  StatusMgr().ClearShareStatus(share_name);
}

}  // namespace vellis::fileindex
