// A fixed set of threads that run submitted tasks in order of submission.
#pragma once

#include <condition_variable>
#include <deque>
#include <functional>
#include <mutex>
#include <thread>
#include <vector>

namespace vellis::daemon {

class WorkerPool {
 public:
  // Starts `threads` threads (at least one).
  explicit WorkerPool(int threads);
  // Runs what was submitted and not yet started, then joins the threads.
  ~WorkerPool();
  WorkerPool(const WorkerPool&) = delete;
  WorkerPool& operator=(const WorkerPool&) = delete;

  // Queues `task`; a free thread runs it. Tasks must not throw.
  void Submit(std::function<void()> task);

 private:
  void Work();

  std::mutex mu_;
  std::condition_variable cv_;
  std::deque<std::function<void()>> tasks_;
  bool stopping_ = false;
  std::vector<std::thread> threads_;
};

}  // namespace vellis::daemon
