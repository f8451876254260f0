// The path queries of FolderMgr.
#include <algorithm>

#include "fileindex/folder_mgr.h"
#include "fileindex/util.h"

namespace vellis::fileindex {
namespace {

// `full_path` + "/" begins with `folder` + "/", without building either
// string: this runs once per folder for every event of a queue.
bool IsUnder(const std::string& full_path, const std::string& folder) {
  return full_path.size() >= folder.size() &&
         full_path.compare(0, folder.size(), folder) == 0 &&
         (full_path.size() == folder.size() || full_path[folder.size()] == '/');
}

}  // namespace

bool FolderMgr::HasFolder(const std::string& path) const {
  return std::any_of(folders_.begin(), folders_.end(),
                     [&path](const std::shared_ptr<Folder>& f) { return f->GetPath() == path; });
}

bool FolderMgr::IsFullPathHasOwnCfg(const std::string& full_path) const {
  return std::any_of(
      folders_.begin(), folders_.end(),
      [&full_path](const std::shared_ptr<Folder>& f) { return f->GetFullPath() == full_path; });
}

bool FolderMgr::IsFullPathIndexed(const std::string& full_path) const {
  return std::any_of(
      folders_.begin(), folders_.end(),
      [&full_path](const std::shared_ptr<Folder>& f) { return IsUnder(full_path, f->GetFullPath()); });
}

std::shared_ptr<Folder> FolderMgr::GetMostSuitableCfg(const std::string& full_path) const {
  std::shared_ptr<Folder> best;
  size_t best_length = 0;
  for (const auto& folder : folders_) {
    const std::string folder_path = folder->GetFullPath();
    if (IsUnder(full_path, folder_path) && folder_path.size() > best_length) {
      best = folder;
      best_length = folder_path.size();
    }
  }
  return best;
}

bool FolderMgr::IsFullPathNeedMeta(const std::string& full_path) const {
  std::shared_ptr<Folder> cfg = GetMostSuitableCfg(full_path);
  if (!cfg) return false;
  switch (GetFileTypeByFullPath(full_path)) {
    case kDocument:
      return cfg->IsDocument();
    case kAudio:
      return cfg->IsAudio();
    case kVideo:
      return cfg->IsVideo();
    case kImage:
      return cfg->IsPhoto();
    default:
      return true;
  }
}

bool FolderMgr::IsShareIndexed(const std::string& share) const {
  return std::any_of(folders_.begin(), folders_.end(), [&share](const std::shared_ptr<Folder>& f) {
    // From the path itself: a record renamed with SetShare keeps its cache.
    std::string name;
    GetShareNameByPath(name, f->GetPath());
    return name == share;
  });
}

std::set<std::string> FolderMgr::GetIndexedShares() const {
  std::set<std::string> shares;
  for (const auto& folder : folders_) shares.insert(folder->GetShare());
  return shares;
}

}  // namespace vellis::fileindex
