// Taking a share out of indexing, bringing it back, and forgetting it.
//
// Pause and resume are mirror images, so that no component ever works on a
// share whose downstream component is paused: pause goes daemon worker,
// monitor configuration, index; resume goes index, monitor configuration,
// daemon worker. Both save the folder list last.
#include <memory>
#include <string>

#include "common/log.h"
#include "fileindex/elastic/communication.h"
#include "fileindex/elastic/elastic_control.h"
#include "fileindex/index_mgr.h"

namespace vellis::fileindex {
namespace {

// Sets the paused flag of the folders whose share is exactly `share_name`.
void SetSharePaused(const FolderMgr& folder_mgr, const std::string& share_name, bool paused) {
  for (const std::shared_ptr<Folder>& folder : folder_mgr.GetFolders()) {
    if (folder->GetShare() == share_name) folder->SetPaused(paused);
  }
}

}  // namespace

void SharePause(const std::string& share_name) {
  Json::Value req(Json::objectValue);
  FolderMgr folder_mgr;
  VELLIS_THROW_IF(share_name.empty(), kErrBadArgument, "Missing share name");
  if (!folder_mgr.IsShareIndexed(share_name)) return;

  req["share_name"] = share_name;
  SendCommandToDaemon(kCmdWorkerDelete, req);
  DeleteQORUNotifydCfg(share_name);
  elastic::ShareIndexPause(share_name);
  SetSharePaused(folder_mgr, share_name, true);
  folder_mgr.Save();
}

void ShareResume(const std::string& share_name) {
  Json::Value req(Json::objectValue);
  FolderMgr folder_mgr;
  VELLIS_THROW_IF(share_name.empty(), kErrBadArgument, "Missing share name");
  if (!folder_mgr.IsShareIndexed(share_name)) return;

  elastic::ShareIndexResume(share_name);
  UpsertQORUNotifydCfg(share_name, folder_mgr);
  req["share_name"] = share_name;
  SendCommandToDaemon(kCmdWorkerCreate, req);
  SetSharePaused(folder_mgr, share_name, false);
  folder_mgr.Save();
}

void ShareClearPaused(const std::string& share_name, const std::string& share_path) {
  FolderMgr folder_mgr;
  VELLIS_THROW_IF(share_name.empty(), kErrBadArgument, "Missing share name");
  VELLIS_THROW_IF(share_path.empty(), kErrBadArgument, "Missing share path");

  CleanShareIndexData(share_name, share_path);
  elastic::ShareIndexDelete(share_name);
  folder_mgr.DeleteByShare(share_name);
  folder_mgr.Save();
  if (folder_mgr.GetFolders().empty()) SetupRelatedServices(false);
}

}  // namespace vellis::fileindex
