// Helpers of the file-change monitor's benchmark (monitord_bench.cpp): the
// built vellis-monitord as a child process, its status file, its queue file
// read as it grows, and what /proc tells of its memory.
#pragma once

#include <fcntl.h>
#include <json/json.h>
#include <signal.h>
#include <sys/prctl.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <fstream>
#include <sstream>
#include <stdexcept>
#include <string>
#include <vector>

#include "bench/fileindexd_bench_util.h"
#include "common/json_util.h"
#include "common/root_path.h"
#include "sdk/linux/monitor_queues.h"

namespace vellis::bench {

// A field of /proc/<pid>/status in KiB ("VmRSS", "VmHWM"); 0 when unknown.
inline uint64_t ProcStatusKiB(pid_t pid, const std::string& field) {
  if (pid <= 0) return 0;
  std::ifstream in("/proc/" + std::to_string(pid) + "/status");
  const std::string key = field + ":";
  for (std::string line; std::getline(in, line);) {
    if (line.rfind(key, 0) == 0) return std::stoull(line.substr(key.size()));
  }
  return 0;
}

inline std::string ReadText(const std::string& path) {
  std::ifstream in(path, std::ios::binary);
  std::ostringstream ss;
  ss << in.rdbuf();
  return ss.str();
}

// The p-th percentile (0..100, nearest rank) of `v`; 0 when empty.
inline double Percentile(std::vector<double> v, double p) {
  if (v.empty()) return 0;
  std::sort(v.begin(), v.end());
  size_t rank = static_cast<size_t>(p / 100.0 * static_cast<double>(v.size()) + 0.999999);
  rank = std::min(std::max<size_t>(rank, 1), v.size());
  return v[rank - 1];
}

// vellis-monitord -f as a child process, its standard error in a log file.
// It has no socket: it is ready when its status file shows the folder
// watched with enough watches.
class MonitorProcess : public ChildProcess {
 public:
  void Start(const std::string& bin, const std::vector<std::string>& args, const std::string& log) {
    unlink(StatusPath().c_str());  // no stale status from an earlier run
    Spawn(bin, args, log);
  }

  static std::string StatusPath() { return RootPath(sdk::kMonitorStatusFile); }

  // The last status the monitor wrote; null when there is none yet.
  Json::Value Status() const {
    Json::Value s;
    if (!JsonFromString(s, ReadText(StatusPath()))) return Json::Value();
    return s;
  }

  // Waits until the status lists `folder` and at least `watches` watches.
  // Throws when the monitor exits, when folders are left unwatched (the
  // watch limit) or after `timeout_s`. Returns the status.
  Json::Value WaitReady(const std::string& folder, uint64_t watches, double timeout_s) {
    const Clock::time_point start = Clock::now();
    for (;; Sleep(20)) {
      CheckAlive();
      const Json::Value s = Status();
      bool listed = false;
      for (const Json::Value& f : s["folders"]) listed = listed || f.asString() == folder;
      if (listed && s["watches"].asUInt64() >= watches) return s;
      if (s["unwatched"].asUInt64() > 0) {
        throw std::runtime_error("monitor left " + s["unwatched"].asString() +
                                 " folders unwatched (watch limit " + s["watch_limit"].asString() +
                                 ")");
      }
      if (SecondsSince(start) > timeout_s) {
        throw std::runtime_error("monitor not ready after " + std::to_string(timeout_s) +
                                 " s; status: " + JsonToString(s) + "; see " + log_);
      }
    }
  }
};

// A queue file read as the monitor appends to it: only whole lines are
// handed out. The file may not exist yet.
class QueueTail {
 public:
  explicit QueueTail(std::string path) : path_(std::move(path)) {}
  ~QueueTail() {
    if (fd_ >= 0) close(fd_);
  }
  QueueTail(const QueueTail&) = delete;
  QueueTail& operator=(const QueueTail&) = delete;

  // Appends the whole lines written since the last call to `out` (with
  // their newlines); returns how many bytes it appended.
  size_t Read(std::string* out) {
    if (fd_ < 0) fd_ = open(path_.c_str(), O_RDONLY | O_CLOEXEC);
    if (fd_ < 0) return 0;
    char buf[1 << 16];
    for (;;) {
      const ssize_t n = pread(fd_, buf, sizeof(buf), offset_);
      if (n <= 0) break;
      offset_ += n;
      partial_.append(buf, static_cast<size_t>(n));
    }
    const size_t end = partial_.rfind('\n');
    if (end == std::string::npos) return 0;
    out->append(partial_, 0, end + 1);
    partial_.erase(0, end + 1);
    return end + 1;
  }

 private:
  std::string path_;
  int fd_ = -1;
  off_t offset_ = 0;
  std::string partial_;
};

// fs.inotify.max_user_watches raised for the run when it is too low, and put
// back as it was.
class WatchLimit {
 public:
  static constexpr char kPath[] = "/proc/sys/fs/inotify/max_user_watches";
  WatchLimit() { original_ = Read(); }
  ~WatchLimit() {
    if (raised_) Write(original_);
  }
  static uint64_t Read() {
    uint64_t v = 0;
    std::ifstream(kPath) >> v;
    return v;
  }
  uint64_t original() const { return original_; }
  // True when the limit is at least `want` (raised if need be).
  bool Ensure(uint64_t want) {
    if (Read() >= want) return true;
    if (!Write(want)) return false;
    raised_ = true;
    return Read() >= want;
  }
  bool raised() const { return raised_; }

 private:
  static bool Write(uint64_t v) {
    std::ofstream out(kPath);
    out << v << "\n";
    return static_cast<bool>(out.flush());
  }
  uint64_t original_ = 0;
  bool raised_ = false;
};

}  // namespace vellis::bench
