// The inotify backend: a watch on every folder below the roots. A folder
// that appears is watched first and read after, and what it already holds
// is reported as created, so nothing made in between is missed. When the
// kernel's watch limit is reached, the folders left unwatched are handed
// out by TakeUnwatched() for rescans.
//
// Not thread-safe: one thread drives it.
#pragma once

#include <map>
#include <memory>
#include <string>
#include <unordered_map>
#include <vector>

#include "daemons/monitord/watcher.h"

namespace vellis::monitord {

class InotifyWatcher : public Watcher {
 public:
  // Null with the reason when the kernel gives no inotify instance.
  static std::unique_ptr<InotifyWatcher> Create(std::string* why);
  ~InotifyWatcher() override;

  std::string Name() const override { return "inotify"; }
  bool AddTree(const std::string& root) override;
  void RemoveTree(const std::string& root) override;
  int fd() const override { return fd_; }
  void Read(std::vector<FsEvent>* out) override;
  std::vector<std::string> TakeUnwatched() override;
  WatcherStats stats() const override;

 private:
  explicit InotifyWatcher(int fd);
  // Watches `dir` and every folder below it; with `report`, reports each
  // name found as created (a folder that appeared with content).
  void AddDir(const std::string& dir, bool report, std::vector<FsEvent>* out);
  // Forgets the watches at and below `dir`; with `remove`, tells the kernel.
  void DropDir(const std::string& dir, bool remove);
  // The watches at and below `from` now sit at `to` (a folder renamed).
  void MoveDir(const std::string& from, const std::string& to);

  int fd_;
  std::unordered_map<int, std::string> paths_;  // watch -> folder
  std::map<std::string, int> watches_;          // folder -> watch
  std::vector<std::string> roots_;
  std::vector<std::string> unwatched_;
  uint64_t unwatched_count_ = 0;
};

}  // namespace vellis::monitord
