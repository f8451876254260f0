// A watcher that reports what the test tells it to, for driving the monitor
// without the kernel.
#pragma once

#include <sys/eventfd.h>
#include <unistd.h>

#include <set>
#include <string>
#include <vector>

#include "daemons/monitord/watcher.h"

namespace vellis::testing {

class FakeWatcher : public monitord::Watcher {
 public:
  FakeWatcher() : fd_(eventfd(0, EFD_NONBLOCK | EFD_CLOEXEC)) {}
  ~FakeWatcher() override { close(fd_); }

  // What the next Read() and TakeUnwatched() hand out.
  std::vector<monitord::FsEvent> events;
  std::vector<std::string> unwatched;
  std::set<std::string> roots;

  std::string Name() const override { return "fake"; }
  bool AddTree(const std::string& root) override {
    roots.insert(root);
    return true;
  }
  void RemoveTree(const std::string& root) override { roots.erase(root); }
  int fd() const override { return fd_; }
  void Read(std::vector<monitord::FsEvent>* out) override {
    out->insert(out->end(), events.begin(), events.end());
    events.clear();
  }
  std::vector<std::string> TakeUnwatched() override {
    std::vector<std::string> out;
    out.swap(unwatched);
    return out;
  }
  monitord::WatcherStats stats() const override { return {roots.size(), 0, 0}; }

 private:
  int fd_;
};

}  // namespace vellis::testing
