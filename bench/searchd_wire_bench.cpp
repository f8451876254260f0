// The search daemon as clients see it: round trips through its real socket.
//
// Starts the built vellis-searchd as a child process (--foreground) under a
// fresh temporary root ($VELLIS_ROOT), creates an index of 100 small
// documents (index_create, one compound request of upserts, commit) and then
// measures two read requests: search:0 is "index_list", answered from
// memory, so that it measures the wire and the server loop; search:1 is a
// document_search for one word that 10 of the documents hold (limit 10,
// path field only). Every round trip is connect, send, receive, close, and
// every answer is checked, so a daemon that answers wrongly fails the
// benchmark.
//
//   BM_RoundTrip/search:K/threads:N   round trips per second
//                                     (items_per_second) with 1, 8 and 64
//                                     client threads.
//   BM_LatencyWithIdleConns/search:K  p50_us and p99_us from one client while
//                                     1,000 connections are held open without
//                                     sending anything. A request that gets no
//                                     answer within 5 s ends the run with the
//                                     reason.
//
// The daemon binary is $SEARCHD_BIN (to compare two builds), else
// build/bin/vellis-searchd below the current folder, else
// ../bin/vellis-searchd next to this program. Run from the source folder:
//
//   build/bench/searchd_wire_bench [--benchmark_filter=...]
//   SEARCHD_BIN=/path/to/vellis-searchd build/bench/searchd_wire_bench
#include <benchmark/benchmark.h>
#include <signal.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include "common/json_util.h"
#include "fileindex/elastic/schema.h"
#include "sdk/domain_socket.h"

namespace {

constexpr char kIndex[] = "fileindex_wire_bench";
constexpr int kDocuments = 100;
constexpr int kExpectedHits = kDocuments / 10;  // documents holding kWord
constexpr char kWord[] = "quartzite";
constexpr int kIdleConnections = 1000;
constexpr int kRequestTimeoutMs = 5000;

using Clock = std::chrono::steady_clock;

double MsSince(Clock::time_point start) {
  return std::chrono::duration<double, std::milli>(Clock::now() - start).count();
}

std::string FindDaemonBinary() {
  if (const char* env = getenv("SEARCHD_BIN"); env != nullptr && *env != '\0') return env;
  std::vector<std::string> candidates = {"build/bin/vellis-searchd"};
  std::error_code ec;
  std::filesystem::path self = std::filesystem::read_symlink("/proc/self/exe", ec);
  if (!ec) {
    candidates.push_back((self.parent_path() / "../bin/vellis-searchd").string());
  }
  for (const std::string& c : candidates) {
    if (access(c.c_str(), X_OK) == 0) return c;
  }
  return "";
}

// One round trip: connect, send `request`, receive the answer into `answer`,
// close. Returns an empty string, or what went wrong.
std::string RoundTrip(const std::string& socket, const std::string& request, Json::Value* answer) {
  vellis::sdk::DomainSockConnection conn(socket);
  conn.SetTimeouts(kRequestTimeoutMs, kRequestTimeoutMs);
  Clock::time_point start = Clock::now();
  if (!conn.Connect()) return std::string("connect failed: ") + strerror(errno);
  if (!conn.Send(request)) {
    return "send failed after " + std::to_string(static_cast<long long>(MsSince(start))) + " ms";
  }
  std::string text;
  if (!conn.Recv(text)) {
    const long long ms = static_cast<long long>(MsSince(start));
    if (ms >= kRequestTimeoutMs) return "request timed out after " + std::to_string(ms) + " ms";
    return "no answer (connection closed) after " + std::to_string(ms) + " ms";
  }
  if (!vellis::JsonFromString(*answer, text) || !answer->isObject()) {
    return "answer is not a JSON object: " + text.substr(0, 200);
  }
  if (!(*answer)["success"].asBool() || (*answer)["has_fail"].asBool()) {
    return "request failed: " + text.substr(0, 300);
  }
  return "";
}

Json::Value Request(const std::string& command, const Json::Value& data) {
  Json::Value r(Json::objectValue);
  r["command"] = command;
  r["data"] = data;
  return r;
}

// The daemon as a child process under its own temporary root.
class DaemonProcess {
 public:
  ~DaemonProcess() { Stop(); }

  // Starts the daemon and waits for its socket. Returns an empty string, or
  // why it did not come up.
  std::string Start() {
    const std::string bin = FindDaemonBinary();
    if (bin.empty()) return "vellis-searchd not found (set SEARCHD_BIN)";
    if (access(bin.c_str(), X_OK) != 0) return bin + ": " + strerror(errno);
    std::string tmpl = "/tmp/vellis-wire-bench-XXXXXX";
    if (mkdtemp(&tmpl[0]) == nullptr) return std::string("mkdtemp: ") + strerror(errno);
    root_ = tmpl;
    socket_ = root_ + "/var/run/qoruelasticd.sock";
    const std::string log = root_ + "/searchd.log";
    pid_ = fork();
    if (pid_ < 0) return std::string("fork: ") + strerror(errno);
    if (pid_ == 0) {                     // this process has no other threads yet
      prctl(PR_SET_PDEATHSIG, SIGKILL);  // never outlive the benchmark
      setenv("VELLIS_ROOT", root_.c_str(), 1);
      if (freopen(log.c_str(), "w", stderr) == nullptr) _exit(126);
      execl(bin.c_str(), "vellis-searchd", "--foreground", static_cast<char*>(nullptr));
      _exit(127);
    }
    for (int i = 0; i < 1000; ++i) {
      int status = 0;
      if (waitpid(pid_, &status, WNOHANG) == pid_) {
        pid_ = -1;
        std::ifstream in(log);
        std::string text((std::istreambuf_iterator<char>(in)), std::istreambuf_iterator<char>());
        return bin + " exited at start with status " + std::to_string(status) + ": " + text;
      }
      vellis::sdk::DomainSockConnection probe(socket_);
      if (probe.Connect()) return "";
      std::this_thread::sleep_for(std::chrono::milliseconds(10));
    }
    return bin + " did not open " + socket_ + " within 10 s";
  }

  // Kills the daemon, waits for it and removes the temporary root.
  void Stop() {
    if (pid_ > 0) {
      kill(pid_, SIGKILL);
      waitpid(pid_, nullptr, 0);
      pid_ = -1;
    }
    std::error_code ec;
    if (!root_.empty()) std::filesystem::remove_all(root_, ec);
    root_.clear();
  }

  // Creates the index and its documents and waits until the daemon's
  // idle-time upkeep is done, so that it does not run during measurements.
  std::string Fill() {
    Json::Value data(Json::objectValue);
    data["id"] = kIndex;
    data["path"] = root_ + "/db";
    data["mappings"] = vellis::fileindex::elastic::GetFileIndexMappings();
    Json::Value answer;
    std::string err;
    auto call = [&](const Json::Value& request) {
      err = RoundTrip(socket_, vellis::JsonToString(request), &answer);
      if (!err.empty()) err = request.get("command", "compound").asString() + ": " + err;
      return err.empty();
    };
    if (!call(Request("index_create", data))) return err;
    Json::Value compound(Json::objectValue);
    for (int i = 0; i < kDocuments; ++i) {
      Json::Value up(Json::objectValue);
      up["id"] = kIndex;
      up["doc_id"] = "/volume1/share/notes/note" + std::to_string(i) + ".txt";
      up["data"]["QORUMDPath"] = up["doc_id"];
      up["data"]["QORUMDTextContent"] = "note number " + std::to_string(i) + " about " +
                                        (i % 10 == 0 ? kWord : "granite") + " and marble";
      compound["compound"].append(Request("document_upsert_by_id", up));
    }
    Json::Value id(Json::objectValue);
    id["id"] = kIndex;
    if (!call(compound) || !call(Request("commit", id))) return err;
    // Every connection holds the upkeep off for a quiet second.
    for (int i = 0; i < 20; ++i) {
      if (!call(Request("index_stats", id))) return err;
      if (!answer["data"]["merging"].asBool()) break;
      std::this_thread::sleep_for(std::chrono::milliseconds(1500));
    }
    if (answer["data"]["documents"].asInt() != kDocuments) {
      return "index holds " + answer["data"]["documents"].asString() + " documents, not " +
             std::to_string(kDocuments);
    }
    return "";
  }

  const std::string& socket() const { return socket_; }

 private:
  pid_t pid_ = -1;
  std::string root_;
  std::string socket_;
};

DaemonProcess* g_daemon = nullptr;

// The smallest request: "index_list", answered from memory, so that the
// round trip measures the wire and the server loop. Its answer is checked.
std::string ListIndexes() {
  static const std::string request =
      vellis::JsonToString(Request("index_list", Json::Value(Json::objectValue)));
  Json::Value answer;
  std::string err = RoundTrip(g_daemon->socket(), request, &answer);
  if (err.empty() && answer["data"].size() != 1) return "index_list did not list the index";
  return err;
}

// The search round trip with its answer checked; empty or what went wrong.
std::string Search() {
  static const std::string request = [] {
    Json::Value data(Json::objectValue);
    data["id"] = kIndex;
    data["query"] = kWord;
    data["limit"] = kExpectedHits;
    data["fields"] = "QORUMDPath";
    return vellis::JsonToString(Request("document_search", data));
  }();
  Json::Value answer;
  std::string err = RoundTrip(g_daemon->socket(), request, &answer);
  if (!err.empty()) return err;
  const Json::Value& data = answer["data"];
  if (data["total"].asInt() != kExpectedHits ||
      static_cast<int>(data["hits"].size()) != kExpectedHits) {
    return "search answered " + data["total"].asString() + " hits, expected " +
           std::to_string(kExpectedHits);
  }
  return "";
}

// Argument 0: the smallest request; 1: the one-word search.
std::string RunRequest(int64_t kind) { return kind == 0 ? ListIndexes() : Search(); }

void BM_RoundTrip(benchmark::State& state) {
  for (auto _ : state) {
    std::string err = RunRequest(state.range(0));
    if (!err.empty()) {
      state.SkipWithError(err.c_str());
      break;
    }
  }
  state.SetItemsProcessed(state.iterations());
}
BENCHMARK(BM_RoundTrip)
    ->ArgName("search")
    ->Arg(0)
    ->Arg(1)
    ->Threads(1)
    ->Threads(8)
    ->Threads(64)
    ->UseRealTime()
    ->MinTime(1.0);

double Percentile(std::vector<double> v, double p) {
  std::sort(v.begin(), v.end());
  size_t i = static_cast<size_t>(p * static_cast<double>(v.size() - 1) + 0.5);
  return v[std::min(i, v.size() - 1)];
}

void BM_LatencyWithIdleConns(benchmark::State& state) {
  // Connected and never written to, for the whole measurement.
  std::vector<std::unique_ptr<vellis::sdk::DomainSockConnection>> idle;
  for (int i = 0; i < kIdleConnections; ++i) {
    idle.push_back(std::make_unique<vellis::sdk::DomainSockConnection>(g_daemon->socket()));
    idle.back()->SetTimeouts(kRequestTimeoutMs, kRequestTimeoutMs);
    if (!idle.back()->Connect()) {
      std::string err = "idle connection " + std::to_string(i) + " failed: " + strerror(errno);
      state.SkipWithError(err.c_str());
      return;
    }
  }
  std::vector<double> us;
  for (auto _ : state) {
    Clock::time_point start = Clock::now();
    std::string err = RunRequest(state.range(0));
    if (!err.empty()) {
      err += " with " + std::to_string(kIdleConnections) + " idle connections (after " +
             std::to_string(us.size()) + " answered requests)";
      state.SkipWithError(err.c_str());
      break;
    }
    us.push_back(MsSince(start) * 1000.0);
  }
  if (!us.empty()) {
    state.counters["p50_us"] = Percentile(us, 0.50);
    state.counters["p99_us"] = Percentile(us, 0.99);
  }
  state.counters["idle_conns"] = static_cast<double>(idle.size());
  state.SetItemsProcessed(static_cast<int64_t>(us.size()));
}
BENCHMARK(BM_LatencyWithIdleConns)
    ->ArgName("search")
    ->Arg(0)
    ->Arg(1)
    ->Iterations(2000)
    ->UseRealTime()
    ->Unit(benchmark::kMicrosecond);

}  // namespace

int main(int argc, char** argv) {
  benchmark::Initialize(&argc, argv);
  if (benchmark::ReportUnrecognizedArguments(argc, argv)) return 1;
  // The idle connections need descriptors on both ends; the daemon inherits
  // the raised limit.
  rlimit lim;
  if (getrlimit(RLIMIT_NOFILE, &lim) == 0) {
    lim.rlim_cur = lim.rlim_max;
    if (setrlimit(RLIMIT_NOFILE, &lim) != 0) perror("setrlimit(RLIMIT_NOFILE)");
  }
  DaemonProcess daemon;
  std::string err = daemon.Start();
  if (err.empty()) err = daemon.Fill();
  if (!err.empty()) {
    fprintf(stderr, "searchd_wire_bench: %s\n", err.c_str());
    return 1;
  }
  g_daemon = &daemon;
  benchmark::RunSpecifiedBenchmarks();
  benchmark::Shutdown();
  g_daemon = nullptr;
  daemon.Stop();
  return 0;
}
