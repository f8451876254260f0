#include "daemons/monitord/auto_watcher.h"

#include <sys/epoll.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

namespace vellis::monitord {

std::unique_ptr<AutoWatcher> AutoWatcher::Create(std::string* why) {
  std::string fan_why, ino_why;
  std::unique_ptr<FanotifyWatcher> fan = FanotifyWatcher::Create(&fan_why);
  std::unique_ptr<InotifyWatcher> ino = InotifyWatcher::Create(&ino_why);
  if (!ino) {
    *why = ino_why;
    return nullptr;
  }
  const int epoll_fd = epoll_create1(EPOLL_CLOEXEC);
  if (epoll_fd < 0) {
    *why = std::string("epoll_create1: ") + strerror(errno);
    return nullptr;
  }
  for (Watcher* w : {static_cast<Watcher*>(fan.get()), static_cast<Watcher*>(ino.get())}) {
    if (!w) continue;
    epoll_event ev = {};
    ev.events = EPOLLIN;
    ev.data.fd = w->fd();
    epoll_ctl(epoll_fd, EPOLL_CTL_ADD, w->fd(), &ev);
  }
  *why = fan ? "" : "fanotify passed over: " + fan_why;
  return std::unique_ptr<AutoWatcher>(new AutoWatcher(std::move(fan), std::move(ino), epoll_fd));
}

AutoWatcher::AutoWatcher(std::unique_ptr<FanotifyWatcher> fan, std::unique_ptr<InotifyWatcher> ino,
                         int epoll_fd)
    : fan_(std::move(fan)), ino_(std::move(ino)), epoll_fd_(epoll_fd) {}

AutoWatcher::~AutoWatcher() { close(epoll_fd_); }

std::string AutoWatcher::Name() const {
  if (!on_fan_.empty() && !on_ino_.empty()) return "fanotify+inotify";
  if (!on_fan_.empty()) return "fanotify";
  if (on_ino_.empty() && fan_) return "fanotify";
  return "inotify";
}

bool AutoWatcher::AddTree(const std::string& root) {
  if (fan_ && fan_->AddTree(root)) {
    on_fan_.insert(root);
    return true;
  }
  // A file system that refuses the mark (overlayfs), or no fanotify.
  if (!ino_->AddTree(root)) return false;
  on_ino_.insert(root);
  return true;
}

void AutoWatcher::RemoveTree(const std::string& root) {
  if (on_fan_.erase(root)) fan_->RemoveTree(root);
  if (on_ino_.erase(root)) ino_->RemoveTree(root);
}

void AutoWatcher::Read(std::vector<FsEvent>* out) {
  // Drains the set's readiness; each backend reads what it has.
  epoll_event evs[2];
  while (epoll_wait(epoll_fd_, evs, 2, 0) > 0) {
    if (fan_) fan_->Read(out);
    ino_->Read(out);
    break;
  }
}

std::vector<std::string> AutoWatcher::TakeUnwatched() { return ino_->TakeUnwatched(); }

WatcherStats AutoWatcher::stats() const {
  WatcherStats s = ino_->stats();
  if (fan_) s.watches += fan_->stats().watches;
  if (on_ino_.empty()) s.watch_limit = 0;
  return s;
}

}  // namespace vellis::monitord
