// Following a share that moved to another volume.
#include <memory>
#include <string>

#include "common/log.h"
#include "fileindex/util.h"
#include "fileindex/elastic/communication.h"
#include "fileindex/elastic/elastic_control.h"
#include "fileindex/index_mgr.h"
#include "fileindex/optree.h"
#include "sdk/monitor_queue.h"
#include "sdk/platform.h"
#include "sdk/share.h"

namespace vellis::fileindex {

void ShareMigrate(const std::string& share_name, const std::string& old_share_path) {
  FolderMgr folder_mgr;
  VELLIS_THROW_IF(share_name.empty(), kErrBadArgument, "Missing share name");
  VELLIS_THROW_IF(old_share_path.empty(), kErrBadArgument, "Missing share path");
  if (!folder_mgr.IsShareIndexed(share_name)) return;

  sdk::SDKShare share(share_name);
  char old_queue[4096];
  VELLIS_THROW_IF(
      0 > sdk::GetPlatform()->FILEIDXQueuePathCompose(old_share_path, old_queue, sizeof(old_queue)),
      kErrInternal, "FILEIDXQueuePathCompose failed, share_path=" + old_share_path);
  const std::string db_path = share.GetDBPath();

  // The worker stops before anything it uses moves, and starts again once
  // the index and the monitor point at the new volume.
  Json::Value req(Json::objectValue);
  req["share_name"] = share_name;
  SendCommandToDaemon(kCmdWorkerDelete, req);
  VELLIS_THROW_IF(
      !sdk::MonitorQueue::Delete(old_queue, kAppName, sdk::MONITOR_QUEUE_TYPE_APPLICATION),
      kErrInternal, "MonitorQueue::Delete failed, share=" + share_name);
  elastic::ShareIndexMigrate(share_name, db_path);
  UpsertQORUNotifydCfg(share_name, folder_mgr);
  SendCommandToDaemon(kCmdWorkerCreate, req);

  // The documents still carry the old volume in their paths: the rename of
  // the share's top folder moves them, and a reindex of each folder makes
  // up for the events left behind in the old queue.
  AddCustomEvent(kEventRename, share.GetPath(), old_share_path, Json::Value());
  for (const std::shared_ptr<Folder>& folder : folder_mgr.GetFolders()) {
    if (folder->GetShare() != share_name) continue;
    AddCustomEvent(kEventReindex, folder->GetFullPath(), "", Json::Value());
  }
}

}  // namespace vellis::fileindex
