// Indexing listed folders again from scratch.
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "common/json_util.h"
#include "common/lock_file.h"
#include "common/log.h"
#include "common/root_path.h"
#include "fileindex/util.h"
#include "fileindex/index_mgr.h"
#include "fileindex/optree.h"
#include "fileindex/status_mgr.h"

namespace vellis::fileindex {

void FolderReindex(const Json::Value& path_list) {
  LockFile lock(RootPath(kFolderCfgLockPath), true);
  FolderMgr folder_mgr;
  VELLIS_THROW_IF(!path_list.isArray(), kErrBadArgument, JsonToString(path_list));

  std::vector<std::string> full_paths;
  std::set<std::string> shares;
  for (const Json::Value& item : path_list) {
    VELLIS_THROW_IF(!item.isString(), kErrBadArgument, "Not a string" + AppendData(item));
    std::shared_ptr<Folder> folder;
    folder_mgr.Get(folder, item.asString());
    full_paths.push_back(folder->GetFullPath());
    shares.insert(folder->GetShare());
  }

  // Cleared first: an event that cannot be queued sets the bit again, and
  // that must survive.
  for (const std::string& share : shares) {
    StatusMgr().UnsetShareStatus(share, kShareStatusNeedReindex);
  }
  for (const std::string& full_path : full_paths) {
    AddCustomEvent(kEventReindex, full_path, "", Json::Value());
  }
}

}  // namespace vellis::fileindex
