// The folder configuration at its size limit: which folder governs a path,
// whether a file's content is indexed, and the status of a listed page.
//
// Setup (once, under a temporary $VELLIS_ROOT on the Linux platform): ten
// shares with 100 folders each, 1,000 in all (the maximum): "/shareK/dA"
// and "/shareK/dA/sub" for A in 0..49. The share share0's queue holds
// 1,000,000 pending events below d0..d3 of share0, so that a page of
// share0's folders mixes folders with waiting events ("processing") and
// folders without ("finished", the costly answer: the whole queue must be
// searched).
//
//   GetMostSuitableCfg / IsFullPathNeedMeta: 1,000,000 full paths, 3/4 of
//     them under a configured folder, one pass per iteration.
//   StatusPage: what a folder listing does for one page: load the list,
//     take the first 50 folders by path and report each with
//     GetDataWithAdditional(["status"]); once right after the queue has
//     changed (the queue is read again, as in a fresh process) and once
//     with the queue unchanged since the previous page.
//
//   build/bench/folder_bench [--benchmark_filter=...]
#include <benchmark/benchmark.h>
#include <ftw.h>
#include <sys/stat.h>

#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <memory>
#include <random>
#include <string>
#include <vector>

#include "common/root_path.h"
#include "fileindex/folder_mgr.h"
#include "sdk/linux/index_paths.h"
#include "sdk/linux/share_registry.h"

namespace {

using vellis::fileindex::Folder;
using vellis::fileindex::FolderMgr;

constexpr int kShares = 10;
constexpr int kTopFolders = 50;  // per share, each with one subfolder
constexpr size_t kPaths = 1000000;
constexpr size_t kQueueEvents = 1000000;

void MakeDirs(const std::string& path) {
  for (size_t pos = 1; pos <= path.size(); ++pos) {
    if (pos == path.size() || path[pos] == '/') mkdir(path.substr(0, pos).c_str(), 0755);
  }
}

struct Setup {
  std::string root;
  std::string volume;
  std::vector<std::string> paths;  // full paths to classify
};

const Setup& GetSetup() {
  static Setup* setup = [] {
    auto* s = new Setup();
    const char* tmp = getenv("TMPDIR");
    std::string root = std::string(tmp && *tmp ? tmp : "/tmp") + "/vellis-folder-bench-XXXXXX";
    if (mkdtemp(&root[0]) == nullptr) abort();
    setenv(vellis::kRootEnv, root.c_str(), 1);
    s->root = root;
    MakeDirs(root + "/var/packages/Vellis/etc");
    MakeDirs(root + "/tmp");
    s->volume = root + "/volume1";

    FolderMgr mgr;
    std::shared_ptr<Folder> changed;
    for (int k = 0; k < kShares; ++k) {
      vellis::sdk::ShareInfo share;
      share.szName = "share" + std::to_string(k);
      share.szPath = s->volume + "/" + share.szName;
      MakeDirs(share.szPath);
      vellis::sdk::RegisterShare(share);
      for (int a = 0; a < kTopFolders; ++a) {
        std::string top = "/" + share.szName + "/d" + std::to_string(a);
        MakeDirs(s->volume + top + "/sub");
        mgr.Upsert(changed, std::make_shared<Folder>(top, "top", a % 2 == 0, true, a % 3 == 0, true,
                                                     false, false));
        mgr.Upsert(changed, std::make_shared<Folder>(top + "/sub", "sub", true, a % 2 == 1, false,
                                                     a % 5 == 0, false, false));
      }
    }
    mgr.Save();

    std::mt19937 rng(7);
    std::uniform_int_distribution<int> share(0, kShares - 1), dir(0, kTopFolders * 4 / 3 - 1),
        depth(0, 2), file(0, 99999), ext(0, 5);
    const char* exts[] = {"pdf", "mp3", "mkv", "jpg", "exe", "txt"};
    s->paths.reserve(kPaths);
    for (size_t i = 0; i < kPaths; ++i) {
      std::string p =
          s->volume + "/share" + std::to_string(share(rng)) + "/d" + std::to_string(dir(rng));
      int d = depth(rng);
      if (d >= 1) p += "/sub";
      if (d == 2) p += "/deeper";
      s->paths.push_back(p + "/file" + std::to_string(file(rng)) + "." + exts[ext(rng)]);
    }

    // share0's queue: events below d0..d3 (and their subfolders) only.
    std::string queue = vellis::sdk::ComposeQueuePath(s->volume + "/share0");
    MakeDirs(queue.substr(0, queue.rfind('/')));
    std::ofstream out(queue);
    std::uniform_int_distribution<int> busy(0, 3), kind(0, 2);
    const int events[] = {0x2, 0x40, 0x4};
    for (size_t i = 0; i < kQueueEvents; ++i) {
      out << "{\"event\":" << events[kind(rng)] << ",\"is_dir\":false,\"path\":\"" << s->volume
          << "/share0/d" << busy(rng) << (i % 2 ? "/sub" : "") << "/file" << file(rng)
          << ".txt\"}\n";
    }
    return s;
  }();
  return *setup;
}

void BM_GetMostSuitableCfg(benchmark::State& state) {
  const Setup& s = GetSetup();
  FolderMgr mgr;
  for (auto _ : state) {
    size_t governed = 0;
    for (const std::string& p : s.paths) governed += mgr.GetMostSuitableCfg(p) != nullptr;
    benchmark::DoNotOptimize(governed);
  }
  state.SetItemsProcessed(static_cast<int64_t>(state.iterations() * s.paths.size()));
}

void BM_IsFullPathNeedMeta(benchmark::State& state) {
  const Setup& s = GetSetup();
  FolderMgr mgr;
  for (auto _ : state) {
    size_t needed = 0;
    for (const std::string& p : s.paths) needed += mgr.IsFullPathNeedMeta(p);
    benchmark::DoNotOptimize(needed);
  }
  state.SetItemsProcessed(static_cast<int64_t>(state.iterations() * s.paths.size()));
}

// One page of a listing; 8 of its 50 folders have waiting events.
size_t StatusPage() {
  Json::Value additional(Json::arrayValue);
  additional.append("status");
  FolderMgr mgr;
  std::vector<std::shared_ptr<Folder>> page;
  unsigned int total = 0;
  mgr.List(page, total, 0, 50, "path", "asc");
  Json::Value result(Json::arrayValue);
  size_t processing = 0;
  for (const auto& folder : page) {
    Json::Value report = folder->GetDataWithAdditional(additional);
    processing += report["additional"]["status"]["text"] == "processing";
    result.append(report);
  }
  benchmark::DoNotOptimize(result);
  return processing;
}

// The first page after the queue has changed, as in a fresh process: one
// more event (outside every listed folder) is queued before each run.
void BM_StatusPageQueueChanged(benchmark::State& state) {
  const Setup& s = GetSetup();
  std::string queue = vellis::sdk::ComposeQueuePath(s.volume + "/share0");
  size_t processing = 0;
  for (auto _ : state) {
    state.PauseTiming();
    std::ofstream(queue, std::ios::app)
        << "{\"event\":2,\"path\":\"" << s.volume << "/share0/other/x\"}\n";
    state.ResumeTiming();
    processing = StatusPage();
  }
  state.counters["processing"] = static_cast<double>(processing);
}

// Further pages while the queue stays as it is.
void BM_StatusPageQueueUnchanged(benchmark::State& state) {
  GetSetup();
  StatusPage();
  size_t processing = 0;
  for (auto _ : state) processing = StatusPage();
  state.counters["processing"] = static_cast<double>(processing);
}

BENCHMARK(BM_GetMostSuitableCfg)->Unit(benchmark::kMillisecond)->Iterations(3);
BENCHMARK(BM_IsFullPathNeedMeta)->Unit(benchmark::kMillisecond)->Iterations(3);
BENCHMARK(BM_StatusPageQueueChanged)->Unit(benchmark::kMillisecond)->Iterations(3);
BENCHMARK(BM_StatusPageQueueUnchanged)->Unit(benchmark::kMillisecond)->Iterations(3);

int RemoveEntry(const char* path, const struct stat*, int, struct FTW*) {
  remove(path);
  return 0;
}

}  // namespace

int main(int argc, char** argv) {
  benchmark::Initialize(&argc, argv);
  if (benchmark::ReportUnrecognizedArguments(argc, argv)) return 1;
  benchmark::RunSpecifiedBenchmarks();
  benchmark::Shutdown();
  // The setup is made only when a benchmark ran.
  const char* root = getenv(vellis::kRootEnv);
  if (root && std::string(root).find("/vellis-folder-bench-") != std::string::npos) {
    nftw(root, RemoveEntry, 64, FTW_DEPTH | FTW_PHYS);
  }
  return 0;
}
