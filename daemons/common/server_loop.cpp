#include "daemons/common/server_loop.h"

#include <fcntl.h>
#include <sys/epoll.h>
#include <sys/eventfd.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "common/error.h"
#include "sdk/platform.h"
#include "sdk/socket_io.h"

namespace vellis::daemon {
namespace {

constexpr uint64_t kListenTag = 0;
constexpr uint64_t kWakeTag = 1;
constexpr uint64_t kStopTag = 2;
constexpr int kMaxEvents = 256;
// Connections accepted per round, so that a flood of connects cannot starve
// the reading of requests already open.
constexpr int kAcceptsPerStep = 256;
constexpr size_t kReadChunk = 64 * 1024;
// At most one line a second about evicted, and about refused, connections.
constexpr int64_t kRefusalLogEveryMs = 1000;

[[noreturn]] void Fail(const std::string& step) {
  throw Error(kErrInternal, step + ": " + strerror(errno));
}

}  // namespace

ServerLoop::ServerLoop(ServerOptions options, Handler handler, Upkeep upkeep, Clock clock)
    : options_(std::move(options)),
      handler_(std::move(handler)),
      upkeep_(std::move(upkeep)),
      clock_(clock ? std::move(clock) : Clock(sdk::MonotonicMs)) {
  epoll_fd_ = epoll_create1(EPOLL_CLOEXEC);
  if (epoll_fd_ < 0) Fail("epoll_create1");
  wake_fd_ = eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK);
  if (wake_fd_ < 0) Fail("eventfd");
  epoll_event ev{};
  ev.events = EPOLLIN;
  ev.data.u64 = kWakeTag;
  if (epoll_ctl(epoll_fd_, EPOLL_CTL_ADD, wake_fd_, &ev) != 0) Fail("epoll_ctl");
  reserve_fd_ = open("/dev/null", O_RDONLY | O_CLOEXEC);
  last_request_ = Now();
  last_upkeep_ = last_request_;
  pool_ = std::make_unique<WorkerPool>(options_.workers);
}

ServerLoop::~ServerLoop() {
  pool_.reset();  // running handlers finish
  TakeDone();     // forgets the connections that the workers closed
  for (auto& entry : connections_) close(entry.second.fd);
  if (listen_fd_ >= 0) {
    close(listen_fd_);
    unlink(options_.socket_path.c_str());
  }
  if (reserve_fd_ >= 0) close(reserve_fd_);
  close(wake_fd_);
  close(epoll_fd_);
}

void ServerLoop::Log(int priority, const std::string& text) const {
  sdk::GetPlatform()->Syslog(priority, options_.log_name + ": " + text);
}

void ServerLoop::Listen() {
  const std::string& path = options_.socket_path;
  sockaddr_un addr;
  memset(&addr, 0, sizeof(addr));
  addr.sun_family = AF_UNIX;
  if (path.size() >= sizeof(addr.sun_path)) {
    throw Error(kErrInternal, "Socket path too long: " + path);
  }
  memcpy(addr.sun_path, path.c_str(), path.size());
  int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
  if (fd < 0) Fail("socket");
  // Only a socket file is replaced; anything else at the path is an error.
  struct stat st;
  if (lstat(path.c_str(), &st) == 0 && S_ISSOCK(st.st_mode)) unlink(path.c_str());
  if (bind(fd, reinterpret_cast<sockaddr*>(&addr), sizeof(addr)) != 0) {
    int err = errno;
    close(fd);
    errno = err;
    Fail("bind " + path);
  }
  chmod(path.c_str(), options_.socket_mode);
  epoll_event ev{};
  ev.events = EPOLLIN;
  ev.data.u64 = kListenTag;
  if (listen(fd, SOMAXCONN) != 0 || epoll_ctl(epoll_fd_, EPOLL_CTL_ADD, fd, &ev) != 0) {
    int err = errno;
    close(fd);
    unlink(path.c_str());
    errno = err;
    Fail("listen");
  }
  listen_fd_ = fd;
  listening_ = true;
}

ServerLoop::Stats ServerLoop::stats() const {
  Stats s = stats_;
  s.open = connections_.size();
  s.idle = idle_.size();
  return s;
}

void ServerLoop::SetDeadline(uint64_t id, Connection& c, int64_t deadline) {
  ClearDeadline(id, c);
  c.timed = true;
  c.deadline = deadline;
  deadlines_.emplace(deadline, id);
}

void ServerLoop::ClearDeadline(uint64_t id, Connection& c) {
  if (c.timed) deadlines_.erase({c.deadline, id});
  c.timed = false;
}

void ServerLoop::Forget(uint64_t id, bool close_fd) {
  auto it = connections_.find(id);
  if (it == connections_.end()) return;
  Connection& c = it->second;
  ClearDeadline(id, c);
  idle_.erase(id);
  if (c.state == State::kWorking) --working_;
  if (close_fd) close(c.fd);  // also takes it out of the epoll set
  connections_.erase(it);
}

bool ServerLoop::Watch(uint64_t id, Connection& c, uint32_t events) {
  epoll_event ev{};
  ev.events = events;
  ev.data.u64 = id;
  if (epoll_ctl(epoll_fd_, c.watched ? EPOLL_CTL_MOD : EPOLL_CTL_ADD, c.fd, &ev) != 0) {
    Log(LOG_ERR, std::string("epoll_ctl: ") + strerror(errno));
    Close(id);
    return false;
  }
  c.watched = true;
  return true;
}

bool ServerLoop::MakeRoom() {
  if (connections_.size() < options_.max_connections) return true;
  const int64_t now = Now();
  if (!idle_.empty()) {
    Close(*idle_.begin());
    ++stats_.evicted;
    if (now - last_eviction_log_ >= kRefusalLogEveryMs) {
      last_eviction_log_ = now;
      Log(LOG_WARNING,
          "closed the oldest idle connection: " + std::to_string(options_.max_connections) +
              " connections open, the maximum");
    }
    return true;
  }
  ++stats_.refused;
  if (now - last_refusal_log_ >= kRefusalLogEveryMs) {
    last_refusal_log_ = now;
    Log(LOG_WARNING, "refused a connection: " + std::to_string(options_.max_connections) +
                         " connections open, the maximum, none of them idle");
  }
  return false;
}

void ServerLoop::AcceptAll() {
  for (int i = 0; i < kAcceptsPerStep && listening_; ++i) {
    int fd = accept4(listen_fd_, nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK);
    if (fd < 0) {
      if (errno == EINTR) continue;
      if ((errno == EMFILE || errno == ENFILE) && reserve_fd_ >= 0) {
        // Out of descriptors: take the connection with the reserve one and
        // close it, so that the client is told at once and the listening
        // socket does not stay readable forever.
        close(reserve_fd_);
        int refused = accept4(listen_fd_, nullptr, nullptr, SOCK_CLOEXEC);
        if (refused >= 0) close(refused);
        reserve_fd_ = open("/dev/null", O_RDONLY | O_CLOEXEC);
        ++stats_.refused;
        Log(LOG_ERR, "refused a connection: out of file descriptors");
        continue;
      }
      return;  // EAGAIN: none left
    }
    if (!MakeRoom()) {
      close(fd);
      continue;
    }
    const uint64_t id = next_id_++;
    Connection& c = connections_[id];
    c.fd = fd;
    c.peer = PeerOf(fd);
    ++stats_.accepted;
    idle_.insert(id);
    SetDeadline(id, c, Now() + options_.request_timeout_ms);
    // Clients send right after connecting: the request is often there
    // already, and the connection need never be watched.
    OnReadable(id, c);
  }
}

void ServerLoop::OnReadable(uint64_t id, Connection& c) {
  static thread_local char buf[kReadChunk];
  while (c.reader.state() == sdk::FrameReader::State::kNeedMore) {
    ssize_t n = recv(c.fd, buf, sizeof(buf), MSG_DONTWAIT);
    if (n < 0 && errno == EINTR) continue;
    if (n < 0 && (errno == EAGAIN || errno == EWOULDBLOCK)) {
      if (!c.watched) Watch(id, c, EPOLLIN | EPOLLRDHUP);
      return;
    }
    if (n <= 0) {
      if (c.reader.started()) {
        ++stats_.dropped;
        Log(LOG_WARNING, "request dropped: " +
                             (n == 0 ? std::string("connection lost inside a message after ")
                                     : std::string(strerror(errno)) + " after ") +
                             std::to_string(c.reader.received()) + " bytes");
      }
      Close(id);
      return;
    }
    idle_.erase(id);
    c.reader.Feed(buf, static_cast<size_t>(n));
  }
  if (c.reader.state() == sdk::FrameReader::State::kBadLength) {
    ++stats_.dropped;
    Log(LOG_WARNING, "request dropped: " + c.reader.error());
    Close(id);
    return;
  }
  Dispatch(id, c);
}

void ServerLoop::Dispatch(uint64_t id, Connection& c) {
  // The worker owns the descriptor now; the loop stops watching it, so that
  // a hang-up meanwhile cannot wake the loop again and again.
  if (c.watched) epoll_ctl(epoll_fd_, EPOLL_CTL_DEL, c.fd, nullptr);
  c.watched = false;
  ClearDeadline(id, c);
  c.state = State::kWorking;
  ++working_;
  last_request_ = Now();
  Request request{c.reader.TakeMessage(), c.peer};
  const int fd = c.fd;
  pool_->Submit([this, id, fd, request = std::move(request)]() mutable {
    RunRequest(id, fd, std::move(request));
  });
}

void ServerLoop::RunRequest(uint64_t id, int fd, Request request) {
  Done done;
  done.id = id;
  std::string answer;
  try {
    answer = handler_(request);
  } catch (const std::exception& e) {
    Log(LOG_ERR, std::string("request failed: ") + e.what());
  }
  std::string frame;
  std::string why;
  if (answer.empty() || !sdk::EncodeFrame(answer, &frame, &why)) {
    Log(LOG_ERR,
        answer.empty() ? std::string("no answer to a request") : "answer not sent: " + why);
    close(fd);
    done.closed = true;
    Post(std::move(done), false);
    return;
  }
  // Most answers fit the socket buffer: the worker sends them itself and
  // the client has its answer without waiting for the loop.
  size_t sent = 0;
  while (sent < frame.size()) {
    ssize_t n = send(fd, frame.data() + sent, frame.size() - sent, MSG_NOSIGNAL | MSG_DONTWAIT);
    if (n > 0) {
      sent += static_cast<size_t>(n);
    } else if (n < 0 && errno == EINTR) {
      continue;
    } else {
      break;
    }
  }
  if (sent < frame.size() && (errno == EAGAIN || errno == EWOULDBLOCK)) {
    // The loop writes the rest as the client takes it.
    done.rest = frame.substr(sent);
    Post(std::move(done), true);
    return;
  }
  if (sent == frame.size()) {
    done.answered = true;
  } else {
    Log(LOG_WARNING, std::string("answer not delivered: ") + strerror(errno));
  }
  // Done with the connection: closing it here spares the loop a wake-up
  // per request; the loop forgets it on its next round.
  close(fd);
  done.closed = true;
  Post(std::move(done), false);
}

void ServerLoop::Post(Done done, bool wake) {
  {
    std::lock_guard<std::mutex> lock(done_mu_);
    done_.push_back(std::move(done));
  }
  if (!wake) return;
  const uint64_t one = 1;
  (void)!write(wake_fd_, &one, sizeof(one));
}

void ServerLoop::TakeDone() {
  std::vector<Done> done;
  {
    std::lock_guard<std::mutex> lock(done_mu_);
    if (done_.empty()) return;
    done.swap(done_);
  }
  for (const Done& d : done) Finish(d);
}

void ServerLoop::Finish(const Done& done) {
  if (done.upkeep) {
    upkeep_running_ = false;
    upkeep_more_ = done.upkeep_more;
    last_upkeep_ = Now();
    return;
  }
  auto it = connections_.find(done.id);
  if (it == connections_.end()) return;
  Connection& c = it->second;
  if (done.answered) ++stats_.answered;
  if (done.closed) {
    Forget(done.id, false);
    return;
  }
  --working_;
  c.state = State::kWriting;
  c.out = done.rest;
  c.out_done = 0;
  SetDeadline(done.id, c, Now() + options_.answer_timeout_ms);
  Watch(done.id, c, EPOLLOUT);
}

void ServerLoop::OnWritable(uint64_t id, Connection& c) {
  while (c.out_done < c.out.size()) {
    ssize_t n = send(c.fd, c.out.data() + c.out_done, c.out.size() - c.out_done,
                     MSG_NOSIGNAL | MSG_DONTWAIT);
    if (n > 0) {
      c.out_done += static_cast<size_t>(n);
      continue;
    }
    if (n < 0 && errno == EINTR) continue;
    if (n < 0 && (errno == EAGAIN || errno == EWOULDBLOCK)) return;
    ++stats_.dropped;
    Log(LOG_WARNING, std::string("answer not delivered: ") + strerror(errno));
    Close(id);
    return;
  }
  ++stats_.answered;
  Close(id);
}

void ServerLoop::ExpireDeadlines() {
  const int64_t now = Now();
  size_t idle_dropped = 0;
  while (!deadlines_.empty() && deadlines_.begin()->first <= now) {
    const uint64_t id = deadlines_.begin()->second;
    Connection& c = connections_.at(id);
    ++stats_.timed_out;
    if (c.state == State::kWriting) {
      Log(LOG_WARNING, "answer not delivered: the client took " + std::to_string(c.out_done) +
                           " of " + std::to_string(c.out.size()) + " bytes in " +
                           std::to_string(options_.answer_timeout_ms) + " ms");
    } else if (c.reader.started()) {
      Log(LOG_WARNING, "request dropped: " + std::to_string(c.reader.received()) + " bytes in " +
                           std::to_string(options_.request_timeout_ms) +
                           " ms, not a whole message");
    } else {
      ++idle_dropped;
    }
    Close(id);
  }
  if (idle_dropped > 0) {
    Log(LOG_INFO, "closed " + std::to_string(idle_dropped) + " connections that sent nothing in " +
                      std::to_string(options_.request_timeout_ms) + " ms");
  }
}

int64_t ServerLoop::UpkeepDue() const {
  return std::max(last_request_, last_upkeep_) + options_.idle_after_ms;
}

void ServerLoop::MaybeRunUpkeep() {
  if (!upkeep_ || options_.idle_after_ms <= 0 || upkeep_running_ || working_ > 0) return;
  if (!upkeep_more_ && Now() < UpkeepDue()) return;
  upkeep_running_ = true;
  pool_->Submit([this] {
    Done done;
    done.upkeep = true;
    try {
      done.upkeep_more = upkeep_();
    } catch (const std::exception& e) {
      Log(LOG_ERR, std::string("upkeep failed: ") + e.what());
    }
    Post(std::move(done), true);
  });
}

void ServerLoop::Step(int timeout_ms) {
  int64_t wait = std::max(timeout_ms, 0);
  const int64_t now = Now();
  if (!deadlines_.empty())
    wait = std::min(wait, std::max<int64_t>(deadlines_.begin()->first - now, 0));
  if (upkeep_ && options_.idle_after_ms > 0 && !upkeep_running_ && working_ == 0) {
    const int64_t due = upkeep_more_ ? now : UpkeepDue();
    wait = std::min(wait, std::max<int64_t>(due - now, 0));
  }
  epoll_event events[kMaxEvents];
  int n = epoll_wait(epoll_fd_, events, kMaxEvents, static_cast<int>(wait));
  if (n < 0 && errno != EINTR) Fail("epoll_wait");
  bool accept = false;
  bool woken = false;
  for (int i = 0; i < n; ++i) {
    const uint64_t id = events[i].data.u64;
    if (id == kListenTag) {
      accept = true;
    } else if (id == kWakeTag) {
      woken = true;
    } else if (id == kStopTag) {
      stop_requested_ = true;
    } else {
      auto it = connections_.find(id);
      if (it == connections_.end()) continue;  // closed earlier this round
      if (it->second.state == State::kReading) {
        OnReadable(id, it->second);
      } else if (it->second.state == State::kWriting) {
        OnWritable(id, it->second);
      }
    }
  }
  if (woken) {
    uint64_t count;
    (void)!read(wake_fd_, &count, sizeof(count));
  }
  TakeDone();  // also what was posted without a wake-up
  if (accept) AcceptAll();
  ExpireDeadlines();
  MaybeRunUpkeep();
}

void ServerLoop::Run(int stop_fd) {
  epoll_event ev{};
  ev.events = EPOLLIN;
  ev.data.u64 = kStopTag;
  if (epoll_ctl(epoll_fd_, EPOLL_CTL_ADD, stop_fd, &ev) != 0) Fail("epoll_ctl");
  stop_requested_ = false;
  while (!stop_requested_) Step(1000);
  epoll_ctl(epoll_fd_, EPOLL_CTL_DEL, stop_fd, nullptr);
  // Stop taking connections; those that have sent nothing are closed.
  if (listen_fd_ >= 0) {
    epoll_ctl(epoll_fd_, EPOLL_CTL_DEL, listen_fd_, nullptr);
    listening_ = false;
  }
  std::vector<uint64_t> idle(idle_.begin(), idle_.end());
  for (uint64_t id : idle) Close(id);
  const int64_t end = Now() + options_.stop_grace_ms;
  while (!connections_.empty() && Now() < end) Step(50);
}

}  // namespace vellis::daemon
