// The file-change monitor's queue configuration on Linux: one JSON file per
// application, which the monitor reads to know what to watch and where to
// write the events (docs/platform.md shows the format).
//
// {"app": "fileindex", "queues": {"<queue file>": {"type": 1, "config": [
//   {"path": "/volume1/photo/2019", "mask": 65478, "ignore": ["@eaDir"]}]}}}
//
// Writers take the application's lock file and replace the file atomically,
// so the monitor reads the old configuration or the new one.
#pragma once

#include <json/json.h>

#include <string>

namespace vellis::sdk {

// Folder of the configuration files and of their lock files, resolved with
// RootPath() at use.
inline constexpr char kMonitorQueueDir[] = "/var/packages/Vellis/etc/monitor";
inline constexpr char kMonitorQueueLockPrefix[] = "/tmp/vellis_monitor_";
// What the running monitor reports of itself (JSON, replaced each second).
inline constexpr char kMonitorStatusFile[] = "/var/run/vellis-monitord.status";

// The configuration file of `app` under the root: "<dir>/<app>.json". Empty
// when `app` cannot name a file (empty, ".", "..", or holding "/" or NUL).
std::string MonitorQueueFile(const std::string& app);

// True when `queue` has the shape that MonitorQueueUpsert takes: an object
// with an absolute "queue" path and a "config" array of objects, each with an
// absolute "path", an integer "mask" and an "ignore" array of strings.
bool IsValidMonitorQueue(const Json::Value& queue);

}  // namespace vellis::sdk
