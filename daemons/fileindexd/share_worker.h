// One share's worker in the indexing daemon: it sleeps until the share's
// queue grows (inotify on the queue's folder, no polling), lets a burst
// settle (the queue quiet for the settle time, or at most ten settle times
// after it started), then runs a round (QueueMgr::ProcessOP with an Indexer) and
// deletes the side file after the round's last commit. A failed round
// leaves the side file and is retried with a growing delay. A pause (the
// daemon's, or every folder of the share paused) holds the worker between
// batches.
//
// Step() is the worker's logic on an injected clock; Start() runs it on a
// thread of its own. status() may be read from any thread.
#pragma once

#include <atomic>
#include <condition_variable>
#include <cstdint>
#include <deque>
#include <functional>
#include <mutex>
#include <string>
#include <thread>

#include "fileindex/indexer.h"

namespace vellis::fileindexd {

struct WorkerOptions {
  int settle_ms = 1000;       // quiet time after the queue grows
  int first_retry_ms = 1000;  // delay after a failed round, doubled each time
  int max_retry_ms = 60 * 1000;
  fileindex::IndexerOptions indexer;
};

// What holds the workers: the daemon's pause, until a time.
class PauseGate {
 public:
  // Milliseconds of the epoch until which indexing is held; -1 when it is
  // not, 0 when it is held until resumed.
  virtual int64_t HeldUntilMs() const = 0;
  virtual ~PauseGate() = default;
};

struct WorkerStatus {
  std::string state = "idle";  // idle, crawling, processing, paused, waiting for the search daemon,
                               // retrying
  fileindex::IndexerStats round;  // the running round, or the last one
  int64_t round_started_ms = 0;
  int64_t round_duration_ms = 0;  // of the last finished round
  uint64_t rounds = 0;
  double crawl_rate = 0;           // paths per second of the running crawl
  std::deque<std::string> errors;  // the last failures, rounds' and files'
};

class ShareWorker {
 public:
  using Clock = std::function<int64_t()>;  // milliseconds of the epoch

  // Throws Error 800 when the share does not exist.
  ShareWorker(const std::string& share, WorkerOptions options, const PauseGate& gate, Clock clock);
  // Stops the thread (Stop()).
  ~ShareWorker();
  ShareWorker(const ShareWorker&) = delete;
  ShareWorker& operator=(const ShareWorker&) = delete;

  // One step: notices new work, and runs a round when work waits, the
  // settle time has passed, nothing holds the worker and no retry delay
  // runs. Returns the clock time at which the next step is due, or -1 when
  // only new work or a Wake() can bring one.
  int64_t Step();

  // Runs Step() on a thread, sleeping on the queue's folder in between.
  void Start();
  // Asks a running round to stop after its current batch (committed; the
  // side file stays), and joins the thread.
  void Stop();
  // Something changed (pause lifted, settings): step again now, and look
  // at the share's folders again.
  void Wake();

  const std::string& share() const { return share_; }
  const std::string& queue_path() const { return queue_path_; }
  WorkerStatus status() const;

 private:
  struct Interrupted {};
  // Bytes in the live queue and its side file.
  int64_t QueueBytes() const;
  // 0 when nothing holds the worker, else until when (-1: until a wake).
  int64_t HeldUntil(bool* share_paused) const;
  void RunRound();
  void BetweenBatches(fileindex::Indexer& indexer);
  void SetState(const std::string& state);
  void Loop();

  std::string share_;
  std::string queue_path_;
  WorkerOptions options_;
  const PauseGate& gate_;
  Clock clock_;

  bool has_work_ = false;
  int64_t work_seen_ms_ = 0;    // when the waiting work was first seen
  int64_t quiet_since_ms_ = 0;  // when the queue last grew
  int64_t queue_bytes_ = 0;
  int64_t retry_at_ms_ = 0;
  int retry_delay_ms_ = 0;
  std::atomic<bool> share_paused_{false};  // every folder of the share paused

  mutable std::mutex mu_;  // status_ and the wake-ups
  std::condition_variable cv_;
  WorkerStatus status_;
  std::atomic<bool> stop_{false};
  int wake_fd_ = -1;
  int inotify_fd_ = -1;
  std::thread thread_;
};

}  // namespace vellis::fileindexd
