// Folding queue files into the operation tree, against reading and parsing
// the same lines alone.
//
// Cases: a realistic queue (1,000,000 lines over about 50,000 folders, the
// events of what users do on a share), a scattered one (the same size, each
// line drawn on its own: the worst case for the tree) and a wide one
// (100,000 new files in one folder) against the same number spread over
// 1,000 folders. After the runs it prints folding as a ratio to parsing
// (from pairs of runs timed back to back) and to reading, the wide/spread
// ratio, and the heap held per tree node.
//
//   build/bench/optree_bench [--benchmark_filter=...]
#include <benchmark/benchmark.h>
#include <malloc.h>
#include <sys/resource.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <ctime>
#include <fstream>
#include <map>
#include <memory>
#include <random>
#include <set>
#include <string>
#include <vector>

#include "common/json_util.h"
#include "common/line_reader.h"
#include "fileindex/optree.h"

namespace {

using vellis::fileindex::OP;
using vellis::fileindex::OPNode;
using vellis::fileindex::OPTree;

std::string TempDir() {
  static std::string dir = [] {
    const char* tmp = getenv("TMPDIR");
    std::string tmpl = std::string(tmp && *tmp ? tmp : "/tmp") + "/vellis-bench-XXXXXX";
    if (mkdtemp(&tmpl[0]) == nullptr) abort();
    return tmpl;
  }();
  return dir;
}

std::string Line(unsigned event, bool is_dir, const std::string& path,
                 const std::string& path_old = "", const char* data = nullptr) {
  std::string s = "{\"event\":" + std::to_string(event) + ",\"is_dir\":" +
                  (is_dir ? "true" : "false") + ",\"path\":\"" + path + "\"";
  if (!path_old.empty()) s += ",\"path_old\":\"" + path_old + "\"";
  if (data) s += std::string(",\"data\":") + data;
  return s + "}\n";
}

// 50 x 50 x 20 = 50,000 leaf folders under one share.
std::string LeafFolder(std::mt19937& rng) {
  std::uniform_int_distribution<int> a(0, 49), b(0, 49), c(0, 19);
  return "/volume1/share/d" + std::to_string(a(rng)) + "/e" + std::to_string(b(rng)) + "/f" +
         std::to_string(c(rng));
}

// What users do on a share, as the monitor reports it: each burst is one
// action on a few files of one folder. A new file is created, written and
// has its times set; an edit writes an existing file; a safe save writes a
// temporary file and renames it over the original; files are deleted,
// renamed and have their attributes changed; now and then a subfolder is
// made or removed, a folder is reindexed or its configuration changes.
// Each folder holds ten files before the queue starts.
std::string MakeRealistic(size_t lines) {
  std::string path = TempDir() + "/realistic.queue";
  std::ofstream out(path);
  std::mt19937 rng(42);
  std::uniform_int_distribution<int> pct(0, 99);
  std::geometric_distribution<int> files_per_action(0.25);  // 4 on average
  std::map<std::string, int> next_file;                     // per folder
  size_t written = 0;
  auto emit = [&](const std::string& line) {
    if (written < lines) out << line;
    ++written;
  };
  while (written < lines) {
    const std::string d = LeafFolder(rng);
    int& created = next_file.try_emplace(d, 10).first->second;
    auto file = [&](int n) { return d + "/file" + std::to_string(n) + ".doc"; };
    auto existing = [&] { return file(std::uniform_int_distribution<int>(0, created - 1)(rng)); };
    const int action = pct(rng);
    std::string sub;
    for (int k = files_per_action(rng) + 1; k > 0; --k) {
      if (action < 30) {  // new files
        const std::string f = file(created++);
        emit(Line(0x40, false, f));
        emit(Line(0x2, false, f));
        emit(Line(0x4, false, f));
      } else if (action < 55) {  // edits
        const std::string f = existing();
        emit(Line(0x2, false, f));
        if (pct(rng) < 50) emit(Line(0x2, false, f));
        emit(Line(0x4, false, f));
      } else if (action < 65) {  // safe saves
        const std::string f = existing();
        const std::string tmp = d + "/~tmp" + std::to_string(pct(rng)) + ".tmp";
        emit(Line(0x40, false, tmp));
        emit(Line(0x2, false, tmp));
        emit(Line(0x100, false, f, tmp));
      } else if (action < 75) {  // deletes
        emit(Line(0x80, false, existing()));
      } else if (action < 83) {  // renames
        emit(Line(0x100, false, file(created++), existing()));
      } else if (action < 90) {  // attributes
        emit(Line(0x4, false, existing()));
      } else if (action < 94) {  // a new subfolder with files in it
        if (sub.empty()) {
          sub = d + "/sub" + std::to_string(created++);
          emit(Line(0x40, true, sub));
        }
        const std::string f = sub + "/file" + std::to_string(k) + ".doc";
        emit(Line(0x40, false, f));
        emit(Line(0x2, false, f));
        emit(Line(0x4, false, f));
      } else if (action < 97) {  // a subfolder removed
        emit(Line(0x80, true, d + "/sub" + std::to_string(pct(rng))));
        break;
      } else if (action < 99) {
        emit(Line(0x10000, false, d));
        break;
      } else {
        emit(Line(0x20000, false, d, "", "{\"document\":true,\"photo\":false}"));
        break;
      }
    }
  }
  return path;
}

// The worst case for the tree: each line's event and file drawn on their
// own, so that two lines in three name a file not seen before in the queue
// (and deletes or attribute changes often hit such a file). Bursts of a few
// to a few dozen lines stay in one folder.
std::string MakeScattered(size_t lines) {
  std::string path = TempDir() + "/scattered.queue";
  std::ofstream out(path);
  std::mt19937 rng(42);
  std::uniform_int_distribution<int> pct(0, 999);
  std::geometric_distribution<int> file(0.08), burst(0.1);
  size_t written = 0;
  while (written < lines) {
    const std::string d = LeafFolder(rng);
    for (int n = burst(rng) + 1; n > 0 && written < lines; --n, ++written) {
      std::string f = d + "/file" + std::to_string(file(rng)) + ".txt";
      int p = pct(rng);
      if (p < 400) {
        out << Line(0x2, false, f);
      } else if (p < 550) {
        out << Line(0x40, false, f);
      } else if (p < 650) {
        out << Line(0x4, false, f);
      } else if (p < 750) {
        out << Line(0x80, false, f);
      } else if (p < 850) {
        out << Line(0x42, false, f);
      } else if (p < 900) {
        out << Line(0x6, false, f);
      } else if (p < 960) {
        out << Line(0x100, false, f, d + "/file" + std::to_string(file(rng)) + ".txt");
      } else if (p < 970) {
        out << Line(0x40, true, d + "/sub" + std::to_string(file(rng)));
      } else if (p < 980) {
        out << Line(0x80, true, d + "/sub" + std::to_string(file(rng)));
      } else if (p < 990) {
        out << Line(0x10000, false, d);
      } else {
        out << Line(0x20000, false, d, "", "{\"document\":true,\"photo\":false}");
      }
    }
  }
  return path;
}

// `files` new files in `dirs` folders, one create each.
std::string MakeSpread(size_t files, size_t dirs, const std::string& name) {
  std::string path = TempDir() + "/" + name + ".queue";
  std::ofstream out(path);
  for (size_t i = 0; i < files; ++i) {
    out << Line(0x40, false,
                "/volume1/share/dir" + std::to_string(i % dirs) + "/file" + std::to_string(i) +
                    ".jpg");
  }
  return path;
}

const std::string& Queue(const std::string& which) {
  static std::map<std::string, std::string> queues;
  auto it = queues.find(which);
  if (it != queues.end()) return it->second;
  std::string path;
  if (which == "realistic") path = MakeRealistic(1000000);
  if (which == "scattered") path = MakeScattered(1000000);
  if (which == "wide") path = MakeSpread(100000, 1, "wide");
  if (which == "spread") path = MakeSpread(100000, 1000, "spread");
  return queues[which] = path;
}

void BM_Read(benchmark::State& state, const std::string& which) {
  const std::string& path = Queue(which);
  size_t lines = 0;
  for (auto _ : state) {
    vellis::LineReader reader;
    if (!reader.Open(path)) abort();
    std::string_view line;
    lines = 0;
    while (reader.Next(&line) == vellis::LineReader::Status::kLine) {
      benchmark::DoNotOptimize(line.data());
      ++lines;
    }
  }
  state.counters["lines"] = static_cast<double>(lines);
}

void ReadParseOnce(const std::string& path) {
  vellis::LineReader reader;
  if (!reader.Open(path)) abort();
  std::string_view line;
  while (reader.Next(&line) == vellis::LineReader::Status::kLine) {
    Json::Value v;
    bool ok = vellis::JsonFromString(v, std::string(line));
    benchmark::DoNotOptimize(ok);
  }
}

void BM_ReadParse(benchmark::State& state, const std::string& which) {
  const std::string& path = Queue(which);
  for (auto _ : state) ReadParseOnce(path);
}

// Reading plus turning each line into an Event (the parse and the field
// checks), without the tree.
void BM_ReadEvents(benchmark::State& state, const std::string& which) {
  const std::string& path = Queue(which);
  for (auto _ : state) {
    vellis::LineReader reader;
    if (!reader.Open(path)) abort();
    std::string_view line;
    std::string raw;
    auto e = std::make_shared<vellis::fileindex::Event>();  // reused, as the tree does
    while (reader.Next(&line) == vellis::LineReader::Status::kLine) {
      raw.assign(line);
      e->Assign(raw);
      benchmark::DoNotOptimize(e.get());
    }
  }
}

// Folding and parsing timed back to back, `pairs` times, in CPU time: the
// median of the per-pair ratios. This machine's speed wanders by tens of
// percent over a minute, so a ratio of two separate runs wanders too; two
// runs a few seconds apart see much the same machine.
struct PairedRatio {
  double median = 0, low = 0, high = 0;
};

double CpuSeconds() {
  timespec ts;
  clock_gettime(CLOCK_PROCESS_CPUTIME_ID, &ts);
  return static_cast<double>(ts.tv_sec) + static_cast<double>(ts.tv_nsec) * 1e-9;
}

PairedRatio FoldOverParse(const std::string& which, int pairs) {
  const std::string& path = Queue(which);
  std::vector<double> ratios;
  for (int i = 0; i < pairs; ++i) {
    const double t0 = CpuSeconds();
    ReadParseOnce(path);
    const double t1 = CpuSeconds();
    {
      OPTree tree(path);
      size_t delivered = 0;
      tree.ProcessOP([&](std::shared_ptr<OP>) { ++delivered; });
      benchmark::DoNotOptimize(delivered);
    }
    const double t2 = CpuSeconds();
    ratios.push_back((t2 - t1) / (t1 - t0));
  }
  std::sort(ratios.begin(), ratios.end());
  return {ratios[ratios.size() / 2], ratios.front(), ratios.back()};
}

size_t CountNodes(const std::shared_ptr<OPNode>& root) {
  size_t n = 0;
  std::vector<OPNode*> stack{root.get()};
  while (!stack.empty()) {
    OPNode* node = stack.back();
    stack.pop_back();
    ++n;
    for (const auto& c : node->children) stack.push_back(c.get());
  }
  return n;
}

struct TreeStats {
  size_t nodes = 0;
  size_t ops = 0;
  size_t delivered = 0;
  size_t heap = 0;
};
std::map<std::string, TreeStats> g_stats;

void BM_Fold(benchmark::State& state, const std::string& which) {
  const std::string& path = Queue(which);
  for (auto _ : state) {
    state.PauseTiming();  // mallinfo2 walks the heap: not part of folding
    size_t before = mallinfo2().uordblks;
    state.ResumeTiming();
    OPTree tree(path);
    size_t delivered = 0;
    tree.ProcessOP([&](std::shared_ptr<OP>) { ++delivered; });
    state.PauseTiming();
    TreeStats s;
    s.heap = mallinfo2().uordblks - before;
    s.nodes = CountNodes(tree.root);
    s.ops = tree.ops.size();
    s.delivered = delivered;
    g_stats[which] = s;
    state.ResumeTiming();
  }
  state.counters["nodes"] = static_cast<double>(g_stats[which].nodes);
  state.counters["ops"] = static_cast<double>(g_stats[which].ops);
}

// Heap held per node by the tree structure alone: the nodes of every path of
// a queue made through the tree's own lookup, without any operation.
double BytesPerNode(const std::string& which, size_t* nodes) {
  std::vector<std::string> paths;
  {
    vellis::LineReader reader;
    if (!reader.Open(Queue(which))) abort();
    std::string_view line;
    while (reader.Next(&line) == vellis::LineReader::Status::kLine) {
      paths.push_back(vellis::fileindex::Event(std::string(line)).path);
    }
  }
  std::string empty = TempDir() + "/empty.queue";
  std::ofstream(empty).close();
  size_t before = mallinfo2().uordblks;
  OPTree tree(empty);
  for (const auto& p : paths) tree.GetNodeByPath(p);
  size_t heap = mallinfo2().uordblks - before;
  *nodes = CountNodes(tree.root);
  return static_cast<double>(heap) / static_cast<double>(*nodes);
}

// Heap held by one attached operation (the object and its two slots).
double BytesPerOp() {
  constexpr int kN = 100000;
  auto node = std::make_shared<OPNode>(nullptr, "n");
  std::vector<std::shared_ptr<OP>> a, b;
  a.reserve(kN);
  b.reserve(kN);
  size_t before = mallinfo2().uordblks;
  for (int i = 0; i < kN; ++i) {
    a.push_back(std::make_shared<OP>(node, vellis::fileindex::FILE_INDEX_OP_UPSERT, "",
                                     Json::Value()));
  }
  size_t objects = mallinfo2().uordblks - before;
  b = a;
  return static_cast<double>(objects) / kN + 2 * sizeof(std::shared_ptr<OP>);
}

// Keeps each run's time so that main() can print the ratios.
class RatioReporter : public benchmark::ConsoleReporter {
 public:
  void ReportRuns(const std::vector<Run>& runs) override {
    // The median of the repetitions when there are several (this machine's
    // timings wander from run to run), else the single run; CPU time, so
    // that other work on the machine counts less.
    for (const auto& r : runs) {
      std::string name = r.run_name.str();
      name = name.substr(0, name.find("/repeats:"));
      if (r.run_type == Run::RT_Aggregate && r.aggregate_name == "median") {
        seconds_[name] = r.GetAdjustedCPUTime();
        medians_.insert(name);
      } else if (r.run_type == Run::RT_Iteration && r.iterations > 0 && !medians_.count(name)) {
        seconds_[name] = r.GetAdjustedCPUTime();
      }
    }
    ConsoleReporter::ReportRuns(runs);
  }
  double Seconds(const std::string& name) const {
    auto it = seconds_.find(name);
    return it == seconds_.end() ? 0 : it->second;
  }

 private:
  std::map<std::string, double> seconds_;
  std::set<std::string> medians_;
};

}  // namespace

BENCHMARK_CAPTURE(BM_Read, realistic, std::string("realistic"))->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(BM_ReadParse, realistic, std::string("realistic"))
    ->Unit(benchmark::kMillisecond)
    ->Repetitions(3);
BENCHMARK_CAPTURE(BM_ReadEvents, realistic, std::string("realistic"))
    ->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(BM_Fold, realistic, std::string("realistic"))
    ->Unit(benchmark::kMillisecond)
    ->Repetitions(3);
BENCHMARK_CAPTURE(BM_ReadParse, scattered, std::string("scattered"))
    ->Unit(benchmark::kMillisecond)
    ->Repetitions(3);
BENCHMARK_CAPTURE(BM_Fold, scattered, std::string("scattered"))
    ->Unit(benchmark::kMillisecond)
    ->Repetitions(3);
BENCHMARK_CAPTURE(BM_ReadParse, wide, std::string("wide"))->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(BM_Fold, wide, std::string("wide"))->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(BM_Fold, spread, std::string("spread"))->Unit(benchmark::kMillisecond);

int main(int argc, char** argv) {
  benchmark::Initialize(&argc, argv);
  RatioReporter reporter;
  benchmark::RunSpecifiedBenchmarks(&reporter);

  auto ratio = [&](const char* a, const char* b) {
    double sa = reporter.Seconds(a), sb = reporter.Seconds(b);
    return sb > 0 ? sa / sb : 0.0;
  };
  // The runs above give each figure alone; the ratios against parsing come
  // from pairs timed back to back (see FoldOverParse).
  constexpr int kPairs = 7;
  const PairedRatio realistic = FoldOverParse("realistic", kPairs);
  const PairedRatio scattered = FoldOverParse("scattered", kPairs);
  printf("\nfold / read+parse (realistic): %.2f  (target <= 1.5; median of %d pairs, %.2f-%.2f)\n",
         realistic.median, kPairs, realistic.low, realistic.high);
  printf("fold / read alone (realistic): %.2f\n", ratio("BM_Fold/realistic", "BM_Read/realistic"));
  printf("fold / read+parse (scattered): %.2f  (worst case: most lines name a new file; %.2f-%.2f)\n",
         scattered.median, scattered.low, scattered.high);
  printf("fold wide / fold spread:       %.2f  (target <= 2)\n",
         ratio("BM_Fold/wide", "BM_Fold/spread"));
  double per_op = BytesPerOp();
  printf("heap per attached operation:   %.0f bytes\n", per_op);
  for (const auto& [name, s] : g_stats) {
    size_t nodes = 0;
    double per_node = BytesPerNode(name, &nodes);
    printf("%-10s nodes %8zu  ops %8zu  delivered %8zu  heap of the folded tree %6.1f MiB\n"
           "           tree structure alone: %5.0f bytes per node (target < 200 + name)\n",
           name.c_str(), s.nodes, s.ops, s.delivered, s.heap / 1048576.0, per_node);
  }
  rusage ru;
  getrusage(RUSAGE_SELF, &ru);
  printf("peak RSS of the whole run:     %.1f MiB\n", ru.ru_maxrss / 1024.0);
  benchmark::Shutdown();
  std::string cmd = "rm -rf '" + TempDir() + "'";
  return system(cmd.c_str()) == 0 ? 0 : 1;
}
