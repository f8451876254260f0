#include "daemons/monitord/inotify_watcher.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/inotify.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <fstream>

namespace vellis::monitord {
namespace {

constexpr uint32_t kDirMask = IN_CREATE | IN_MODIFY | IN_CLOSE_WRITE | IN_ATTRIB | IN_DELETE |
                              IN_MOVED_FROM | IN_MOVED_TO | IN_DONT_FOLLOW | IN_ONLYDIR |
                              IN_EXCL_UNLINK;

bool Below(const std::string& dir, const std::string& path) {
  return path.size() > dir.size() && path.compare(0, dir.size(), dir) == 0 &&
         (path[dir.size()] == '/' || dir == "/");
}

std::string Join(const std::string& dir, const char* name) {
  return dir == "/" ? "/" + std::string(name) : dir + "/" + name;
}

}  // namespace

std::unique_ptr<InotifyWatcher> InotifyWatcher::Create(std::string* why) {
  const int fd = inotify_init1(IN_NONBLOCK | IN_CLOEXEC);
  if (fd < 0) {
    *why = std::string("inotify_init1: ") + strerror(errno);
    return nullptr;
  }
  return std::unique_ptr<InotifyWatcher>(new InotifyWatcher(fd));
}

InotifyWatcher::InotifyWatcher(int fd) : fd_(fd) {}

InotifyWatcher::~InotifyWatcher() { close(fd_); }

bool InotifyWatcher::AddTree(const std::string& root) {
  struct stat st;
  if (lstat(root.c_str(), &st) != 0) return false;
  if (!S_ISDIR(st.st_mode)) {
    errno = S_ISLNK(st.st_mode) ? ELOOP : ENOTDIR;
    return false;
  }
  const int wd = inotify_add_watch(fd_, root.c_str(), kDirMask);
  if (wd < 0) return false;
  const bool is_root = std::find(roots_.begin(), roots_.end(), root) != roots_.end();
  auto known = watches_.find(root);
  if (is_root && known != watches_.end() && known->second == wd) return true;  // the same folder
  // A folder that took the place of the one watched under this name: the
  // old watches are forgotten.
  if (known != watches_.end()) DropDir(root, true);
  paths_[wd] = root;
  watches_[root] = wd;
  if (!is_root) roots_.push_back(root);
  std::vector<FsEvent> none;
  AddDir(root, false, &none);
  return true;
}

void InotifyWatcher::AddDir(const std::string& top, bool report, std::vector<FsEvent>* out) {
  std::vector<std::string> stack = {top};
  while (!stack.empty()) {
    const std::string dir = stack.back();
    stack.pop_back();
    if (!watches_.count(dir)) {
      const int wd = inotify_add_watch(fd_, dir.c_str(), kDirMask);
      if (wd < 0) {
        if (errno == ENOSPC) {
          unwatched_.push_back(dir);
          ++unwatched_count_;
        }
        continue;  // gone already, or the limit: a rescan covers it
      }
      paths_[wd] = dir;
      watches_[dir] = wd;
    }
    // Read only after the watch is in place: what is made from now on is
    // reported by the kernel, what was there is reported here.
    const int dfd = open(dir.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC);
    if (dfd < 0) continue;
    DIR* d = fdopendir(dfd);
    if (!d) {
      close(dfd);
      continue;
    }
    while (dirent* e = readdir(d)) {
      if (strcmp(e->d_name, ".") == 0 || strcmp(e->d_name, "..") == 0) continue;
      bool is_dir = e->d_type == DT_DIR;
      if (e->d_type == DT_UNKNOWN) {
        struct stat st;
        is_dir = fstatat(dfd, e->d_name, &st, AT_SYMLINK_NOFOLLOW) == 0 && S_ISDIR(st.st_mode);
      }
      const std::string path = Join(dir, e->d_name);
      if (report) out->push_back({FsEventKind::kCreate, path, is_dir, 0});
      if (is_dir) stack.push_back(path);
    }
    closedir(d);
  }
}

void InotifyWatcher::DropDir(const std::string& dir, bool remove) {
  auto it = watches_.lower_bound(dir);
  while (it != watches_.end() && (it->first == dir || Below(dir, it->first))) {
    // One kernel watch may be known under a second path too (a folder moved
    // in was found by its new parent's scan first): it stays while that
    // path holds it.
    auto owner = paths_.find(it->second);
    if (owner != paths_.end() && owner->second == it->first) {
      if (remove) inotify_rm_watch(fd_, it->second);
      paths_.erase(owner);
    }
    it = watches_.erase(it);
  }
}

void InotifyWatcher::MoveDir(const std::string& from, const std::string& to) {
  std::vector<std::pair<std::string, int>> moved;
  for (auto it = watches_.lower_bound(from);
       it != watches_.end() && (it->first == from || Below(from, it->first));) {
    moved.emplace_back(to + it->first.substr(from.size()), it->second);
    it = watches_.erase(it);
  }
  for (const auto& [path, wd] : moved) {
    watches_[path] = wd;
    paths_[wd] = path;
  }
}

void InotifyWatcher::RemoveTree(const std::string& root) {
  for (auto it = roots_.begin(); it != roots_.end(); ++it) {
    if (*it != root) continue;
    roots_.erase(it);
    break;
  }
  // Folders below another root stay watched.
  for (const std::string& other : roots_) {
    if (other == root || Below(other, root)) return;
  }
  DropDir(root, true);
}

void InotifyWatcher::Read(std::vector<FsEvent>* out) {
  alignas(inotify_event) char buf[64 * 1024];
  struct MoveOut {
    uint32_t cookie;
    std::string path;
  };
  std::vector<MoveOut> dirs_out;  // folders moved away, waiting for their other half
  for (;;) {
    const ssize_t n = read(fd_, buf, sizeof(buf));
    if (n <= 0) break;
    for (ssize_t at = 0; at < n;) {
      const auto* ev = reinterpret_cast<const inotify_event*>(buf + at);
      at += static_cast<ssize_t>(sizeof(inotify_event) + ev->len);
      if (ev->mask & IN_Q_OVERFLOW) {
        out->push_back({FsEventKind::kOverflow, "", false, 0});
        continue;
      }
      auto dir_it = paths_.find(ev->wd);
      if (dir_it == paths_.end()) continue;  // a watch already forgotten
      const std::string dir = dir_it->second;
      if (ev->mask & IN_IGNORED) {
        // The folder is gone (or unwatched): its watch with it.
        watches_.erase(dir);
        paths_.erase(ev->wd);
        continue;
      }
      // A folder's own change is also reported by its parent's watch, but
      // for a root, whose parent is not watched.
      if (ev->len == 0 && std::find(roots_.begin(), roots_.end(), dir) == roots_.end()) continue;
      const std::string path = ev->len > 0 ? Join(dir, ev->name) : dir;
      const bool is_dir = (ev->mask & IN_ISDIR) != 0;
      if (ev->mask & IN_CREATE) {
        out->push_back({FsEventKind::kCreate, path, is_dir, 0});
        if (is_dir) AddDir(path, true, out);
      }
      if (ev->mask & IN_MODIFY) out->push_back({FsEventKind::kModify, path, false, 0});
      if (ev->mask & IN_ATTRIB) out->push_back({FsEventKind::kAttrib, path, is_dir, 0});
      if (ev->mask & IN_CLOSE_WRITE) out->push_back({FsEventKind::kCloseWrite, path, false, 0});
      if (ev->mask & IN_DELETE) {
        out->push_back({FsEventKind::kDelete, path, is_dir, 0});
        if (is_dir) DropDir(path, false);
      }
      if (ev->mask & IN_MOVED_FROM) {
        out->push_back({FsEventKind::kMovedFrom, path, is_dir, ev->cookie});
        if (is_dir) dirs_out.push_back({ev->cookie, path});
      }
      if (ev->mask & IN_MOVED_TO) {
        out->push_back({FsEventKind::kMovedTo, path, is_dir, ev->cookie});
        if (!is_dir) continue;
        bool paired = false;
        for (auto it = dirs_out.begin(); it != dirs_out.end(); ++it) {
          if (it->cookie != ev->cookie) continue;
          MoveDir(it->path, path);
          // Folders made below it just before the rename may have been
          // looked for under the old name and missed: watched now. What
          // they hold is reported by the indexer's crawl of their creation.
          AddDir(path, false, out);
          dirs_out.erase(it);
          paired = true;
          break;
        }
        // Moved in from elsewhere: watched and read like a new folder.
        if (!paired) AddDir(path, true, out);
      }
    }
  }
  // Folders that left what is watched keep their watches in the kernel,
  // which would report their changes under the old names.
  for (const MoveOut& m : dirs_out) DropDir(m.path, true);
}

std::vector<std::string> InotifyWatcher::TakeUnwatched() {
  std::vector<std::string> out;
  out.swap(unwatched_);
  return out;
}

WatcherStats InotifyWatcher::stats() const {
  WatcherStats s;
  s.watches = watches_.size();
  std::ifstream in("/proc/sys/fs/inotify/max_user_watches");
  in >> s.watch_limit;
  s.unwatched = unwatched_count_;
  return s;
}

}  // namespace vellis::monitord
