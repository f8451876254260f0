// Adding, changing, listing and reading indexed folders.
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "common/json_util.h"
#include "common/lock_file.h"
#include "common/log.h"
#include "common/root_path.h"
#include "fileindex/elastic/communication.h"
#include "fileindex/elastic/elastic_control.h"
#include "fileindex/index_mgr.h"
#include "fileindex/optree.h"
#include "fileindex/util.h"
#include "sdk/share.h"

namespace vellis::fileindex {

void FolderAdd(const Json::Value& folder_list, bool updater_mode) {
  FolderUpsert(folder_list, true, updater_mode);
}

void FolderSet(const Json::Value& folder_list, bool updater_mode) {
  FolderUpsert(folder_list, false, updater_mode);
}

void FolderUpsert(const Json::Value& folder_list, bool create, bool updater_mode) {
  LockFile lock(RootPath(kFolderCfgLockPath), true);
  FolderMgr folder_mgr_old;
  FolderMgr folder_mgr;
  VELLIS_THROW_IF(!folder_list.isArray(), kErrBadArgument, JsonToString(folder_list));

  // Every element is checked before anything outside this process changes.
  std::vector<std::shared_ptr<Folder>> reindex;
  std::set<std::string> shares;
  for (const Json::Value& item : folder_list) {
    auto folder_new = std::make_shared<Folder>(item);
    VELLIS_THROW_IF(!CanPathBeIndexed(folder_new->GetPath()) && !updater_mode, kErrPathCannotIndex,
                    "Path cannot index: " + folder_new->GetPath());
    VELLIS_THROW_IF(create && folder_mgr.HasFolder(folder_new->GetPath()), kErrFolderDuplicated,
                    "Duplicated ID: " + folder_new->GetPath());
    std::shared_ptr<Folder> changed;
    folder_mgr.Upsert(changed, folder_new);
    // A new folder indexes every category; a changed one only those that
    // differ from what governed its path before.
    reindex.push_back(create
                          ? std::make_shared<Folder>(folder_new->GetPath(), folder_new->GetName(),
                                                     true, true, true, true, false, false)
                          : changed);
    sdk::SDKShare share(folder_new->GetShare());
    VELLIS_THROW_IF(!share.IsSpaceEnough(), kErrSpaceNotEnough,
                    "Share (" + share.GetName() + ") space not enough");
    shares.insert(folder_new->GetShare());
  }

  SetupRelatedServices(true);
  for (const std::string& share : shares) {
    if (create && !folder_mgr_old.IsShareIndexed(share)) elastic::ShareIndexCreate(share);
    UpsertQORUNotifydCfg(share, folder_mgr);
  }

  folder_mgr.Save();
  for (const std::string& share : shares) NotifyDaemonSettingChanged(share, true);

  if (updater_mode) return;
  for (const std::shared_ptr<Folder>& entry : reindex) {
    AddCustomEvent(kEventUpdateCfg, entry->GetFullPath(), "", entry->GetIndexCfg());
  }
}

void FolderList(Json::Value& result, unsigned int offset, unsigned int limit,
                const std::string& sort_by, const std::string& sort_direction,
                const Json::Value& additional) {
  FolderMgr folder_mgr;
  std::vector<std::shared_ptr<Folder>> page;
  unsigned int total = 0;
  folder_mgr.List(page, total, offset, limit, sort_by, sort_direction);
  result = Json::Value(Json::objectValue);
  result["folder"] = Json::Value(Json::arrayValue);
  result["total"] = total;
  result["offset"] = offset;
  for (const std::shared_ptr<Folder>& folder : page) {
    try {
      result["folder"].append(folder->GetDataWithAdditional(additional));
    } catch (const Error& e) {
      // One folder whose share is gone must not hide the others.
      VELLIS_LOG_ERRNO("Skip folder %s, code=%d, reason=%s", folder->GetPath().c_str(),
                       static_cast<int>(e.GetCode()), e.what());
    }
  }
}

void FolderGet(Json::Value& result, const std::string& path) {
  FolderMgr folder_mgr;
  std::shared_ptr<Folder> folder;
  folder_mgr.Get(folder, path);
  result = folder->GetData();
}

void NotifyDaemonSettingChanged(const std::string& share_name, bool is_upsert) {
  Json::Value data(Json::objectValue);
  data["share_name"] = share_name;
  data["is_upsert"] = is_upsert;
  SendCommandToDaemon(kCmdNotifySettingChanged, data);
}

}  // namespace vellis::fileindex
