// The file-change monitor's state: the configuration it follows, the
// watcher, the router, and the queues it appends to.
//
// Step() is the daemon's loop body on an injected clock: it takes what the
// watcher reports, routes it, appends the lines (each queue's lines in one
// write under the queue's lock), and does the periodic work: rescans of
// folders the watch limit left out, reindexes of folders on file systems
// whose changes the kernel never reports. Lines that cannot be written stay
// for the next step.
//
// Not thread-safe: the daemon's one thread drives it.
#pragma once

#include <json/json.h>

#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "daemons/monitord/event_router.h"
#include "daemons/monitord/monitor_config.h"
#include "daemons/monitord/watcher.h"

namespace vellis::monitord {

struct MonitorOptions {
  RouterOptions router;
  int64_t network_reindex_ms = 10 * 60 * 1000;  // folders on NFS, SMB, FUSE
  int64_t rescan_ms = 60 * 1000;                // folders the watch limit left out
  int64_t write_every_ms = 10;                  // lines made meanwhile go in one write
};

class Monitor {
 public:
  using Clock = std::function<int64_t()>;  // monotonic milliseconds
  Monitor(std::unique_ptr<Watcher> watcher, MonitorOptions options, Clock clock);

  // Reads the configuration files (every "*.json" in the configuration
  // folder under the root), watches the folders that are new and stops
  // watching those that went. A folder that does not exist, is a symbolic
  // link or cannot be watched is left out with a log line; the others
  // stand.
  void Reload();

  // One round; returns the clock time when the next is due, or -1 when only
  // the watcher's descriptor can bring one.
  int64_t Step();

  // Writes every line made so far (at a stop).
  void Drain();

  // {"backend", "folders", "watches", "watch_limit", "unwatched", "events",
  //  "lines", "events_per_second", "overflows", "skipped_names",
  //  "network_folders", "errors"}
  Json::Value Status() const;

  Watcher& watcher() { return *watcher_; }

 private:
  void WriteLines();

  std::unique_ptr<Watcher> watcher_;
  MonitorOptions options_;
  Clock clock_;
  EventRouter router_;
  std::set<std::string> watched_;                 // roots given to the watcher
  std::map<std::string, int64_t> network_due_;    // folder -> next reindex
  std::map<std::string, int64_t> rescan_due_;     // unwatched folder -> next rescan
  std::map<std::string, std::string> unwritten_;  // queue -> lines not yet written
  size_t unwritten_bytes_ = 0;
  int64_t written_at_ms_ = -1000000;  // the last write of lines
  bool limit_notified_ = false;       // the administrators were told
  std::vector<std::string> errors_;   // the last ones
  // Events per second: the count at the start of the current second.
  int64_t rate_at_ms_ = 0;
  uint64_t rate_events_ = 0;
  double rate_ = 0;
};

}  // namespace vellis::monitord
