// The server side of the package's one wire, shared by every daemon.
//
// A daemon listens on a Unix-domain stream socket; each connection carries
// one request frame (sdk/frame.h) and gets one answer frame, then the
// server closes it. One thread, the loop, watches every connection with
// epoll: it accepts, reads whatever bytes have arrived, and writes answers
// that did not fit the socket at once. Handlers run on a pool of worker
// threads, never on the loop, so no number of idle, slow or half-sent
// connections, and no long request, delays the reading of a well-formed
// request.
//
// Limits:
// - a request must arrive whole within request_timeout_ms of the accept,
//   or the connection is closed without an answer (a length of 0 or above
//   the maximum, and end of stream inside a frame, close it at once);
// - an answer must be taken by the client within answer_timeout_ms;
// - at most max_connections are open: one more closes the oldest
//   connection that has sent nothing yet, or, when every open connection is
//   busy, is refused; both are logged.
// The peer's credentials (SO_PEERCRED) are read at accept and travel with
// the request, so that a daemon can authorise by uid and group.
//
// Step() runs one round and takes an injected clock, so tests drive the
// loop without threads of their own or real waiting; Run() steps until a
// stop descriptor becomes readable.
//
// Thread safety: Listen, Step, Run and stats() are for one thread (the
// loop's). Handlers and the upkeep run on the workers, one at a time or
// concurrently (they must be thread-safe among themselves).
#pragma once

#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <set>
#include <string>
#include <unordered_map>
#include <vector>

#include "daemons/common/peer.h"
#include "daemons/common/worker_pool.h"
#include "sdk/frame.h"

namespace vellis::daemon {

struct Request {
  std::string text;  // the request's JSON text, not parsed
  Peer peer;
};

struct ServerOptions {
  std::string socket_path;
  unsigned int socket_mode = 0660;
  std::string log_name = "server";  // prefix of the loop's log lines
  int request_timeout_ms = 30 * 1000;
  int answer_timeout_ms = 30 * 1000;
  size_t max_connections = 4096;
  int workers = 4;
  // The upkeep runs after this much time without requests (and again after
  // as much time since it last said it was done); 0: never.
  int idle_after_ms = 1000;
  // After a stop, how long requests already received may take to finish.
  int stop_grace_ms = 5000;
};

class ServerLoop {
 public:
  // Returns the answer text for one request. An empty answer, or one above
  // sdk::kMaxMessageSize, closes the connection without an answer (logged);
  // so does an exception.
  using Handler = std::function<std::string(const Request&)>;
  // One step of background upkeep; true while more remains.
  using Upkeep = std::function<bool()>;
  // Milliseconds of a monotonic clock.
  using Clock = std::function<int64_t()>;

  struct Stats {
    size_t open = 0;  // connections open now
    size_t idle = 0;  // of those, the ones that have sent nothing yet
    uint64_t accepted = 0;
    uint64_t answered = 0;
    uint64_t refused = 0;    // over the cap with nothing to evict
    uint64_t evicted = 0;    // idle ones closed to make room
    uint64_t timed_out = 0;  // request or answer past its deadline
    uint64_t dropped = 0;    // bad length, end of stream inside a frame, errors
  };

  // `upkeep` may be empty; `clock` empty means the monotonic clock.
  ServerLoop(ServerOptions options, Handler handler, Upkeep upkeep = nullptr,
             Clock clock = nullptr);
  // Waits for running handlers, closes every connection and the listening
  // socket, and removes the socket file.
  ~ServerLoop();
  ServerLoop(const ServerLoop&) = delete;
  ServerLoop& operator=(const ServerLoop&) = delete;

  // Binds and listens (the socket file gets socket_mode; a leftover socket
  // file is replaced, anything else at the path is an error). Throws Error
  // kErrInternal naming the step.
  void Listen();

  // One round: waits up to `timeout_ms` (less when a deadline or the upkeep
  // falls due first; at once when something is ready), then accepts, reads,
  // hands whole requests to the workers, writes finished answers and closes
  // connections past their deadline.
  void Step(int timeout_ms);

  // Steps until `stop_fd` becomes readable. Then no connection is taken any
  // more, connections that have sent nothing are closed, and the others
  // are served until done, past their deadline, or stop_grace_ms.
  void Run(int stop_fd);

  Stats stats() const;

 private:
  enum class State { kReading, kWorking, kWriting };
  struct Connection {
    int fd = -1;
    Peer peer;
    State state = State::kReading;
    bool watched = false;  // in the epoll set
    bool timed = false;    // `deadline` is in deadlines_
    int64_t deadline = 0;
    sdk::FrameReader reader;
    std::string out;  // the answer frame, while the loop writes it
    size_t out_done = 0;
  };
  // A worker's word about a request it ran.
  struct Done {
    uint64_t id = 0;
    bool upkeep = false;       // the upkeep's word, not a request's
    bool upkeep_more = false;  // the upkeep has more to do
    bool answered = false;     // the whole answer went out
    bool closed = false;       // the worker closed the descriptor
    std::string rest;          // answer bytes that the worker could not write
  };

  int64_t Now() const { return clock_(); }
  void AcceptAll();
  void OnReadable(uint64_t id, Connection& c);
  void OnWritable(uint64_t id, Connection& c);
  void Dispatch(uint64_t id, Connection& c);
  void RunRequest(uint64_t id, int fd, Request request);
  void Finish(const Done& done);
  void ExpireDeadlines();
  void MaybeRunUpkeep();
  int64_t UpkeepDue() const;
  void SetDeadline(uint64_t id, Connection& c, int64_t deadline);
  void ClearDeadline(uint64_t id, Connection& c);
  // Forgets a connection; Close also closes its descriptor.
  void Close(uint64_t id) { Forget(id, true); }
  void Forget(uint64_t id, bool close_fd);
  bool Watch(uint64_t id, Connection& c, uint32_t events);
  void TakeDone();
  bool MakeRoom();
  void Log(int priority, const std::string& text) const;
  // Hands a worker's word to the loop; `wake` wakes the loop for it, else
  // the loop takes it on its next round.
  void Post(Done done, bool wake);

  ServerOptions options_;
  Handler handler_;
  Upkeep upkeep_;
  Clock clock_;

  int listen_fd_ = -1;
  int epoll_fd_ = -1;
  int wake_fd_ = -1;     // eventfd: workers have posted Done
  int reserve_fd_ = -1;  // given up to accept and refuse when out of descriptors
  bool listening_ = false;
  bool stop_requested_ = false;

  uint64_t next_id_ = 3;  // 0, 1 and 2 tag the listening socket, the eventfd and the stop fd
  std::unordered_map<uint64_t, Connection> connections_;
  std::set<std::pair<int64_t, uint64_t>> deadlines_;
  std::set<uint64_t> idle_;  // ids that have sent nothing, oldest first
  size_t working_ = 0;
  Stats stats_;

  bool upkeep_running_ = false;
  bool upkeep_more_ = false;
  // The quiet time before the next upkeep counts from the later of these.
  int64_t last_request_ = 0;
  int64_t last_upkeep_ = 0;
  // When the last line about an eviction / a refusal was logged.
  int64_t last_eviction_log_ = INT64_MIN / 2;
  int64_t last_refusal_log_ = INT64_MIN / 2;

  std::mutex done_mu_;
  std::vector<Done> done_;
  std::unique_ptr<WorkerPool> pool_;  // last: destroyed (joined) first
};

}  // namespace vellis::daemon
