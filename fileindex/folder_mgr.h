// The list of indexed folders and its file, and the questions asked of it.
//
// Every FolderMgr is a private snapshot: it loads the folders file when it
// is built and writes it only in Save(). A writer takes the folder lock
// (LockFile on RootPath(kFolderCfgLockPath), common/lock_file.h) around
// load, change and Save, so that no update of another process is lost;
// readers that only query may load without it and see the last saved list.
// An instance is not thread-safe, not even for queries (they fill the
// records' caches).
#pragma once

#include <memory>
#include <set>
#include <string>
#include <vector>

#include "fileindex/folder.h"
#include "fileindex/full_path_index.h"

namespace vellis::fileindex {

// The folders file, resolved with RootPath() at use: a JSON array of
// Folder::GetData() objects in list order.
inline constexpr char kFileIndexFoldersCfgPath[] = "/var/packages/Vellis/etc/fileindex.folders";
// The most folders the list may hold.
inline constexpr size_t kFileIndexFoldersMax = 1000;

class FolderMgr {
 public:
  // Loads the folders file; a missing file is an empty list. Throws Error
  // 504 "Cannot load json: <path>" when the file exists but is not a JSON
  // array (no manager is built, so nothing can be saved over it), and the
  // record's Error 120 when an element lacks a required key.
  FolderMgr();

  // Writes the whole list as root, replacing the file atomically (a crash
  // or a full disk leaves the old list or the new one, never a part), then
  // sets mode 0644 and removes temporary files that saves killed before
  // their rename left behind (those more than a minute older than the new
  // file). Throws Error 505 (reason the path) when the file cannot
  // be written, 502 (reason the path) when its mode cannot be set, and the
  // credentials' 503.
  void Save() const;

  // Enters `folder`, replacing every entry with the same path; the folder
  // goes to the end of the list. `changed` receives DiffCfg(folder, the
  // entry that governed the folder's full path before). Throws Error 900
  // when the list then holds more than kFileIndexFoldersMax entries (the
  // folder stays entered in this instance; the caller does not Save), and
  // what GetFullPath throws.
  void Upsert(std::shared_ptr<Folder>& changed, std::shared_ptr<Folder> folder);

  // Removes every entry with this path. `changed` receives DiffCfg(before,
  // after) of the entries that governed the path's full path before and
  // after: all four flags when none governs it any more. The path must be
  // configured (HasFolder).
  void Delete(std::shared_ptr<Folder>& changed, const std::string& path);

  // Removes every entry whose share is `share`.
  void DeleteByShare(const std::string& share);

  // A new record with `folder`'s path and name, privileged and paused false,
  // and the content flags that differ between `folder` and `base` (all four
  // when `base` is null). `folder` must not be null.
  static std::shared_ptr<Folder> DiffCfg(std::shared_ptr<Folder> folder,
                                         std::shared_ptr<Folder> base);

  // The first entry whose path equals `path` (byte for byte). Throws Error
  // 902 (reason the path) when there is none.
  void Get(std::shared_ptr<Folder>& out, const std::string& path) const;

  // A page of the list sorted by `sort_by`: "document", "audio", "video" or
  // "photo" (entries without the flag first), "path", or anything else for
  // the name (both compared ignoring case). The sort is not stable. With
  // `sort_direction` "desc" the order is reversed. Then `offset` entries are
  // skipped (an offset past the end gives an empty page) and at most `limit`
  // kept. `total` receives the size of the whole list. The records are
  // shared with this instance, not copied.
  void List(std::vector<std::shared_ptr<Folder>>& out, unsigned int& total, unsigned int offset,
            unsigned int limit, const std::string& sort_by,
            const std::string& sort_direction) const;

  // The entries in list order. The records are shared with this instance:
  // changing one changes what Save() writes. The path queries below do not
  // see a path changed this way (SetPath, SetShare); such a change is meant
  // to be saved, and the list loaded afresh before it is queried again.
  const std::vector<std::shared_ptr<Folder>>& GetFolders() const { return folders_; }

  // --- Path queries ---
  // A full path P lies under a folder with full path F when P + "/" begins
  // with F + "/" (byte for byte): a folder covers itself and what is below
  // it, and /volume1/music2 is not under /volume1/music. The queries compute
  // the entries' full paths, so they throw what Folder::GetFullPath throws.

  // True when some entry's path equals `path`.
  bool HasFolder(const std::string& path) const;

  // True when `full_path` is itself some entry's full path.
  bool IsFullPathHasOwnCfg(const std::string& full_path) const;

  // True when `full_path` lies under some entry. This and the two below take
  // a few hash lookups per component of `full_path`, whatever the size of
  // the list.
  bool IsFullPathIndexed(const std::string& full_path) const;

  // The entry that governs `full_path`: the deepest one it lies under (the
  // earlier one in the list between equal full paths); null when none.
  std::shared_ptr<Folder> GetMostSuitableCfg(const std::string& full_path) const;

  // Whether the content of the file at `full_path` is indexed: false when
  // no entry governs it; otherwise the governing entry's flag for the file's
  // type (document, audio, video, photo for images), and true for a type
  // outside the four categories.
  bool IsFullPathNeedMeta(const std::string& full_path) const;

  // True when some entry's path is in the share `share`.
  bool IsShareIndexed(const std::string& share) const;

  // The distinct shares of all entries, in ascending byte order.
  std::set<std::string> GetIndexedShares() const;

 private:
  // The entries by full path, built on the first path query after a change
  // of the list (the records' full paths do not change once computed).
  const FullPathIndex& Index() const;
  void ListChanged() { index_.reset(); }

  std::vector<std::shared_ptr<Folder>> folders_;
  mutable std::shared_ptr<const FullPathIndex> index_;
};

}  // namespace vellis::fileindex
