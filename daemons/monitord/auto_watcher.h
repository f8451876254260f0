// The backend that "auto" chooses: each root on a whole-file-system mark
// where the kernel, the privileges and the file system allow it (no limit
// on folders), else on recursive inotify. One descriptor (an epoll set over
// both) serves the caller's poll.
#pragma once

#include <memory>
#include <set>
#include <string>
#include <vector>

#include "daemons/monitord/fanotify_watcher.h"
#include "daemons/monitord/inotify_watcher.h"

namespace vellis::monitord {

class AutoWatcher : public Watcher {
 public:
  // Null with the reason when neither backend can run; `why` also says why
  // fanotify was passed over when it was.
  static std::unique_ptr<AutoWatcher> Create(std::string* why);
  ~AutoWatcher() override;

  // "fanotify", "inotify", or "fanotify+inotify" after the roots are added.
  std::string Name() const override;
  bool AddTree(const std::string& root) override;
  void RemoveTree(const std::string& root) override;
  int fd() const override { return epoll_fd_; }
  void Read(std::vector<FsEvent>* out) override;
  std::vector<std::string> TakeUnwatched() override;
  WatcherStats stats() const override;

 private:
  AutoWatcher(std::unique_ptr<FanotifyWatcher> fan, std::unique_ptr<InotifyWatcher> ino,
              int epoll_fd);

  std::unique_ptr<FanotifyWatcher> fan_;  // null where fanotify cannot run
  std::unique_ptr<InotifyWatcher> ino_;
  int epoll_fd_;
  std::set<std::string> on_fan_, on_ino_;
};

}  // namespace vellis::monitord
