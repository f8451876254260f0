#include "fileindex/folder_mgr.h"

#include <dirent.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cstring>
#include <ctime>
#include <functional>

#include "common/fs_util.h"
#include "common/json_util.h"
#include "common/log.h"
#include "common/root_path.h"
#include "fileindex/util.h"
#include "sdk/credentials.h"
#include "sdk/platform.h"

namespace vellis::fileindex {
namespace {

// Negative, 0 or positive as `a` sorts before, with or after `b`, ignoring
// case as the platform folds it.
int CaseCompare(const std::string& a, const std::string& b) {
  return sdk::GetPlatform()->QLIBCUnicodeUTF8StrCaseCmp(a, b);
}

using FolderLess =
    std::function<bool(const std::shared_ptr<Folder>&, const std::shared_ptr<Folder>&)>;

// Entries without the flag sort first.
FolderLess ByFlag(bool (Folder::*flag)() const) {
  return [flag](const std::shared_ptr<Folder>& a, const std::shared_ptr<Folder>& b) {
    return !((*a).*flag)() && ((*b).*flag)();
  };
}

FolderLess ByText(const std::string& (Folder::*text)() const) {
  return [text](const std::shared_ptr<Folder>& a, const std::shared_ptr<Folder>& b) {
    return CaseCompare(((*a).*text)(), ((*b).*text)()) < 0;
  };
}

FolderLess SortKey(const std::string& sort_by) {
  if (sort_by == "document") return ByFlag(&Folder::IsDocument);
  if (sort_by == "audio") return ByFlag(&Folder::IsAudio);
  if (sort_by == "video") return ByFlag(&Folder::IsVideo);
  if (sort_by == "photo") return ByFlag(&Folder::IsPhoto);
  if (sort_by == "path") return ByText(&Folder::GetPath);
  return ByText(&Folder::GetName);
}

// A temporary file of a save is renamed moments after it is written, so one
// that is older than the file just saved by more than this belongs to a save
// that was killed.
constexpr time_t kStaleTempSeconds = 60;

// Removes the temporary files that saves killed before their rename left
// beside the folders file. Failures are harmless and ignored.
void RemoveStaleTempFiles(const std::string& cfg_path) {
  struct stat saved;
  if (stat(cfg_path.c_str(), &saved) != 0) return;
  const std::string dir = Dirname(cfg_path);
  const std::string prefix = Basename(cfg_path) + ".tmp-";
  DIR* entries = opendir(dir.c_str());
  if (entries == nullptr) return;
  while (const dirent* entry = readdir(entries)) {
    if (strncmp(entry->d_name, prefix.c_str(), prefix.size()) != 0) continue;
    const std::string path = dir + "/" + entry->d_name;
    struct stat st;
    if (lstat(path.c_str(), &st) == 0 && S_ISREG(st.st_mode) &&
        st.st_mtime + kStaleTempSeconds < saved.st_mtime) {
      unlink(path.c_str());
    }
  }
  closedir(entries);
}

}  // namespace

FolderMgr::FolderMgr() {
  const std::string cfg_path = RootPath(kFileIndexFoldersCfgPath);
  Json::Value folders(Json::arrayValue);
  VELLIS_THROW_IF(IsFileExist(cfg_path) && !JsonFromFile(folders, cfg_path), kErrLoadJson,
                  "Cannot load json: " + cfg_path);
  VELLIS_THROW_IF(!folders.isArray(), kErrLoadJson, "Cannot load json: " + cfg_path);
  folders_.reserve(folders.size());
  for (const Json::Value& data : folders) folders_.push_back(std::make_shared<Folder>(data));
}

void FolderMgr::Save() const {
  Json::Value folders(Json::arrayValue);
  for (const auto& folder : folders_) folders.append(folder->GetData());
  const std::string cfg_path = RootPath(kFileIndexFoldersCfgPath);
  // The file belongs to root; the mode is set in the same scope so that a
  // caller running as another user may still set it.
  sdk::SDKCredentials credentials("root");
  VELLIS_THROW_IF(!JsonToFile(folders, cfg_path), kErrSaveJson, cfg_path);
  VELLIS_THROW_IF(-1 == chmod(cfg_path.c_str(), 0644), kErrInternal, cfg_path);
  RemoveStaleTempFiles(cfg_path);
}

void FolderMgr::Upsert(std::shared_ptr<Folder>& changed, std::shared_ptr<Folder> folder) {
  VELLIS_THROW_IF(!folder, kErrBadArgument, "no folder to upsert");
  changed = DiffCfg(folder, GetMostSuitableCfg(folder->GetFullPath()));
  const std::string& path = folder->GetPath();
  folders_.erase(
      std::remove_if(folders_.begin(), folders_.end(),
                     [&path](const std::shared_ptr<Folder>& f) { return f->GetPath() == path; }),
      folders_.end());
  folders_.push_back(folder);
  ListChanged();
  VELLIS_THROW_IF(folders_.size() > kFileIndexFoldersMax, kErrFolderLimit, "");
}

void FolderMgr::Delete(std::shared_ptr<Folder>& changed, const std::string& path) {
  const std::string full_path = GetFullPath(path);
  std::shared_ptr<Folder> before = GetMostSuitableCfg(full_path);
  // Without a governing entry there is nothing to diff against.
  VELLIS_THROW_IF(!before, kErrFolderNotFound, path);
  folders_.erase(
      std::remove_if(folders_.begin(), folders_.end(),
                     [&path](const std::shared_ptr<Folder>& f) { return f->GetPath() == path; }),
      folders_.end());
  ListChanged();
  changed = DiffCfg(before, GetMostSuitableCfg(full_path));
}

void FolderMgr::DeleteByShare(const std::string& share) {
  folders_.erase(
      std::remove_if(folders_.begin(), folders_.end(),
                     [&share](const std::shared_ptr<Folder>& f) { return f->GetShare() == share; }),
      folders_.end());
  ListChanged();
}

std::shared_ptr<Folder> FolderMgr::DiffCfg(std::shared_ptr<Folder> folder,
                                           std::shared_ptr<Folder> base) {
  if (!base) {
    return std::make_shared<Folder>(folder->GetPath(), folder->GetName(), true, true, true, true,
                                    false, false);
  }
  return std::make_shared<Folder>(
      folder->GetPath(), folder->GetName(), folder->IsDocument() != base->IsDocument(),
      folder->IsAudio() != base->IsAudio(), folder->IsVideo() != base->IsVideo(),
      folder->IsPhoto() != base->IsPhoto(), false, false);
}

void FolderMgr::Get(std::shared_ptr<Folder>& out, const std::string& path) const {
  auto it =
      std::find_if(folders_.begin(), folders_.end(),
                   [&path](const std::shared_ptr<Folder>& f) { return f->GetPath() == path; });
  VELLIS_THROW_IF(it == folders_.end(), kErrFolderNotFound, path);
  out = *it;
}

void FolderMgr::List(std::vector<std::shared_ptr<Folder>>& out, unsigned int& total,
                     unsigned int offset, unsigned int limit, const std::string& sort_by,
                     const std::string& sort_direction) const {
  out = folders_;
  total = static_cast<unsigned int>(out.size());
  std::sort(out.begin(), out.end(), SortKey(sort_by));
  if (sort_direction == "desc") std::reverse(out.begin(), out.end());
  out.erase(out.begin(), out.begin() + std::min<size_t>(offset, out.size()));
  if (out.size() > limit) out.resize(limit);
}

}  // namespace vellis::fileindex
