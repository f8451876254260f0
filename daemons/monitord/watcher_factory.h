// Chooses the watcher backend.
#pragma once

#include <memory>
#include <string>

#include "daemons/monitord/watcher.h"

namespace vellis::monitord {

// "inotify", "fanotify", or "auto" (AutoWatcher: fanotify where it can
// mark a root's file system, inotify elsewhere). Null with the reason when
// the backend asked for cannot run.
std::unique_ptr<Watcher> MakeWatcher(const std::string& backend, std::string* why);

}  // namespace vellis::monitord
