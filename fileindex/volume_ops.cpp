// Pausing, resuming and forgetting every indexed share of a volume.
//
// Unlike the per-share operations, these save the folder list before the
// search daemon, the indexing daemon and the monitor are told, and resume
// recreates the daemon's worker before the monitor configuration is written
// again.
#include <memory>
#include <set>
#include <string>

#include "common/log.h"
#include "fileindex/elastic/communication.h"
#include "fileindex/elastic/elastic_control.h"
#include "fileindex/index_mgr.h"
#include "fileindex/status_mgr.h"
#include "fileindex/util.h"

namespace vellis::fileindex {
namespace {

// By whole components: /volume1 does not hold /volume10/share. A folder
// whose share is gone lies on no volume; it must not stop the others.
bool IsOnVolume(const Folder& folder, const std::string& mount_point) {
  try {
    return StringStartWith(folder.GetFullPath() + "/", mount_point + "/");
  } catch (const Error& e) {
    VELLIS_LOG_ERRNO("Skip folder %s, code=%d, reason=%s", folder.GetPath().c_str(),
                     static_cast<int>(e.GetCode()), e.what());
    return false;
  }
}

}  // namespace

void VolumePause(const std::string& mount_point) {
  VELLIS_THROW_IF(mount_point.empty(), kErrBadArgument, "Missing mount point");
  FolderMgr folder_mgr;
  std::set<std::string> shares;
  Json::Value req(Json::objectValue);
  for (const std::shared_ptr<Folder>& folder : folder_mgr.GetFolders()) {
    if (!IsOnVolume(*folder, mount_point)) continue;
    folder->SetPaused(true);
    folder->SetVolumeToBeClean(mount_point);
    shares.insert(folder->GetShare());
  }
  folder_mgr.Save();
  for (const std::string& share : shares) {
    req["share_name"] = share;
    SendCommandToDaemon(kCmdWorkerDelete, req);
    DeleteQORUNotifydCfg(share);
    elastic::ShareIndexPause(share);
  }
}

void VolumeResume(const std::string& mount_point) {
  VELLIS_THROW_IF(mount_point.empty(), kErrBadArgument, "Missing mount point");
  FolderMgr folder_mgr;
  std::set<std::string> shares;
  Json::Value req(Json::objectValue);
  for (const std::shared_ptr<Folder>& folder : folder_mgr.GetFolders()) {
    if (!folder->IsPaused() || !IsOnVolume(*folder, mount_point)) continue;
    folder->SetPaused(false);
    shares.insert(folder->GetShare());
  }
  folder_mgr.Save();
  for (const std::string& share : shares) {
    elastic::ShareIndexResume(share);
    req["share_name"] = share;
    SendCommandToDaemon(kCmdWorkerCreate, req);
    UpsertQORUNotifydCfg(share, folder_mgr);
  }
}

void VolumeClearPaused(const std::string& mount_point) {
  VELLIS_THROW_IF(mount_point.empty(), kErrBadArgument, "Missing mount point");
  FolderMgr folder_mgr;
  StatusMgr status_mgr;
  std::set<std::string> shares;
  for (const std::shared_ptr<Folder>& folder : folder_mgr.GetFolders()) {
    // The volume the pause recorded, byte for byte; where the folder lies
    // now does not matter (the volume may be gone).
    if (folder->IsPaused() && folder->GetVolumeToBeClean() == mount_point) {
      shares.insert(folder->GetShare());
    }
  }
  for (const std::string& share : shares) {
    VELLIS_LOG_ERR("Remove share %s from folder mgr", share.c_str());
    status_mgr.ClearShareStatus(share);
    folder_mgr.DeleteByShare(share);
  }
  folder_mgr.Save();
  if (folder_mgr.GetFolders().empty()) SetupRelatedServices(false);
}

}  // namespace vellis::fileindex
