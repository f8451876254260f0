#include "daemons/monitord/watcher_factory.h"

#include "daemons/monitord/auto_watcher.h"
#include "daemons/monitord/fanotify_watcher.h"
#include "daemons/monitord/inotify_watcher.h"

namespace vellis::monitord {

std::unique_ptr<Watcher> MakeWatcher(const std::string& backend, std::string* why) {
  why->clear();
  if (backend == "fanotify") return FanotifyWatcher::Create(why);
  if (backend == "inotify") return InotifyWatcher::Create(why);
  return AutoWatcher::Create(why);
}

}  // namespace vellis::monitord
