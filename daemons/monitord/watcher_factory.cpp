#include "daemons/monitord/watcher_factory.h"

#include "daemons/monitord/inotify_watcher.h"

namespace vellis::monitord {

std::unique_ptr<Watcher> MakeWatcher(const std::string& backend, std::string* why) {
  why->clear();
  if (backend == "fanotify") {
    *why = "the fanotify backend is not built";
    return nullptr;
  }
  return InotifyWatcher::Create(why);
}

}  // namespace vellis::monitord
