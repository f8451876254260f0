#include "daemons/monitord/watcher_factory.h"

#include "daemons/monitord/fanotify_watcher.h"
#include "daemons/monitord/inotify_watcher.h"

namespace vellis::monitord {

std::unique_ptr<Watcher> MakeWatcher(const std::string& backend, std::string* why) {
  why->clear();
  // "auto" takes inotify for now: it works on every local file system,
  // while a file-system mark is refused on some (overlayfs).
  if (backend == "fanotify") return FanotifyWatcher::Create(why);
  return InotifyWatcher::Create(why);
}

}  // namespace vellis::monitord
