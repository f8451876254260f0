// The fanotify backend: one mark per file system holding a root, so folders
// created later are covered without any work and there is no watch limit.
// The kernel reports each change on the whole file system as (folder handle,
// name); the folder is turned back into a path (cached) and the event kept
// only when the path is at or below a root.
//
// Needs CAP_SYS_ADMIN and Linux 5.17 or later (rename events that carry both
// names). A file system takes the mark only if it can hand out file handles
// and has a file-system id: on Linux 6.18, ext4 and tmpfs do; overlayfs
// (mounted without its export option) and /proc refuse with EOPNOTSUPP, and
// AddTree() then fails with that errno so the caller can fall back to
// inotify. Mount marks are no way out: the kernel refuses the directory-entry
// events on them (EINVAL).
//
// Limits:
//  - A folder is resolved when its events are read, not when they happened.
//    The roots, and folders created, renamed or deleted while marked, are
//    followed through the events themselves, so their paths are those of the
//    moment; a folder known only by its handle that was renamed before the
//    read shows under its new path.
//  - A folder deleted before its events are read, and never seen created or
//    resolved, cannot be found: the events inside it are dropped
//    (unresolved()), and the folder's own deletion, reported in its parent,
//    stands for them.
//  - The kernel merges repeated changes to one name into one report; they
//    come out as create, modify, attrib, close_write, delete, in that order.
//  - Every change on a marked file system reaches this process, under the
//    roots or not; the kernel's queue (16384 events) can overflow on a busy
//    file system, which gives one kOverflow event with an empty path.
#pragma once

#include <sys/types.h>

#include <cstdint>
#include <list>
#include <map>
#include <memory>
#include <string>
#include <unordered_map>
#include <vector>

#include "daemons/monitord/watcher.h"

namespace vellis::monitord {

// Folder handle -> path, the most recently used kept (at most `capacity`).
// Keys are opaque strings that begin with the 8-byte file-system id.
class FolderPathCache {
 public:
  explicit FolderPathCache(size_t capacity) : capacity_(capacity) {}

  // The path of `key`, or null. Marks the entry as recently used.
  const std::string* Find(const std::string& key);
  // Records `key` at `path`, replacing any other key at the same path.
  void Put(const std::string& key, const std::string& path);
  // A folder moved from `from` to `to`: paths at or below `from` now begin
  // with `to`.
  void Move(const std::string& from, const std::string& to);
  // Forgets the paths at or below `path`.
  void ErasePath(const std::string& path);
  // Forgets the keys of the file system `fsid` (8 bytes).
  void EraseFileSystem(const std::string& fsid);
  void Clear();
  size_t size() const { return by_key_.size(); }

 private:
  struct Entry {
    std::string path;
    std::list<std::string>::iterator lru;  // in lru_, front: most recent
  };
  void EraseKey(const std::string& key);
  // The entries of by_path_ at or below `path`, in order.
  std::vector<std::pair<std::string, std::string>> Below(const std::string& path) const;

  size_t capacity_;
  std::unordered_map<std::string, Entry> by_key_;
  std::map<std::string, std::string> by_path_;  // path -> key
  std::list<std::string> lru_;
};

class FanotifyWatcher : public Watcher {
 public:
  static constexpr size_t kFolderCacheSize = 65536;

  // A watcher, or null with the reason in *why (no CAP_SYS_ADMIN: EPERM; a
  // kernel before 5.17 or without fanotify: EINVAL, ENOSYS; the group limit:
  // EMFILE). errno is left as the kernel set it.
  static std::unique_ptr<FanotifyWatcher> Create(std::string* why);
  ~FanotifyWatcher() override;
  FanotifyWatcher(const FanotifyWatcher&) = delete;
  FanotifyWatcher& operator=(const FanotifyWatcher&) = delete;

  std::string Name() const override { return "fanotify"; }
  // Marks the file system holding `root` unless an earlier root did. Fails
  // with errno when `root` cannot be opened or its file system refuses the
  // mark (see above). Adding a root twice is harmless.
  bool AddTree(const std::string& root) override;
  // Drops `root`; the file system is unmarked when none of its roots is left.
  void RemoveTree(const std::string& root) override;
  int fd() const override { return fd_; }
  void Read(std::vector<FsEvent>* out) override;
  // watches: file systems marked; no limit; nothing is ever unwatched.
  WatcherStats stats() const override;

  // Events dropped because their folder could no longer be found.
  uint64_t unresolved() const { return unresolved_; }

 private:
  struct Root {
    std::string path;
    int fd = -1;       // the root opened, kept for marks and handle lookups
    std::string fsid;  // 8 bytes, as the kernel reports it
    int mount_id = 0;  // the mount the fd is on
  };
  // One record of an event: a folder handle and, maybe, a name.
  struct Handle {
    bool present = false;
    std::string key;                    // fsid + handle type + handle bytes
    const void* file_handle = nullptr;  // struct file_handle, maybe unaligned
    std::string name;
  };

  explicit FanotifyWatcher(int fd) : fd_(fd) {}
  void HandleEvent(uint64_t mask, const char* info, size_t info_len, std::vector<FsEvent>* out);
  // The path of `h` (its folder joined with its name), or false.
  bool PathOf(const Handle& h, std::string* path);
  bool ResolveFolder(const Handle& h, std::string* path);
  bool UnderRoot(const std::string& path) const;
  size_t RootsOn(const std::string& fsid) const;

  int fd_;
  std::vector<Root> roots_;
  FolderPathCache folders_{kFolderCacheSize};
  uint32_t next_cookie_ = 0;
  uint64_t unresolved_ = 0;
};

}  // namespace vellis::monitord
