#include "daemons/fileindexd/share_worker.h"

#include <poll.h>
#include <sys/eventfd.h>
#include <sys/inotify.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>

#include "common/error.h"
#include "common/fs_util.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/queue_mgr.h"
#include "sdk/platform.h"
#include "sdk/share.h"

namespace vellis::fileindexd {
namespace {

constexpr size_t kErrorsKept = 20;

void Log(int priority, const std::string& text) {
  sdk::GetPlatform()->Syslog(priority, "fileindexd: " + text);
}

// Bytes of the regular file at `path`; 0 when there is none.
int64_t FileBytes(const std::string& path) {
  struct stat st;
  return lstat(path.c_str(), &st) == 0 && S_ISREG(st.st_mode) ? st.st_size : 0;
}

// A queue that keeps growing is taken after this many settle times at most.
constexpr int64_t kMaxSettles = 10;

}  // namespace

ShareWorker::ShareWorker(const std::string& share, WorkerOptions options, const PauseGate& gate,
                         Clock clock)
    : share_(share),
      queue_path_(sdk::SDKShare(share).GetQueuePath()),
      options_(std::move(options)),
      gate_(gate),
      clock_(std::move(clock)) {}

ShareWorker::~ShareWorker() { Stop(); }

WorkerStatus ShareWorker::status() const {
  std::lock_guard<std::mutex> lock(mu_);
  return status_;
}

void ShareWorker::SetState(const std::string& state) {
  std::lock_guard<std::mutex> lock(mu_);
  status_.state = state;
}

int64_t ShareWorker::QueueBytes() const {
  return FileBytes(queue_path_) + FileBytes(queue_path_ + ".tmp");
}

int64_t ShareWorker::HeldUntil(bool* share_paused) const {
  *share_paused = share_paused_;
  const int64_t until = gate_.HeldUntilMs();
  if (until == 0) return -1;
  if (until > clock_()) return until;
  return share_paused_ ? -1 : 0;
}

int64_t ShareWorker::Step() {
  const int64_t now = clock_();
  const int64_t bytes = QueueBytes();
  if (!has_work_ && bytes > 0) {
    has_work_ = true;
    work_seen_ms_ = now;
    quiet_since_ms_ = now;
  } else if (bytes != queue_bytes_) {
    quiet_since_ms_ = now;  // still growing: the burst goes on
  }
  queue_bytes_ = bytes;
  if (!has_work_) {
    SetState("idle");
    return -1;
  }
  // The settle time counts from the last growth, but a queue that never
  // stops growing is taken all the same.
  const int64_t due = std::min(quiet_since_ms_ + options_.settle_ms,
                               work_seen_ms_ + kMaxSettles * options_.settle_ms);
  if (now < due) return due;
  bool share_paused = false;
  if (const int64_t held = HeldUntil(&share_paused); held != 0) {
    SetState("paused");
    return held;
  }
  if (now < retry_at_ms_) return retry_at_ms_;
  RunRound();
  const int64_t after = clock_();
  if (stop_ || share_paused_) return -1;  // a wake-up brings the next step
  if (retry_at_ms_ > after) return retry_at_ms_;
  // Lines that came during the round settle like a new burst.
  queue_bytes_ = QueueBytes();
  has_work_ = queue_bytes_ > 0;
  work_seen_ms_ = quiet_since_ms_ = after;
  return has_work_ ? after + options_.settle_ms : -1;
}

void ShareWorker::BetweenBatches(fileindex::Indexer& indexer) {
  const int64_t now = clock_();
  {
    std::lock_guard<std::mutex> lock(mu_);
    status_.round = indexer.stats();
    const bool crawling = !status_.round.crawling.empty();
    status_.state = crawling ? "crawling" : "processing";
    const double seconds = std::max<int64_t>(now - status_.round_started_ms, 1) / 1000.0;
    status_.crawl_rate = static_cast<double>(status_.round.crawled) / seconds;
  }
  // The pause holds between batches; a stop ends the round here.
  for (;;) {
    if (stop_) throw Interrupted();
    bool share_paused = false;
    const int64_t held = HeldUntil(&share_paused);
    if (held == 0) break;
    SetState("paused");
    std::unique_lock<std::mutex> lock(mu_);
    const int64_t wait_ms = held < 0 ? 1000 : std::min<int64_t>(held - clock_(), 1000);
    cv_.wait_for(lock, std::chrono::milliseconds(std::max<int64_t>(wait_ms, 1)));
  }
}

void ShareWorker::RunRound() {
  const int64_t started = clock_();
  {
    std::lock_guard<std::mutex> lock(mu_);
    status_.state = "processing";
    status_.round = {};
    status_.round_started_ms = started;
  }
  std::unique_ptr<fileindex::Indexer> indexer;
  try {
    fileindex::FolderMgr folders;
    share_paused_ = false;
    bool any = false, all_paused = true;
    for (const auto& f : folders.GetFolders()) {
      if (f->GetShare() != share_) continue;
      any = true;
      all_paused = all_paused && f->IsPaused();
    }
    if (any && all_paused) {  // the share is paused: its queue waits
      share_paused_ = true;
      SetState("paused");
      return;
    }
    fileindex::QueueMgr queue(queue_path_);
    indexer = std::make_unique<fileindex::Indexer>(share_, folders, options_.indexer);
    indexer->SetBatchHook([this, &indexer] { BetweenBatches(*indexer); });
    const unsigned ops = queue.ProcessOP(
        [&](std::shared_ptr<fileindex::OP> op) {
          if (any) indexer->Execute(*op);  // without folders, the queue only drains
        },
        true);
    indexer->Finish();
    queue.DeleteTmp();
    retry_delay_ms_ = 0;
    retry_at_ms_ = 0;
    std::lock_guard<std::mutex> lock(mu_);
    status_.round = indexer->stats();
    status_.round.crawling.clear();
    status_.round_duration_ms = clock_() - started;
    ++status_.rounds;
    status_.state = "idle";
    for (const std::string& e : status_.round.errors) status_.errors.push_back(e);
    while (status_.errors.size() > kErrorsKept) status_.errors.pop_front();
    if (ops > 0) {
      Log(LOG_INFO, share_ + ": round of " + std::to_string(ops) + " operations in " +
                        std::to_string(status_.round_duration_ms) + " ms, " +
                        std::to_string(status_.round.failed) + " failed");
    }
  } catch (const Interrupted&) {
    // Stopping: what was sent is committed; the side file keeps the rest.
    // The hook would throw again after the last flush, before the commit.
    try {
      if (indexer) {
        indexer->SetBatchHook(nullptr);
        indexer->Finish();
      }
    } catch (const Error& e) {
      Log(LOG_ERR, share_ + ": commit at stop failed: code=" + std::to_string(e.GetCode()) +
                       ", reason=" + e.what());
    }
    SetState("idle");
  } catch (const Error& e) {
    // The side file stays; the round is tried again later.
    retry_delay_ms_ = retry_delay_ms_ == 0 ? options_.first_retry_ms
                                           : std::min(retry_delay_ms_ * 2, options_.max_retry_ms);
    retry_at_ms_ = clock_() + retry_delay_ms_;
    const bool unreachable = e.GetCode() == kErrDaemonUnreachable;
    std::lock_guard<std::mutex> lock(mu_);
    status_.state = unreachable ? "waiting for the search daemon" : "retrying";
    status_.errors.push_back("round failed: code=" + std::to_string(e.GetCode()) +
                             ", reason=" + e.what());
    while (status_.errors.size() > kErrorsKept) status_.errors.pop_front();
    Log(LOG_ERR, share_ + ": round failed, retry in " + std::to_string(retry_delay_ms_) +
                     " ms: code=" + std::to_string(e.GetCode()) + ", reason=" + e.what());
  }
}

void ShareWorker::Start() {
  MakeDirs(Dirname(queue_path_));
  wake_fd_ = eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK);
  inotify_fd_ = inotify_init1(IN_CLOEXEC | IN_NONBLOCK);
  if (inotify_fd_ < 0 ||
      inotify_add_watch(inotify_fd_, Dirname(queue_path_).c_str(),
                        IN_MODIFY | IN_CLOSE_WRITE | IN_CREATE | IN_MOVED_TO) < 0) {
    Log(LOG_ERR, share_ + ": cannot watch " + Dirname(queue_path_) + "; looking every second");
  }
  thread_ = std::thread([this] { Loop(); });
}

void ShareWorker::Loop() {
  while (!stop_) {
    const int64_t due = Step();
    if (stop_) break;
    int timeout = -1;
    if (due >= 0) timeout = static_cast<int>(std::clamp<int64_t>(due - clock_(), 0, 60 * 1000));
    if (inotify_fd_ < 0 && (timeout < 0 || timeout > 1000)) timeout = 1000;
    pollfd fds[2] = {{wake_fd_, POLLIN, 0}, {inotify_fd_, POLLIN, 0}};
    if (poll(fds, inotify_fd_ >= 0 ? 2 : 1, timeout) > 0) {
      uint64_t count;
      (void)!read(wake_fd_, &count, sizeof(count));
      // Any change in the queue's folder is worth a look; Step decides.
      char buf[4096];
      while (inotify_fd_ >= 0 && read(inotify_fd_, buf, sizeof(buf)) > 0) {
      }
    }
  }
}

void ShareWorker::Wake() {
  share_paused_ = false;
  cv_.notify_all();
  if (wake_fd_ >= 0) {
    const uint64_t one = 1;
    (void)!write(wake_fd_, &one, sizeof(one));
  }
}

void ShareWorker::Stop() {
  stop_ = true;
  Wake();
  if (thread_.joinable()) thread_.join();
  if (wake_fd_ >= 0) close(wake_fd_);
  if (inotify_fd_ >= 0) close(inotify_fd_);
  wake_fd_ = inotify_fd_ = -1;
}

}  // namespace vellis::fileindexd
