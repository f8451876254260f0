#include "daemons/monitord/monitor.h"

#include <dirent.h>
#include <sys/stat.h>
#include <sys/statfs.h>
#include <syslog.h>

#include <algorithm>
#include <fstream>
#include <sstream>

#include "common/error.h"
#include "common/root_path.h"
#include "fileindex/util.h"
#include "sdk/linux/file_systems.h"
#include "sdk/linux/monitor_queues.h"
#include "sdk/platform.h"

namespace vellis::monitord {
namespace {

constexpr size_t kErrorsKept = 20;
// Lines waiting beyond this are written at once.
constexpr size_t kWriteBytes = 256 * 1024;

void Log(int priority, const std::string& text) { sdk::GetPlatform()->Syslog(priority, text); }

bool OnUnreportedFs(const std::string& path) {
  struct statfs fs;
  if (statfs(path.c_str(), &fs) != 0) return false;
  return sdk::IsRemoteFsType(sdk::FsTypeFromMagic(static_cast<uint64_t>(fs.f_type), path));
}

std::string ReadWhole(const std::string& path) {
  std::ifstream in(path, std::ios::binary);
  std::ostringstream ss;
  ss << in.rdbuf();
  return ss.str();
}

}  // namespace

Monitor::Monitor(std::unique_ptr<Watcher> watcher, MonitorOptions options, Clock clock)
    : watcher_(std::move(watcher)),
      options_(options),
      clock_(std::move(clock)),
      router_(options.router) {
  rate_at_ms_ = clock_();
}

void Monitor::Reload() {
  MonitorConfig config;
  const std::string dir = RootPath(sdk::kMonitorQueueDir);
  if (DIR* d = opendir(dir.c_str())) {
    std::vector<std::string> names;
    while (dirent* e = readdir(d)) {
      const std::string name = e->d_name;
      if (name.size() > 5 && name.compare(name.size() - 5, 5, ".json") == 0) names.push_back(name);
    }
    closedir(d);
    std::sort(names.begin(), names.end());
    for (const std::string& name : names)
      ParseMonitorConfig(name, ReadWhole(dir + "/" + name), &config);
  }
  for (const std::string& e : config.errors) {
    Log(LOG_ERR, "monitord: configuration: " + e);
    errors_.push_back(e);
  }
  // Folders that can be watched; the others are left out with their reason.
  std::vector<WatchedFolder> usable;
  std::set<std::string> roots;
  for (WatchedFolder& f : config.folders) {
    struct stat st;
    std::string why;
    if (lstat(f.path.c_str(), &st) != 0) {
      why = "does not exist";
    } else if (S_ISLNK(st.st_mode)) {
      why = "is a symbolic link";
    } else if (!S_ISDIR(st.st_mode)) {
      why = "is not a folder";
    } else if (!roots.count(f.path) && !watcher_->AddTree(f.path)) {
      // Also for a folder already watched: one deleted and made again since
      // is watched anew.
      why = std::string("cannot be watched: ") + strerror(errno);
    }
    if (!why.empty()) {
      Log(LOG_WARNING, "monitord: folder " + f.path + " " + why + "; not watched");
      errors_.push_back(f.path + " " + why);
      continue;
    }
    roots.insert(f.path);
    if (OnUnreportedFs(f.path) && !network_due_.count(f.path)) {
      network_due_[f.path] = clock_() + options_.network_reindex_ms;
      Log(LOG_NOTICE, "monitord: " + f.path +
                          " is on a file system that does not report changes; reindexed every " +
                          std::to_string(options_.network_reindex_ms / 1000) + " s");
    }
    usable.push_back(std::move(f));
  }
  for (const std::string& old : watched_) {
    if (!roots.count(old)) {
      watcher_->RemoveTree(old);
      network_due_.erase(old);
    }
  }
  watched_ = roots;
  router_.SetFolders(std::move(usable));
  if (errors_.size() > kErrorsKept) errors_.erase(errors_.begin(), errors_.end() - kErrorsKept);
}

int64_t Monitor::Step() {
  const int64_t now = clock_();
  std::vector<FsEvent> events;
  watcher_->Read(&events);
  for (const FsEvent& e : events) router_.Take(e, now);
  int64_t due = router_.Flush(now);
  auto sooner = [&due](int64_t at) {
    if (at >= 0 && (due < 0 || at < due)) due = at;
  };

  for (const std::string& dir : watcher_->TakeUnwatched()) {
    if (rescan_due_.emplace(dir, now).second) {
      Log(LOG_WARNING, "monitord: watch limit reached: " + dir +
                           " is rescanned instead of watched (raise fs.inotify.max_user_watches)");
      router_.CrashMarker(dir);
      if (!limit_notified_) {
        fileindex::NotifyWatchLimit();  // once: the log says the rest
        limit_notified_ = true;
      }
    }
  }
  for (auto& [dir, at] : rescan_due_) {
    if (now >= at) {
      router_.Reindex(dir);
      at = now + options_.rescan_ms;
    }
    sooner(at);
  }
  for (auto& [dir, at] : network_due_) {
    if (now >= at) {
      router_.Reindex(dir);
      at = now + options_.network_reindex_ms;
    }
    sooner(at);
  }
  for (const std::string& n : router_.TakeNotices()) Log(LOG_NOTICE, "monitord: " + n);
  // Under a stream of changes the lines of a few milliseconds go in one
  // write: reading the kernel's queue promptly matters more than writing
  // each line at once.
  for (auto& [queue, lines] : router_.TakeLines()) {
    unwritten_[queue] += lines;
    unwritten_bytes_ += lines.size();
  }
  if (!unwritten_.empty()) {
    const bool due =
        now - written_at_ms_ >= options_.write_every_ms || unwritten_bytes_ >= kWriteBytes;
    if (due) {
      WriteLines();
      written_at_ms_ = now;
    }
    // Lines left after a write could not be written: tried again in a
    // second, not at the pace of the batching.
    if (!unwritten_.empty()) sooner(due ? now + 1000 : written_at_ms_ + options_.write_every_ms);
  }

  if (now - rate_at_ms_ >= 1000) {
    rate_ = static_cast<double>(router_.stats().events - rate_events_) * 1000.0 /
            static_cast<double>(now - rate_at_ms_);
    rate_at_ms_ = now;
    rate_events_ = router_.stats().events;
  }
  return due;
}

void Monitor::Drain() {
  for (auto& [queue, lines] : router_.TakeLines()) {
    unwritten_[queue] += lines;
    unwritten_bytes_ += lines.size();
  }
  WriteLines();
}

void Monitor::WriteLines() {
  for (auto it = unwritten_.begin(); it != unwritten_.end();) {
    try {
      fileindex::AppendQueueLines(it->first, it->second);
      unwritten_bytes_ -= it->second.size();
      it = unwritten_.erase(it);
    } catch (const Error& e) {
      // Kept for the next step: a queue folder being recreated, a full disk.
      const std::string what = it->first + ": " + e.what();
      if (errors_.empty() || errors_.back() != what) {
        Log(LOG_ERR, "monitord: cannot append to " + what);
        errors_.push_back(what);
        if (errors_.size() > kErrorsKept) errors_.erase(errors_.begin());
      }
      ++it;
    }
  }
}

Json::Value Monitor::Status() const {
  const WatcherStats ws = watcher_->stats();
  const RouterStats& rs = router_.stats();
  Json::Value s(Json::objectValue);
  s["backend"] = watcher_->Name();
  s["folders"] = Json::Value(Json::arrayValue);
  for (const std::string& f : watched_) s["folders"].append(f);
  s["watches"] = static_cast<Json::UInt64>(ws.watches);
  s["watch_limit"] = static_cast<Json::UInt64>(ws.watch_limit);
  s["unwatched"] = static_cast<Json::UInt64>(ws.unwatched);
  s["events"] = static_cast<Json::UInt64>(rs.events);
  s["lines"] = static_cast<Json::UInt64>(rs.lines);
  s["events_per_second"] = rate_;
  s["overflows"] = static_cast<Json::UInt64>(rs.overflows);
  s["skipped_names"] = static_cast<Json::UInt64>(rs.skipped_names);
  s["network_folders"] = Json::Value(Json::arrayValue);
  for (const auto& [f, at] : network_due_) s["network_folders"].append(f);
  s["errors"] = Json::Value(Json::arrayValue);
  for (const std::string& e : errors_) s["errors"].append(e);
  return s;
}

}  // namespace vellis::monitord
