// The path queries of FolderMgr.
#include <algorithm>
#include <utility>
#include <vector>

#include "fileindex/folder_mgr.h"
#include "fileindex/util.h"

namespace vellis::fileindex {

const FullPathIndex& FolderMgr::Index() const {
  if (!index_) {
    std::vector<std::string> full_paths;
    full_paths.reserve(folders_.size());
    for (const auto& folder : folders_) full_paths.push_back(folder->GetFullPath());
    index_ = std::make_shared<const FullPathIndex>(std::move(full_paths));
  }
  return *index_;
}

bool FolderMgr::HasFolder(const std::string& path) const {
  return std::any_of(folders_.begin(), folders_.end(),
                     [&path](const std::shared_ptr<Folder>& f) { return f->GetPath() == path; });
}

bool FolderMgr::IsFullPathHasOwnCfg(const std::string& full_path) const {
  return Index().Find(full_path) != FullPathIndex::kNone;
}

bool FolderMgr::IsFullPathIndexed(const std::string& full_path) const {
  return Index().FindCovering(full_path) != FullPathIndex::kNone;
}

std::shared_ptr<Folder> FolderMgr::GetMostSuitableCfg(const std::string& full_path) const {
  size_t found = Index().FindCovering(full_path);
  return found == FullPathIndex::kNone ? nullptr : folders_[found];
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
