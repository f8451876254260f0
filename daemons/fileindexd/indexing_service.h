// The indexing daemon's state and its command channel: the daemon-wide
// pause, one worker per share with indexed folders, and the answers to the
// commands that the library sends (docs/fileindexd.md).
//
// A command is {"type": name, "data": argument}; the answer is
// {"success": true[, "data": ...]} or {"success": false, "error": {"code",
// "msg"}}. Commands that change something are taken only from root or an
// administrator (the peer's credentials); "status" from anyone.
//
// Thread-safe: commands arrive on the server's worker threads.
#pragma once

#include <json/json.h>

#include <map>
#include <memory>
#include <mutex>
#include <string>

#include "daemons/common/peer.h"
#include "daemons/fileindexd/share_worker.h"

namespace vellis::fileindexd {

// The command socket; resolve with RootPath() at use.
inline constexpr char kCommandSocketPath[] = "/var/run/fileindexd.sock";

class IndexingService : public PauseGate {
 public:
  // `run_threads` false: workers are made but not started (tests step them).
  IndexingService(WorkerOptions options, ShareWorker::Clock clock, bool run_threads = true);
  // Stops every worker: each commits what it sent, its side file keeps the
  // rest.
  ~IndexingService() override;

  // Takes the pause from the status file and starts a worker for each share
  // with indexed folders. Failures are logged; the daemon runs on.
  void Load();

  // The answer text to one command text. Never throws.
  std::string Handle(const std::string& text, const daemon::Peer& peer);

  // The "status" answer's data.
  Json::Value Status();

  int64_t HeldUntilMs() const override;

  // The worker of `share`, or null (tests).
  ShareWorker* Worker(const std::string& share);

 private:
  Json::Value Run(const std::string& type, const Json::Value& data, const daemon::Peer& peer);
  void Pause(int64_t resume_time);
  void EnsureWorker(const std::string& share);
  void DropWorker(const std::string& share);
  void WakeAll();

  WorkerOptions options_;
  ShareWorker::Clock clock_;
  bool run_threads_;
  mutable std::mutex mu_;
  int64_t resume_ms_ = -1;  // HeldUntilMs
  std::map<std::string, std::unique_ptr<ShareWorker>> workers_;
};

}  // namespace vellis::fileindexd
