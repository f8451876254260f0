// Round trips through SendRequestImpl against a minimal local search daemon
// (a thread of this program on a real Unix socket): small requests and a
// 10,000-element compound request.
#include <benchmark/benchmark.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <atomic>
#include <cstdlib>
#include <cstring>
#include <string>
#include <thread>

#include "common/json_util.h"
#include "common/root_path.h"
#include "fileindex/elastic/comm.h"
#include "sdk/domain_socket.h"

namespace {

// Answers each connection's request: parses it and sends back a success
// envelope, with one element per sub-request for a compound request.
class MinimalDaemon {
 public:
  explicit MinimalDaemon(const std::string& path) {
    sockaddr_un addr;
    memset(&addr, 0, sizeof(addr));
    addr.sun_family = AF_UNIX;
    memcpy(addr.sun_path, path.c_str(), path.size() + 1);
    fd_ = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    if (fd_ < 0 || bind(fd_, reinterpret_cast<sockaddr*>(&addr), sizeof(addr)) != 0 ||
        listen(fd_, 64) != 0) {
      perror("daemon socket");
      exit(1);
    }
    thread_ = std::thread([this] { Run(); });
  }
  ~MinimalDaemon() {
    stop_ = true;
    shutdown(fd_, SHUT_RDWR);
    thread_.join();
    close(fd_);
  }

 private:
  void Run() {
    while (!stop_) {
      int fd = accept4(fd_, nullptr, nullptr, SOCK_CLOEXEC);
      if (fd < 0) continue;
      vellis::sdk::SockConnection conn(fd);
      std::string raw;
      Json::Value req;
      if (!conn.Recv(raw) || !vellis::JsonFromString(req, raw)) continue;
      Json::Value res;
      res["success"] = true;
      if (req.isMember("compound")) {
        res["has_fail"] = false;
        Json::Value ok;
        ok["success"] = true;
        Json::Value& data = res["data"] = Json::Value(Json::arrayValue);
        for (Json::ArrayIndex i = 0; i < req["compound"].size(); ++i) data.append(ok);
      }
      conn.Send(vellis::JsonToString(res));
    }
  }

  int fd_ = -1;
  std::atomic<bool> stop_{false};
  std::thread thread_;
};

Json::Value SmallRequest() {
  Json::Value req;
  req["command"] = "commit";
  req["data"]["id"] = "fileindex_music";
  return req;
}

Json::Value CompoundRequest(int n) {
  Json::Value req;
  Json::Value& compound = req["compound"] = Json::Value(Json::arrayValue);
  for (int i = 0; i < n; ++i) {
    Json::Value sub;
    sub["command"] = "document_set_by_id";
    sub["data"]["id"] = "fileindex_music";
    sub["data"]["doc_id"] = "/volume1/music/old/track" + std::to_string(i) + ".mp3";
    sub["data"]["data"]["QORUMDPath"] = "/volume1/music/new/track" + std::to_string(i) + ".mp3";
    sub["data"]["data"]["QORUMDParent"] = "/volume1/music/new";
    compound.append(sub);
  }
  return req;
}

void RoundTrips(benchmark::State& state, const Json::Value& req) {
  Json::Value res;
  for (auto _ : state) {
    vellis::SendRequestImpl(res, req);
    benchmark::DoNotOptimize(res);
  }
  state.counters["round_trips_per_s"] =
      benchmark::Counter(static_cast<double>(state.iterations()), benchmark::Counter::kIsRate);
}

void BM_SmallRequest(benchmark::State& state) { RoundTrips(state, SmallRequest()); }
BENCHMARK(BM_SmallRequest)->UseRealTime()->Unit(benchmark::kMicrosecond);

void BM_Compound10000(benchmark::State& state) { RoundTrips(state, CompoundRequest(10000)); }
BENCHMARK(BM_Compound10000)->UseRealTime()->Unit(benchmark::kMillisecond);

}  // namespace

int main(int argc, char** argv) {
  char root[] = "/tmp/vellis-bench-XXXXXX";
  if (mkdtemp(root) == nullptr) return 1;
  setenv(vellis::kRootEnv, root, 1);
  std::string run_dir = std::string(root) + "/var";
  mkdir(run_dir.c_str(), 0755);
  mkdir((run_dir + "/run").c_str(), 0755);
  const std::string socket_path = vellis::RootPath(vellis::kElasticSocketPath);
  int rc = 0;
  {
    MinimalDaemon daemon(socket_path);
    benchmark::Initialize(&argc, argv);
    benchmark::RunSpecifiedBenchmarks();
    benchmark::Shutdown();
  }
  unlink(socket_path.c_str());
  rmdir((run_dir + "/run").c_str());
  rmdir(run_dir.c_str());
  rmdir(root);
  return rc;
}
