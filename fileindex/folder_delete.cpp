// Removing an indexed folder.
#include <memory>
#include <string>

#include "common/lock_file.h"
#include "common/log.h"
#include "common/root_path.h"
#include "fileindex/util.h"
#include "fileindex/elastic/elastic_control.h"
#include "fileindex/index_mgr.h"
#include "fileindex/optree.h"
#include "fileindex/status_mgr.h"

namespace vellis::fileindex {

void FolderDelete(const std::string& path) {
  LockFile lock(RootPath(kFolderCfgLockPath), true);
  FolderMgr folder_mgr;
  VELLIS_THROW_IF(path.empty(), kErrBadArgument, "Missing path");
  VELLIS_THROW_IF(!folder_mgr.HasFolder(path), kErrFolderNotFound, path);

  std::shared_ptr<Folder> folder;
  folder_mgr.Get(folder, path);
  const std::string share = folder->GetShare();
  const std::string full_path = folder->GetFullPath();
  std::shared_ptr<Folder> changed;
  folder_mgr.Delete(changed, path);
  const bool last_of_share = !folder_mgr.IsShareIndexed(share);

  // The monitor changes before the list is saved: should it fail, the
  // folder is still listed and deleting it again repeats every step.
  if (last_of_share) {
    DeleteQORUNotifydCfg(share);
  } else {
    UpsertQORUNotifydCfg(share, folder_mgr);
  }
  folder_mgr.Save();
  // The daemon lets go of the share before its index goes away.
  NotifyDaemonSettingChanged(share, false);

  if (last_of_share) {
    // Nothing would ever read an event queued now: the share has no worker
    // and no index any more.
    elastic::ShareIndexDelete(share);
    StatusMgr().ClearShareStatus(share);
    return;
  }
  AddCustomEvent(kEventUpdateCfg, full_path, "", changed->GetIndexCfg());
}

}  // namespace vellis::fileindex
