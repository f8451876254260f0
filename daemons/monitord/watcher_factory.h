// Chooses the watcher backend.
#pragma once

#include <memory>
#include <string>

#include "daemons/monitord/watcher.h"

namespace vellis::monitord {

// "inotify", "fanotify", or "auto": fanotify where the kernel and the
// privileges allow it, else inotify. Null with the reason when the backend
// asked for cannot run; with "auto", `why` may say why fanotify was passed
// over.
std::unique_ptr<Watcher> MakeWatcher(const std::string& backend, std::string* why);

}  // namespace vellis::monitord
