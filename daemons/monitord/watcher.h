// The kernel's file-change reports, whatever delivers them: a Watcher turns
// them into FsEvents with full paths. Backends: recursive inotify
// (inotify_watcher.h), whole-file-system fanotify (fanotify_watcher.h), and
// the tests' fake.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

namespace vellis::monitord {

enum class FsEventKind {
  kCreate,      // a name appeared (file, folder, link, ...)
  kModify,      // content written (the file may still be open)
  kCloseWrite,  // a file open for writing was closed
  kAttrib,      // mode, owner, times or extended attributes changed
  kDelete,      // a name went away
  kMovedFrom,   // a name left by a rename; `cookie` pairs it with its kMovedTo
  kMovedTo,     // a name arrived by a rename
  kOverflow,    // the kernel dropped events: anything under the roots may have changed
};

struct FsEvent {
  FsEventKind kind = FsEventKind::kCreate;
  std::string path;  // full path of the name; for kOverflow, the root concerned or ""
  bool is_dir = false;
  uint32_t cookie = 0;  // the same, non-zero, for the two halves of one rename
};

struct WatcherStats {
  uint64_t watches = 0;      // kernel watches or marks in use
  uint64_t watch_limit = 0;  // the most there may be; 0: no such limit
  uint64_t unwatched = 0;    // folders that could not be watched (limit reached)
};

class Watcher {
 public:
  virtual ~Watcher() = default;

  // "inotify", "fanotify", "fake".
  virtual std::string Name() const = 0;

  // Starts reporting changes anywhere below the folder `root` (a canonical
  // full path, not a symbolic link), including folders created later. A
  // folder created below a root is watched before it is read, and what it
  // already holds is reported as created, so nothing made in between is
  // missed. Returns false with errno set when `root` cannot be watched.
  // Given again, a root still watched is left as it is; one whose folder
  // was deleted and made again is watched anew.
  virtual bool AddTree(const std::string& root) = 0;

  // Stops reporting below `root`.
  virtual void RemoveTree(const std::string& root) = 0;

  // Readable (poll) when events wait.
  virtual int fd() const = 0;

  // Appends what the kernel has reported, never blocking. Events come in the
  // kernel's order; both halves of a rename that the kernel reports together
  // are next to each other.
  virtual void Read(std::vector<FsEvent>* out) = 0;

  // Folders below the roots that could not be watched (the watch limit):
  // the caller rescans them. Cleared by the call.
  virtual std::vector<std::string> TakeUnwatched() { return {}; }

  virtual WatcherStats stats() const = 0;
};

}  // namespace vellis::monitord
