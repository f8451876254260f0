// Real kernel events for the monitor's tests: an InotifyWatcher feeding an
// EventRouter on the real clock, pumped by the test thread, and the queue
// lines it makes kept per queue, parsed.
#pragma once

#include <dirent.h>
#include <gtest/gtest.h>
#include <json/json.h>
#include <poll.h>
#include <sys/stat.h>
#include <time.h>

#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <functional>
#include <map>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "common/json_util.h"
#include "daemons/monitord/event_router.h"
#include "daemons/monitord/inotify_watcher.h"

namespace vellis::monitord::testing {

inline int64_t NowMs() {
  timespec ts;
  clock_gettime(CLOCK_MONOTONIC, &ts);
  return static_cast<int64_t>(ts.tv_sec) * 1000 + ts.tv_nsec / 1000000;
}

// One queue line, parsed.
struct Line {
  std::string queue;
  uint32_t event = 0;
  bool is_dir = false;
  std::string path;
  std::string path_old;
};

// Every path at and below `dir` but `dir` itself, folders included, without
// following symbolic links.
inline void WalkTree(const std::string& dir, std::set<std::string>* out) {
  DIR* d = opendir(dir.c_str());
  if (!d) return;
  std::vector<std::string> subdirs;
  while (dirent* e = readdir(d)) {
    const std::string name = e->d_name;
    if (name == "." || name == "..") continue;
    const std::string path = dir + "/" + name;
    out->insert(path);
    struct stat st;
    if (lstat(path.c_str(), &st) == 0 && S_ISDIR(st.st_mode)) subdirs.push_back(path);
  }
  closedir(d);
  for (const std::string& sub : subdirs) WalkTree(sub, out);
}

class WatchHarness {
 public:
  explicit WatchHarness(RouterOptions options = {}) : router_(options) {
    std::string why;
    watcher_ = InotifyWatcher::Create(&why);
    if (!watcher_) ADD_FAILURE() << "no inotify: " << why;
  }

  // Watches `path` (a folder) with every event bit, its lines going to `queue`.
  void Watch(const std::string& path, const std::string& queue) {
    WatchedFolder f;
    f.path = path;
    f.mask = 0xFFFFFFFFu;
    f.queue = queue;
    folders_.push_back(f);
    router_.SetFolders(folders_);
    ASSERT_TRUE(watcher_->AddTree(path)) << path << ": " << strerror(errno);
  }

  // Takes what the kernel has reported, without waiting; returns how many
  // events came.
  size_t Pump() {
    std::vector<FsEvent> events;
    watcher_->Read(&events);
    const int64_t now = NowMs();
    static const bool trace = getenv("VELLIS_MONITOR_TRACE") != nullptr;
    for (const FsEvent& e : events) {
      if (trace) {
        fprintf(stderr, "event %d %s%s cookie=%u\n", static_cast<int>(e.kind), e.path.c_str(),
                e.is_dir ? "/" : "", e.cookie);
      }
      router_.Take(e, now);
    }
    pending_ = router_.Flush(now) >= 0;
    for (auto& [queue, text] : router_.TakeLines()) {
      if (trace) fprintf(stderr, "lines %s:\n%s", queue.c_str(), text.c_str());
      raw_[queue] += text;
      size_t start = 0;
      while (start < text.size()) {
        const size_t end = text.find('\n', start);
        Json::Value v;
        const std::string one = text.substr(start, end - start);
        EXPECT_TRUE(JsonFromString(v, one)) << one;
        Line line;
        line.queue = queue;
        line.event = v["event"].asUInt();
        line.is_dir = v["is_dir"].asBool();
        line.path = v["path"].asString();
        line.path_old = v.get("path_old", "").asString();
        lines_.push_back(line);
        start = end + 1;
      }
    }
    return events.size();
  }

  // Pumps until `done` holds or `timeout_ms` passes; returns `done`'s last value.
  bool WaitFor(const std::function<bool()>& done, int64_t timeout_ms = 5000) {
    const int64_t deadline = NowMs() + timeout_ms;
    for (;;) {
      Pump();
      if (done()) return true;
      if (NowMs() >= deadline) return false;
      pollfd p = {watcher_->fd(), POLLIN, 0};
      poll(&p, 1, 5);
    }
  }

  // Pumps until nothing has come for `quiet_ms` and nothing waits in the
  // router (rename halves, open files). False when that never happens
  // within `timeout_ms`.
  bool Settle(int64_t quiet_ms = 30, int64_t timeout_ms = 5000) {
    const int64_t deadline = NowMs() + timeout_ms;
    int64_t last = NowMs();
    for (;;) {
      if (Pump() > 0) last = NowMs();
      if (!pending_ && NowMs() - last >= quiet_ms) return true;
      if (NowMs() >= deadline) return false;
      pollfd p = {watcher_->fd(), POLLIN, 0};
      poll(&p, 1, 5);
    }
  }

  InotifyWatcher& watcher() { return *watcher_; }
  EventRouter& router() { return router_; }
  const std::vector<Line>& lines() const { return lines_; }
  // The lines of each queue as written, newline-terminated.
  const std::map<std::string, std::string>& raw() const { return raw_; }
  void Clear() {
    lines_.clear();
    raw_.clear();
  }

 private:
  std::unique_ptr<InotifyWatcher> watcher_;
  EventRouter router_;
  std::vector<WatchedFolder> folders_;
  std::vector<Line> lines_;
  std::map<std::string, std::string> raw_;
  bool pending_ = false;
};

}  // namespace vellis::monitord::testing
