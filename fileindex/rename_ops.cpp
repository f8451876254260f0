// Keeping the folder list and the index in step with renamed users and
// shares.
#include <memory>
#include <string>

#include "common/log.h"
#include "fileindex/elastic/elastic_control.h"
#include "fileindex/index_mgr.h"
#include "fileindex/optree.h"
#include "fileindex/util.h"
#include "sdk/share.h"

namespace vellis::fileindex {
namespace {

constexpr char kHomesPrefix[] = "/homes/";

}  // namespace

void UserRename(const std::string& user_from, const std::string& user_to) {
  VELLIS_THROW_IF(user_from.empty(), kErrBadArgument, "Missing user_from");
  VELLIS_THROW_IF(user_to.empty(), kErrBadArgument, "Missing user_to");
  FolderMgr folder_mgr;
  const std::string home_from = kHomesPrefix + user_from;
  const std::string home_to = kHomesPrefix + user_to;
  for (const std::shared_ptr<Folder>& folder : folder_mgr.GetFolders()) {
    const std::string old_path = folder->GetPath();
    // With the trailing "/" on both sides, /homes/alice2 is not in alice's
    // home while /homes/alice itself is.
    if (!StringStartWith(old_path + "/", home_from + "/")) continue;
    const std::string new_path = home_to + old_path.substr(home_from.size());
    folder->SetPath(new_path);
    VELLIS_LOG_ERR("Update homes rule: [%s] -> [%s]", old_path.c_str(), new_path.c_str());
  }
  folder_mgr.Save();
  AddCustomEvent(kEventRename, GetFullPath(home_to), GetFullPath(home_from), Json::Value());
}

void ShareRename(const std::string& share_from, const std::string& share_to) {
  FolderMgr folder_mgr;
  VELLIS_THROW_IF(share_from.empty(), kErrBadArgument, "Missing share_from");
  VELLIS_THROW_IF(share_to.empty(), kErrBadArgument, "Missing share_to");
  for (const std::shared_ptr<Folder>& folder : folder_mgr.GetFolders()) {
    if (folder->GetShare() == share_from) folder->SetShare(share_to);
  }
  folder_mgr.Save();

  sdk::SDKShare share(share_to);
  elastic::ShareIndexRename(share_from, share_to, share.GetDBPath());
  const std::string new_path = share.GetPath();
  const std::string old_path = ReplacePathShare(new_path, share_from, share_to);
  AddCustomEvent(kEventRename, new_path, old_path, Json::Value());
}

}  // namespace vellis::fileindex
