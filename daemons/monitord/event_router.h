// Turns the watcher's events into queue lines: which share's queue a change
// goes to, with which event bits, honouring each folder's mask and ignore
// list. Pure: events and times in, lines out; the daemon does the I/O.
//
// A line is {"event": <bit>, "is_dir": <bool>, "path": "..."} (a rename adds
// "path_old"), one change per line:
// - created 0x40 and deleted 0x80, with is_dir;
// - content written 0x2: once per file per burst: when a file written to is
//   closed, or, for a file kept open, modify_flush_ms after the first write;
// - attributes 0x4;
// - a rename within the watched folders of one queue: one 0x100 line with
//   path_old; out of them: a delete; into them: a create (a folder moved in
//   is a created folder, which the indexer crawls); across two queues: a
//   delete in one and a create in the other. The half that leaves waits
//   move_grace_ms for the half that arrives.
// - the kernel's overflow: the crash marker 0x200 in every queue that may
//   have lost events.
//
// A name that is not UTF-8 cannot be written as a JSON string: its change
// is left out and counted, with a notice once per folder. A rename between
// such a name and a valid one becomes the create or the delete of the valid
// one, so the index never keeps a stale document for it.
#pragma once

#include <cstdint>
#include <deque>
#include <map>
#include <set>
#include <string>
#include <vector>

#include "daemons/monitord/monitor_config.h"
#include "daemons/monitord/watcher.h"

namespace vellis::monitord {

struct RouterOptions {
  int64_t move_grace_ms = 50;
  int64_t modify_flush_ms = 1000;
};

struct RouterStats {
  uint64_t events = 0;         // watcher events taken
  uint64_t lines = 0;          // queue lines made
  uint64_t skipped_names = 0;  // changes left out: a name that is not UTF-8
  uint64_t overflows = 0;      // kernel overflows seen
};

class EventRouter {
 public:
  explicit EventRouter(RouterOptions options = {});

  // The folders to route to; events outside them are dropped.
  void SetFolders(std::vector<WatchedFolder> folders);
  const std::vector<WatchedFolder>& folders() const { return folders_; }

  // One event at time `now_ms` (any monotonic milliseconds).
  void Take(const FsEvent& event, int64_t now_ms);

  // Emits what has waited long enough: unpaired rename halves, files still
  // open after their first write. Returns when the next flush is due, or -1
  // when nothing waits.
  int64_t Flush(int64_t now_ms);

  // A reindex line (0x10000) for `path`, whatever the folder's mask: a
  // folder that cannot be watched and is rescanned instead, or one on a
  // file system that reports nothing. False when no folder covers it.
  bool Reindex(const std::string& path);

  // The crash marker in the queue of every folder at or below `root`, or in
  // every queue when `root` is "".
  void CrashMarker(const std::string& root);

  // The lines made so far, per queue file, in order; forgotten by the call.
  std::map<std::string, std::string> TakeLines();
  // Messages for the log (e.g. the first skipped name of a folder).
  std::vector<std::string> TakeNotices();

  const RouterStats& stats() const { return stats_; }

 private:
  struct PendingMove {
    uint32_t cookie;
    std::string path;
    bool is_dir;
    int64_t at_ms;
  };
  // The deepest folder covering `path` whose ignore list lets it in; null
  // when none does.
  const WatchedFolder* Route(const std::string& path) const;
  // The line of one change, when the folder's mask has the bit and the
  // names are UTF-8. False when it was left out.
  bool Emit(uint32_t bit, const std::string& path, bool is_dir, const std::string& path_old = "",
            bool masked = true);
  bool Valid(const std::string& path);
  void Moved(const std::string& from, const std::string& to, bool is_dir);
  // Emits at once the halves still waiting whose name is `path`, above or
  // below it: a name reused within the grace must not see the delete of
  // what left it come after the lines of what now sits there.
  void SettleMovesAt(const std::string& path);

  RouterOptions options_;
  std::vector<WatchedFolder> folders_;
  std::deque<PendingMove> moves_;
  std::map<std::string, int64_t> written_;  // files written and not yet reported
  std::map<std::string, std::string> lines_;
  std::vector<std::string> notices_;
  std::set<std::string> noticed_dirs_;
  RouterStats stats_;
};

}  // namespace vellis::monitord
