#include "daemons/monitord/fanotify_watcher.h"

#include <errno.h>
#include <fcntl.h>
#include <limits.h>
#include <sys/fanotify.h>
#include <sys/stat.h>
#include <sys/statfs.h>
#include <unistd.h>

#include <algorithm>
#include <cstring>

namespace vellis::monitord {

// ---------------------------------------------------------------------------
// FolderPathCache

const std::string* FolderPathCache::Find(const std::string& key) {
  auto it = by_key_.find(key);
  if (it == by_key_.end()) return nullptr;
  lru_.splice(lru_.begin(), lru_, it->second.lru);
  return &it->second.path;
}

void FolderPathCache::EraseKey(const std::string& key) {
  auto it = by_key_.find(key);
  if (it == by_key_.end()) return;
  auto at = by_path_.find(it->second.path);
  if (at != by_path_.end() && at->second == key) by_path_.erase(at);
  lru_.erase(it->second.lru);
  by_key_.erase(it);
}

void FolderPathCache::Put(const std::string& key, const std::string& path) {
  if (capacity_ == 0) return;
  EraseKey(key);
  if (auto at = by_path_.find(path); at != by_path_.end()) EraseKey(at->second);
  while (by_key_.size() >= capacity_) EraseKey(lru_.back());
  lru_.push_front(key);
  by_key_[key] = Entry{path, lru_.begin()};
  by_path_[path] = key;
}

std::vector<std::pair<std::string, std::string>> FolderPathCache::Below(
    const std::string& path) const {
  std::vector<std::pair<std::string, std::string>> found;
  const std::string prefix = path == "/" ? path : path + "/";
  if (auto at = by_path_.find(path); at != by_path_.end()) found.push_back(*at);
  for (auto it = by_path_.lower_bound(prefix);
       it != by_path_.end() && it->first.compare(0, prefix.size(), prefix) == 0; ++it) {
    if (it->first != path) found.push_back(*it);
  }
  return found;
}

void FolderPathCache::Move(const std::string& from, const std::string& to) {
  if (from == to) return;
  ErasePath(to);  // what the rename replaced
  for (const auto& [path, key] : Below(from)) Put(key, to + path.substr(from.size()));
}

void FolderPathCache::ErasePath(const std::string& path) {
  for (const auto& entry : Below(path)) EraseKey(entry.second);
}

void FolderPathCache::EraseFileSystem(const std::string& fsid) {
  std::vector<std::string> keys;
  for (const auto& [key, entry] : by_key_) {
    if (key.compare(0, fsid.size(), fsid) == 0) keys.push_back(key);
  }
  for (const auto& key : keys) EraseKey(key);
}

void FolderPathCache::Clear() {
  by_key_.clear();
  by_path_.clear();
  lru_.clear();
}

// ---------------------------------------------------------------------------
// FanotifyWatcher

namespace {

// Rename events carry both names; the target's handle lets a folder's own
// creation, rename and deletion update the cache.
constexpr unsigned kInitFlags =
    FAN_CLASS_NOTIF | FAN_REPORT_DFID_NAME_TARGET | FAN_NONBLOCK | FAN_CLOEXEC;
constexpr uint64_t kMask =
    FAN_CREATE | FAN_DELETE | FAN_RENAME | FAN_ATTRIB | FAN_MODIFY | FAN_CLOSE_WRITE | FAN_ONDIR;

// statfs()'s f_fsid as the kernel puts it in events.
std::string FsidBytes(const fsid_t& fsid) {
  static_assert(sizeof(fsid) == sizeof(__kernel_fsid_t));
  return std::string(reinterpret_cast<const char*>(&fsid), sizeof(fsid));
}

std::string Join(const std::string& folder, const std::string& name) {
  if (name.empty() || name == ".") return folder;
  return folder == "/" ? "/" + name : folder + "/" + name;
}

}  // namespace

std::unique_ptr<FanotifyWatcher> FanotifyWatcher::Create(std::string* why) {
  int fd = fanotify_init(kInitFlags, O_RDONLY | O_LARGEFILE);
  if (fd < 0) {
    int err = errno;
    if (why != nullptr) {
      switch (err) {
        case EPERM:
          *why = "fanotify needs CAP_SYS_ADMIN";
          break;
        case EINVAL:
          *why = "the kernel's fanotify cannot report renames with both names (Linux 5.17+)";
          break;
        case ENOSYS:
          *why = "the kernel has no fanotify";
          break;
        case EMFILE:
          *why = "too many fanotify groups (fs.fanotify.max_user_groups)";
          break;
        default:
          *why = std::string("fanotify_init: ") + strerror(err);
      }
    }
    errno = err;
    return nullptr;
  }
  return std::unique_ptr<FanotifyWatcher>(new FanotifyWatcher(fd));
}

FanotifyWatcher::~FanotifyWatcher() {
  for (const Root& root : roots_) close(root.fd);
  close(fd_);
}

size_t FanotifyWatcher::RootsOn(const std::string& fsid) const {
  return std::count_if(roots_.begin(), roots_.end(), [&](const Root& r) { return r.fsid == fsid; });
}

bool FanotifyWatcher::AddTree(const std::string& root) {
  for (const Root& r : roots_) {
    if (r.path == root) return true;
  }
  // A plain descriptor, not O_PATH: fanotify_mark() takes no O_PATH one.
  int rfd = open(root.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  if (rfd < 0) return false;
  // The root's own handle, encoded as the kernel encodes it in events: its
  // path is known from the start, so events on the root read after it was
  // renamed still carry the name of their moment.
  struct statfs sfs;
  alignas(struct file_handle) unsigned char buf[sizeof(struct file_handle) + MAX_HANDLE_SZ];
  auto* fh = reinterpret_cast<struct file_handle*>(buf);
  fh->handle_bytes = MAX_HANDLE_SZ;
  int mount_id = 0;
  if (fstatfs(rfd, &sfs) != 0 || name_to_handle_at(rfd, "", fh, &mount_id, AT_EMPTY_PATH) != 0) {
    int err = errno;
    close(rfd);
    errno = err;
    return false;
  }
  Root r{root, rfd, FsidBytes(sfs.f_fsid), mount_id};
  std::string key = r.fsid;
  key.append(reinterpret_cast<const char*>(&fh->handle_type), sizeof(fh->handle_type));
  key.append(reinterpret_cast<const char*>(fh->f_handle), fh->handle_bytes);
  if (RootsOn(r.fsid) == 0) {
    if (fanotify_mark(fd_, FAN_MARK_ADD | FAN_MARK_FILESYSTEM, kMask, rfd, nullptr) != 0) {
      int err = errno;
      close(rfd);
      errno = err;
      return false;
    }
    // Paths cached before an earlier unmark may have gone stale since.
    folders_.EraseFileSystem(r.fsid);
  }
  roots_.push_back(std::move(r));
  folders_.Put(key, root);
  return true;
}

void FanotifyWatcher::RemoveTree(const std::string& root) {
  auto it =
      std::find_if(roots_.begin(), roots_.end(), [&](const Root& r) { return r.path == root; });
  if (it == roots_.end()) return;
  Root gone = std::move(*it);
  roots_.erase(it);
  if (RootsOn(gone.fsid) == 0) {
    fanotify_mark(fd_, FAN_MARK_REMOVE | FAN_MARK_FILESYSTEM, kMask, gone.fd, nullptr);
    folders_.EraseFileSystem(gone.fsid);
  }
  close(gone.fd);
}

WatcherStats FanotifyWatcher::stats() const {
  WatcherStats s;
  std::vector<std::string> seen;
  for (const Root& r : roots_) {
    if (std::find(seen.begin(), seen.end(), r.fsid) == seen.end()) seen.push_back(r.fsid);
  }
  s.watches = seen.size();
  return s;
}

bool FanotifyWatcher::UnderRoot(const std::string& path) const {
  for (const Root& r : roots_) {
    if (r.path == "/" || path == r.path ||
        (path.size() > r.path.size() && path.compare(0, r.path.size(), r.path) == 0 &&
         path[r.path.size()] == '/'))
      return true;
  }
  return false;
}

bool FanotifyWatcher::ResolveFolder(const Handle& h, std::string* path) {
  if (const std::string* cached = folders_.Find(h.key)) {
    *path = *cached;
    return true;
  }
  // struct file_handle: handle_bytes, handle_type, then the bytes; copied
  // out because the event buffer gives no alignment.
  unsigned int bytes;
  memcpy(&bytes, h.file_handle, sizeof(bytes));
  std::vector<unsigned char> buf(sizeof(struct file_handle) + bytes);
  memcpy(buf.data(), h.file_handle, buf.size());
  auto* fh = reinterpret_cast<struct file_handle*>(buf.data());

  // The path depends on the mount the handle is opened through: try each
  // mount a root of this file system is on, keeping the first path that
  // falls under a root.
  const std::string fsid = h.key.substr(0, sizeof(__kernel_fsid_t));
  std::vector<int> tried;
  bool found = false;
  for (const Root& r : roots_) {
    if (r.fsid != fsid || std::find(tried.begin(), tried.end(), r.mount_id) != tried.end())
      continue;
    tried.push_back(r.mount_id);
    int dfd = open_by_handle_at(r.fd, fh, O_PATH | O_CLOEXEC);
    if (dfd < 0) continue;  // ESTALE: deleted
    struct stat st;
    char link[PATH_MAX];
    ssize_t n = -1;
    if (fstat(dfd, &st) == 0 && st.st_nlink > 0) {
      n = readlink(("/proc/self/fd/" + std::to_string(dfd)).c_str(), link, sizeof(link));
    }
    close(dfd);
    if (n <= 0 || n >= static_cast<ssize_t>(sizeof(link)) || link[0] != '/') continue;
    std::string candidate(link, n);
    if (!found || UnderRoot(candidate)) *path = candidate;
    found = true;
    if (UnderRoot(candidate)) break;
  }
  if (found) folders_.Put(h.key, *path);
  return found;
}

bool FanotifyWatcher::PathOf(const Handle& h, std::string* path) {
  std::string folder;
  if (!h.present || !ResolveFolder(h, &folder)) return false;
  *path = Join(folder, h.name);
  return true;
}

void FanotifyWatcher::Read(std::vector<FsEvent>* out) {
  alignas(struct fanotify_event_metadata) char buf[64 * 1024];
  for (;;) {
    ssize_t n = read(fd_, buf, sizeof(buf));
    if (n < 0 && errno == EINTR) continue;
    if (n <= 0) return;  // EAGAIN: drained
    // Records follow each other at the lengths the kernel gives, which
    // keep no 8-byte alignment: each header is copied out before use.
    size_t at = 0;
    const size_t total = static_cast<size_t>(n);
    while (total - at >= sizeof(struct fanotify_event_metadata)) {
      struct fanotify_event_metadata meta;
      memcpy(&meta, buf + at, sizeof(meta));
      if (meta.event_len < sizeof(meta) || meta.event_len > total - at) break;
      if (meta.vers != FANOTIFY_METADATA_VERSION) return;
      const char* record = buf + at;
      at += meta.event_len;
      if (meta.fd >= 0) close(meta.fd);  // never with handles, but own it anyway
      if (meta.mask & FAN_Q_OVERFLOW) {
        out->push_back(FsEvent{FsEventKind::kOverflow, ""});
        folders_.Clear();  // renames may have been lost
        continue;
      }
      HandleEvent(meta.mask, record + meta.metadata_len, meta.event_len - meta.metadata_len, out);
    }
  }
}

void FanotifyWatcher::HandleEvent(uint64_t mask, const char* info, size_t info_len,
                                  std::vector<FsEvent>* out) {
  // The records: the folder and name (or, for a rename, both folders and
  // names), and the handle of the object itself.
  Handle dir, from, to, target;
  while (info_len >= sizeof(struct fanotify_event_info_header)) {
    struct fanotify_event_info_header hdr;
    memcpy(&hdr, info, sizeof(hdr));
    if (hdr.len < sizeof(struct fanotify_event_info_fid) + sizeof(struct file_handle) ||
        hdr.len > info_len)
      break;
    Handle* h = nullptr;
    switch (hdr.info_type) {
      case FAN_EVENT_INFO_TYPE_DFID_NAME:
      case FAN_EVENT_INFO_TYPE_DFID:
        h = &dir;
        break;
      case FAN_EVENT_INFO_TYPE_OLD_DFID_NAME:
        h = &from;
        break;
      case FAN_EVENT_INFO_TYPE_NEW_DFID_NAME:
        h = &to;
        break;
      case FAN_EVENT_INFO_TYPE_FID:
        h = &target;
        break;
    }
    if (h != nullptr) {
      const char* fsid = info + offsetof(struct fanotify_event_info_fid, fsid);
      const char* fh = info + offsetof(struct fanotify_event_info_fid, handle);
      struct file_handle head;
      memcpy(&head, fh, sizeof(head));
      size_t fh_len = sizeof(struct file_handle) + head.handle_bytes;
      size_t used = offsetof(struct fanotify_event_info_fid, handle) + fh_len;
      if (used <= hdr.len) {
        h->present = true;
        h->file_handle = fh;
        h->key.assign(fsid, sizeof(__kernel_fsid_t));
        h->key.append(fh + sizeof(head.handle_bytes), fh_len - sizeof(head.handle_bytes));
        if (hdr.info_type != FAN_EVENT_INFO_TYPE_FID && hdr.info_type != FAN_EVENT_INFO_TYPE_DFID &&
            used < hdr.len) {
          h->name.assign(info + used, strnlen(info + used, hdr.len - used));
        }
      }
    }
    info += hdr.len;
    info_len -= hdr.len;
  }

  const bool is_dir = (mask & FAN_ONDIR) != 0;
  if (mask & FAN_RENAME) {
    std::string old_path, new_path;
    bool have_old = PathOf(from, &old_path);
    bool have_new = PathOf(to, &new_path);
    if (is_dir) {
      // Before the roots are consulted: a folder above a root may move too.
      if (have_old && have_new) {
        folders_.Move(old_path, new_path);
      } else if (have_old) {
        folders_.ErasePath(old_path);
      }
      if (have_new && target.present) folders_.Put(target.key, new_path);
    }
    if (!have_old || !have_new) ++unresolved_;
    if (++next_cookie_ == 0) ++next_cookie_;
    if (have_old && UnderRoot(old_path))
      out->push_back(FsEvent{FsEventKind::kMovedFrom, old_path, is_dir, next_cookie_});
    if (have_new && UnderRoot(new_path))
      out->push_back(FsEvent{FsEventKind::kMovedTo, new_path, is_dir, next_cookie_});
    return;
  }

  std::string path;
  if (!PathOf(dir, &path)) {
    ++unresolved_;
    return;
  }
  if (is_dir && (mask & FAN_CREATE) && target.present) folders_.Put(target.key, path);
  if (is_dir && (mask & FAN_DELETE)) folders_.ErasePath(path);
  if (!UnderRoot(path)) return;
  // The kernel merges repeated events on one object into one record: they
  // come out in the order a file's life gives them.
  static constexpr struct {
    uint64_t bit;
    FsEventKind kind;
  } kKinds[] = {
      {FAN_CREATE, FsEventKind::kCreate}, {FAN_MODIFY, FsEventKind::kModify},
      {FAN_ATTRIB, FsEventKind::kAttrib}, {FAN_CLOSE_WRITE, FsEventKind::kCloseWrite},
      {FAN_DELETE, FsEventKind::kDelete},
  };
  for (const auto& k : kKinds) {
    if (mask & k.bit) out->push_back(FsEvent{k.kind, path, is_dir});
  }
}

}  // namespace vellis::monitord
