// The file-change monitor end to end: the built vellis-monitord as a child
// process (-f) under a fresh temporary root ($VELLIS_ROOT), its
// configuration written with MonitorQueue::Upsert, its queue files read as
// they grow. For each backend (inotify, and fanotify when it can run here):
//
//   1. latency     --samples changes (default 200), one at a time, half of
//                  them files created, half files written and closed; the
//                  time from the change until its line is in the queue;
//                  median, p99, max. Target: p99 < 100 ms.
//   2. throughput  --writers threads (default 4) create --files files
//                  (default 100,000) as fast as they can; the time until
//                  every line (a create 0x40 and, at the close, 0x2 per
//                  file) is in the queue, or a crash marker (0x200) shows
//                  that the kernel's queue overflowed. Lines per second,
//                  watcher events per second (the status's "events") and
//                  the monitor's CPU time (user + system, /proc/<pid>/stat)
//                  per line. Target: >= 100,000 events/s. Writers on a
//                  shared machine may be slower than the monitor, so the
//                  monitor's own pace is measured too ("backlog"): rounds
//                  of 6,000 files created while it is stopped (SIGSTOP),
//                  timed from SIGCONT until their lines are in the queue.
//   3. memory      a tree of --dirs folders (default 100,000); the monitor's
//                  VmRSS once its status shows every folder watched, minus
//                  its VmRSS on an empty folder; bytes per watched folder
//                  (target < 1 KiB) and the time to watch the tree. The
//                  fanotify backend on the same tree for comparison. When
//                  fs.inotify.max_user_watches is too low it is raised for
//                  the run and put back.
//
// Binary: $MONITORD_BIN, else build/bin/ below the current folder, else
// ../bin/ next to this program. Run from the source folder as root, in a
// process namespace of its own:
//
//   unshare -fp --mount-proc build/bench/monitord_bench [--samples=N]
//       [--files=N] [--writers=N] [--dirs=N] [--backend=inotify|fanotify|both]
//       [--phases=latency,throughput,memory] [--keep] [--monitor-arg=...]
//
// A quick run: --samples=40 --files=10000 --dirs=5000. --monitor-arg passes
// an option to the monitor (e.g. --monitor-arg=--move-grace-ms=0). --keep
// leaves the temporary root (with the monitor's logs) in place; a run that
// ends with an error always does. Exit status 0 when every phase ran
// (targets missed are reported, not failed); 1 otherwise.
#include <fcntl.h>
#include <ftw.h>
#include <poll.h>
#include <sys/inotify.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "bench/monitord_bench_util.h"
#include "fileindex/optree.h"
#include "sdk/monitor_queue.h"

namespace {

using vellis::bench::Clock;
using vellis::bench::MonitorProcess;
using vellis::bench::Percentile;
using vellis::bench::QueueTail;
using vellis::bench::SecondsSince;
using vellis::bench::Sleep;

constexpr char kApp[] = "monbench";

struct Options {
  int samples = 200;
  size_t files = 100000;
  int writers = 4;
  size_t dirs = 100000;
  std::vector<std::string> backends = {"inotify", "fanotify"};
  bool latency = true, throughput = true, memory = true;
  bool keep = false;
  std::vector<std::string> monitor_args;
};

struct Row {
  std::string backend, figure, value, target;
};

struct Bench {
  Options opt;
  std::string root;
  std::string bin;
  std::string queue;  // the queue in the configuration now
  std::vector<Row> rows;
  std::vector<std::string> notes;
};

std::string Fmt(const char* fmt, double v) {
  char buf[64];
  snprintf(buf, sizeof(buf), fmt, v);
  return buf;
}

// The configuration holds one queue, `queue`, fed by `folder` with every
// event bit.
void Configure(Bench& b, const std::string& queue, const std::string& folder) {
  using vellis::sdk::MonitorQueue;
  if (!b.queue.empty() &&
      !MonitorQueue::Delete(b.queue, kApp, vellis::sdk::MONITOR_QUEUE_TYPE_APPLICATION)) {
    throw std::runtime_error("MonitorQueue::Delete failed");
  }
  Json::Value q(Json::objectValue);
  q["queue"] = queue;
  Json::Value item(Json::objectValue);
  item["path"] = folder;
  item["mask"] = 0xFFFFFFFFu;
  item["ignore"] = Json::Value(Json::arrayValue);
  q["config"].append(item);
  if (!MonitorQueue::Upsert(MonitorQueue(q), kApp, vellis::sdk::MONITOR_QUEUE_TYPE_APPLICATION)) {
    throw std::runtime_error("MonitorQueue::Upsert failed");
  }
  b.queue = queue;
}

void StartMonitor(Bench& b, MonitorProcess& m, const std::string& backend, const std::string& tag) {
  std::vector<std::string> args = {"-f", "--backend", backend};
  args.insert(args.end(), b.opt.monitor_args.begin(), b.opt.monitor_args.end());
  m.Start(b.bin, args, b.root + "/monitord-" + tag + "-" + backend + ".log");
}

void CreateFile(const std::string& path) {
  const int fd = open(path.c_str(), O_CREAT | O_EXCL | O_WRONLY | O_CLOEXEC, 0644);
  if (fd < 0) throw std::runtime_error("create " + path + ": " + strerror(errno));
  close(fd);
}

void WriteFile(const std::string& path) {
  const int fd = open(path.c_str(), O_WRONLY | O_APPEND | O_CLOEXEC);
  if (fd < 0) throw std::runtime_error("open " + path + ": " + strerror(errno));
  const char text[] = "changed\n";
  const bool ok = write(fd, text, sizeof(text) - 1) == static_cast<ssize_t>(sizeof(text) - 1);
  close(fd);
  if (!ok) throw std::runtime_error("write " + path + ": " + strerror(errno));
}

// ---------------------------------------------------------------------------
// 1. Latency

void LatencyPhase(Bench& b, const std::string& backend) {
  const std::string data = b.root + "/data/latency-" + backend;
  const std::string qdir = b.root + "/queues/latency-" + backend;
  vellis::bench::MakeDirs(data);
  vellis::bench::MakeDirs(qdir);
  const int modifies = b.opt.samples / 2;
  for (int i = 0; i < modifies; ++i) CreateFile(data + "/m" + std::to_string(i));
  Configure(b, qdir + "/queue", data);

  // Woken by the queue's growth rather than polling it.
  const int ino = inotify_init1(IN_NONBLOCK | IN_CLOEXEC);
  if (ino < 0 || inotify_add_watch(ino, qdir.c_str(), IN_MODIFY | IN_CREATE) < 0) {
    throw std::runtime_error("inotify on the queue folder failed");
  }
  MonitorProcess m;
  StartMonitor(b, m, backend, "latency");
  m.WaitReady(data, 1, 30);
  QueueTail tail(qdir + "/queue");

  std::vector<double> all, created, written;
  int missed = 0;
  std::string lines;
  for (int i = 0; i < b.opt.samples; ++i) {
    const bool create = i % 2 == 0 || i / 2 >= modifies;
    const std::string path = data + (create ? "/c" : "/m") + std::to_string(i / 2);
    const std::string want =
        std::string("{\"event\":") +
        std::to_string(create ? vellis::fileindex::kEventCreate : vellis::fileindex::kEventModify) +
        ",\"is_dir\":false,\"path\":\"" + path + "\"";
    const Clock::time_point start = Clock::now();
    create ? CreateFile(path) : WriteFile(path);
    bool found = false;
    while (!found && SecondsSince(start) < 5) {
      lines.clear();
      tail.Read(&lines);
      found = lines.find(want) != std::string::npos;
      if (found) break;
      pollfd p = {ino, POLLIN, 0};
      poll(&p, 1, 50);
      char buf[4096];
      while (read(ino, buf, sizeof(buf)) > 0) {
      }
    }
    const double ms = std::chrono::duration<double, std::milli>(Clock::now() - start).count();
    if (!found) {
      ++missed;
      m.CheckAlive();
    } else {
      all.push_back(ms);
      (create ? created : written).push_back(ms);
    }
    Sleep(10);  // idle between changes
    lines.clear();
    tail.Read(&lines);  // the close's 0x2 of a created file, left out
  }
  close(ino);
  m.Stop();

  auto add = [&](const std::string& what, const std::vector<double>& v) {
    b.rows.push_back({backend, "latency " + what + " median / p99 / max (ms)",
                      Fmt("%.2f", Percentile(v, 50)) + " / " + Fmt("%.2f", Percentile(v, 99)) +
                          " / " + Fmt("%.2f", Percentile(v, 100)) +
                          " (n=" + std::to_string(v.size()) + ")",
                      what == "all" ? "p99 < 100" : ""});
  };
  add("all", all);
  add("create", created);
  add("write+close", written);
  if (missed > 0) {
    b.notes.push_back(backend + ": " + std::to_string(missed) + " changes had no line within 5 s");
  }
}

// ---------------------------------------------------------------------------
// 2. Throughput

struct Drain {
  size_t expected = 0, lines = 0, crashes = 0;
  int rounds = 0;
  double seconds = 0, cpu = 0;
};

// The monitor's own pace, whatever the writers' speed: rounds in which the
// monitor is stopped (SIGSTOP), a batch of files is created, and the time
// from SIGCONT until the batch's lines are in the queue is summed. A batch
// stays below the kernel's queue (fs.inotify.max_queued_events, 16384 by
// default; fanotify's 16384) so nothing overflows.
Drain DrainRounds(MonitorProcess& m, QueueTail& tail, const std::string& prefix, size_t files) {
  constexpr size_t kBatch = 6000;  // 12,000 events with inotify
  Drain d;
  std::string chunk;
  for (size_t done = 0; done < files; done += kBatch) {
    const size_t batch = std::min(kBatch, files - done);
    if (m.pid() <= 0) break;
    kill(m.pid(), SIGSTOP);
    for (size_t i = done; i < done + batch; ++i) CreateFile(prefix + std::to_string(i));
    const double cpu_before = vellis::bench::ProcessCpuSeconds(m.pid());
    const Clock::time_point start = Clock::now();
    kill(m.pid(), SIGCONT);
    const size_t want = 2 * batch;
    size_t lines = 0, crashes = 0;
    Clock::time_point last = start;
    while (lines < want && SecondsSince(last) < 2.0) {
      chunk.clear();
      if (tail.Read(&chunk) > 0) {
        last = Clock::now();
        lines += static_cast<size_t>(std::count(chunk.begin(), chunk.end(), '\n'));
        crashes += chunk.find("{\"event\":512,") != std::string::npos;
      } else {
        Sleep(1);
      }
    }
    d.seconds += std::chrono::duration<double>(last - start).count();
    d.cpu += vellis::bench::ProcessCpuSeconds(m.pid()) - cpu_before;
    d.expected += want;
    d.lines += lines;
    d.crashes += crashes;
    ++d.rounds;
    m.CheckAlive();
  }
  return d;
}

void ThroughputPhase(Bench& b, const std::string& backend) {
  const std::string data = b.root + "/data/throughput-" + backend;
  const std::string qdir = b.root + "/queues/throughput-" + backend;
  const int writers = std::max(1, b.opt.writers);
  for (int w = 0; w < writers; ++w) vellis::bench::MakeDirs(data + "/w" + std::to_string(w));
  vellis::bench::MakeDirs(qdir);
  Configure(b, qdir + "/queue", data);

  MonitorProcess m;
  StartMonitor(b, m, backend, "throughput");
  m.WaitReady(data, backend == "inotify" ? writers + 1 : 1, 30);
  Sleep(1100);  // a fresh status, so the events counted before are known
  const uint64_t events_before = m.Status()["events"].asUInt64();
  QueueTail tail(qdir + "/queue");

  const size_t files = b.opt.files;
  const size_t expected = 2 * files;  // a create and a close per file
  const char crash[] = "{\"event\":512,";
  static_assert(vellis::fileindex::kEventCrash == 512);
  const double cpu_before = vellis::bench::ProcessCpuSeconds(m.pid());
  std::atomic<int> running{writers};
  std::atomic<double> writers_s{0};
  std::mutex error_mu;
  std::string error;
  const Clock::time_point start = Clock::now();
  std::vector<std::thread> threads;
  for (int w = 0; w < writers; ++w) {
    threads.emplace_back([&, w] {
      const std::string dir = data + "/w" + std::to_string(w) + "/f";
      try {
        for (size_t i = static_cast<size_t>(w); i < files; i += static_cast<size_t>(writers)) {
          CreateFile(dir + std::to_string(i));
        }
      } catch (const std::exception& e) {
        std::lock_guard<std::mutex> lock(error_mu);
        error = e.what();
      }
      if (--running == 0) writers_s = SecondsSince(start);
    });
  }

  size_t lines = 0, crashes = 0;
  Clock::time_point last_growth = start;
  std::string chunk;
  for (;;) {
    chunk.clear();
    if (tail.Read(&chunk) > 0) {
      last_growth = Clock::now();
      lines += static_cast<size_t>(std::count(chunk.begin(), chunk.end(), '\n'));
      for (size_t at = chunk.find(crash); at != std::string::npos; at = chunk.find(crash, at + 1))
        ++crashes;
    }
    if (lines >= expected) break;
    // Lines lost to an overflow never come: stop once the queue is quiet.
    const double quiet = std::chrono::duration<double>(Clock::now() - last_growth).count();
    if (running == 0 && quiet > (crashes > 0 ? 2.0 : 10.0)) break;
    m.CheckAlive();
    Sleep(2);
  }
  const double wall = std::chrono::duration<double>(last_growth - start).count();
  const double cpu = vellis::bench::ProcessCpuSeconds(m.pid()) - cpu_before;
  for (std::thread& t : threads) t.join();
  if (!error.empty()) throw std::runtime_error("writer: " + error);
  Sleep(1100);
  const uint64_t events = m.Status()["events"].asUInt64() - events_before;
  const uint64_t overflows = m.Status()["overflows"].asUInt64();
  const Drain drain = DrainRounds(m, tail, data + "/w0/b", files);
  m.Stop();

  const std::string n = std::to_string(files) + " files, " + std::to_string(writers) + " writers";
  b.rows.push_back({backend, "throughput: lines in queue / expected",
                    std::to_string(lines) + " / " + std::to_string(expected) + " (" + n + ")", ""});
  b.rows.push_back({backend, "throughput: crash markers (0x200) / overflows",
                    std::to_string(crashes) + " / " + std::to_string(overflows), "0"});
  b.rows.push_back({backend, "throughput: writers' time / until last line (s)",
                    Fmt("%.3f", writers_s.load()) + " / " + Fmt("%.3f", wall), ""});
  b.rows.push_back({backend, "throughput: queue lines/s", Fmt("%.0f", lines / wall), ">= 100000"});
  b.rows.push_back(
      {backend, "throughput: watcher events/s (status \"events\")",
       Fmt("%.0f", static_cast<double>(events) / wall) + " (" + std::to_string(events) + " events)",
       ""});
  b.rows.push_back({backend, "throughput: monitor CPU s / us per line",
                    Fmt("%.3f", cpu) + " / " + Fmt("%.2f", lines ? cpu * 1e6 / lines : 0), ""});
  b.rows.push_back({backend, "backlog: lines drained / expected",
                    std::to_string(drain.lines) + " / " + std::to_string(drain.expected) + " (" +
                        std::to_string(drain.rounds) + " rounds)",
                    ""});
  b.rows.push_back({backend, "backlog: drain lines/s",
                    Fmt("%.0f", drain.seconds > 0 ? drain.lines / drain.seconds : 0), ">= 100000"});
  b.rows.push_back({backend, "backlog: monitor CPU s / us per line",
                    Fmt("%.3f", drain.cpu) + " / " +
                        Fmt("%.2f", drain.lines ? drain.cpu * 1e6 / drain.lines : 0),
                    ""});
  if (drain.crashes > 0) {
    b.notes.push_back(backend + ": backlog: " + std::to_string(drain.crashes) + " crash markers");
  }
  if (lines < expected && crashes == 0) {
    b.notes.push_back(backend + ": throughput: lines missing without a crash marker");
  }
}

// ---------------------------------------------------------------------------
// 3. Memory

// `count` folders below `top`: sqrt(count) folders t<i>, the rest spread
// below them.
void MakeTree(const std::string& top, size_t count) {
  vellis::bench::MakeDirs(top);
  size_t fanout = 1;
  while (fanout * fanout < count) ++fanout;
  for (size_t i = 0; i < count; ++i) {
    const std::string path =
        i < fanout ? top + "/t" + std::to_string(i)
                   : top + "/t" + std::to_string(i % fanout) + "/d" + std::to_string(i);
    if (mkdir(path.c_str(), 0755) != 0 && errno != EEXIST) {
      throw std::runtime_error("mkdir " + path + ": " + strerror(errno));
    }
  }
}

struct RssFigure {
  uint64_t rss_kib = 0;
  uint64_t watches = 0;
  double ready_s = 0;
};

RssFigure MeasureRss(Bench& b, const std::string& backend, const std::string& folder,
                     uint64_t watches, const std::string& tag) {
  Configure(b, b.root + "/queues/memory/queue", folder);
  MonitorProcess m;
  const Clock::time_point start = Clock::now();
  StartMonitor(b, m, backend, tag);
  const Json::Value s = m.WaitReady(folder, watches, 600);
  RssFigure f;
  f.ready_s = SecondsSince(start);
  Sleep(300);
  f.rss_kib = vellis::bench::ProcStatusKiB(m.pid(), "VmRSS");
  f.watches = s["watches"].asUInt64();
  m.Stop();
  return f;
}

// False when a backend could not be measured.
bool MemoryPhase(Bench& b) {
  bool ok = true;
  const std::string empty = b.root + "/data/memory-empty";
  const std::string tree = b.root + "/data/memory-tree";
  vellis::bench::MakeDirs(empty);
  const Clock::time_point made = Clock::now();
  MakeTree(tree, b.opt.dirs);
  fprintf(stderr, "  tree of %zu folders made in %.1f s\n", b.opt.dirs, SecondsSince(made));
  vellis::bench::WatchLimit limit;
  const uint64_t dirs = b.opt.dirs;
  for (const std::string& backend : b.opt.backends) {
    if (backend == "inotify") {
      // Other programs of this user hold watches too: leave them room.
      const uint64_t want = dirs + 1 + 65536;
      if (!limit.Ensure(want)) {
        b.notes.push_back("fs.inotify.max_user_watches is " + std::to_string(limit.Read()) +
                          " and could not be raised to " + std::to_string(want));
      }
    }
    const uint64_t need = backend == "inotify" ? dirs + 1 : 1;
    RssFigure base, full;
    try {
      base = MeasureRss(b, backend, empty, 1, "memory-empty");
      full = MeasureRss(b, backend, tree, need, "memory-tree");
    } catch (const std::exception& e) {
      b.notes.push_back(backend + ": memory: " + e.what());
      ok = false;
      continue;
    }
    const double per_dir = (static_cast<double>(full.rss_kib) - static_cast<double>(base.rss_kib)) *
                           1024.0 / static_cast<double>(dirs);
    b.rows.push_back({backend, "memory: VmRSS empty / tree (KiB)",
                      std::to_string(base.rss_kib) + " / " + std::to_string(full.rss_kib) + " (" +
                          std::to_string(full.watches) + " watches)",
                      ""});
    b.rows.push_back({backend, "memory: bytes per folder of the tree", Fmt("%.0f", per_dir),
                      backend == "inotify" ? "< 1024" : ""});
    b.rows.push_back(
        {backend, "memory: start until tree watched (s)", Fmt("%.2f", full.ready_s), ""});
  }
  b.notes.push_back("fs.inotify.max_user_watches: " + std::to_string(limit.original()) +
                    (limit.raised() ? " (raised for the run to " + std::to_string(limit.Read()) +
                                          ", put back after)"
                                    : " (left as it was)"));
  return ok;
}

// ---------------------------------------------------------------------------

bool ParseArgs(int argc, char** argv, Options* o) {
  for (int i = 1; i < argc; ++i) {
    const std::string a = argv[i];
    auto value = [&a](const char* name, std::string* v) {
      const std::string prefix = std::string(name) + "=";
      if (a.rfind(prefix, 0) != 0) return false;
      *v = a.substr(prefix.size());
      return true;
    };
    std::string v;
    if (value("--samples", &v)) {
      o->samples = std::max(2, std::stoi(v));
    } else if (value("--files", &v)) {
      o->files = std::stoul(v);
    } else if (value("--writers", &v)) {
      o->writers = std::stoi(v);
    } else if (value("--dirs", &v)) {
      o->dirs = std::max<size_t>(1, std::stoul(v));
    } else if (value("--backend", &v)) {
      if (v == "both") {
        o->backends = {"inotify", "fanotify"};
      } else if (v == "inotify" || v == "fanotify") {
        o->backends = {v};
      } else {
        fprintf(stderr, "--backend: inotify, fanotify or both\n");
        return false;
      }
    } else if (value("--phases", &v)) {
      o->latency = v.find("latency") != std::string::npos;
      o->throughput = v.find("throughput") != std::string::npos;
      o->memory = v.find("memory") != std::string::npos;
    } else if (value("--monitor-arg", &v)) {
      o->monitor_args.push_back(v);
    } else if (a == "--keep") {
      o->keep = true;
    } else {
      fprintf(stderr,
              "usage: %s [--samples=N] [--files=N] [--writers=N] [--dirs=N]\n"
              "    [--backend=inotify|fanotify|both] [--phases=latency,throughput,memory]\n"
              "    [--monitor-arg=ARG ...] [--keep]\n",
              argv[0]);
      return false;
    }
  }
  return true;
}

int RemoveEntry(const char* path, const struct stat*, int, struct FTW*) {
  remove(path);
  return 0;
}

void PrintTable(const Bench& b) {
  printf("\n%-9s  %-48s  %-40s  %s\n", "backend", "figure", "value", "target");
  for (const Row& r : b.rows) {
    printf("%-9s  %-48s  %-40s  %s\n", r.backend.c_str(), r.figure.c_str(), r.value.c_str(),
           r.target.c_str());
  }
  for (const std::string& n : b.notes) printf("note: %s\n", n.c_str());
}

}  // namespace

int main(int argc, char** argv) {
  Bench b;
  if (!ParseArgs(argc, argv, &b.opt)) return 2;
  signal(SIGPIPE, SIG_IGN);
  bool failed = false;
  try {
    b.bin = vellis::bench::FindBinary("MONITORD_BIN", "vellis-monitord");
    char tmpl[] = "/tmp/monitord_bench.XXXXXX";
    if (mkdtemp(tmpl) == nullptr) throw std::runtime_error("mkdtemp failed");
    b.root = tmpl;
    setenv(vellis::kRootEnv, b.root.c_str(), 1);
    vellis::PrepareRoot();
    fprintf(stderr, "root %s, monitor %s\n", b.root.c_str(), b.bin.c_str());
    for (const std::string& backend : b.opt.backends) {
      try {
        if (b.opt.latency) {
          fprintf(stderr, "== latency, %s\n", backend.c_str());
          LatencyPhase(b, backend);
        }
        if (b.opt.throughput) {
          fprintf(stderr, "== throughput, %s\n", backend.c_str());
          ThroughputPhase(b, backend);
        }
      } catch (const std::exception& e) {
        b.notes.push_back(backend + ": phase ended: " + e.what());
        failed = true;
      }
    }
    if (b.opt.memory) {
      fprintf(stderr, "== memory\n");
      if (!MemoryPhase(b)) failed = true;
    }
  } catch (const std::exception& e) {
    b.notes.push_back(std::string("run ended: ") + e.what());
    failed = true;
  }
  PrintTable(b);
  if (b.opt.keep || failed) {
    if (!b.root.empty()) printf("root kept, with the monitor's logs: %s\n", b.root.c_str());
  } else if (!b.root.empty()) {
    nftw(b.root.c_str(), RemoveEntry, 64, FTW_DEPTH | FTW_PHYS);
  }
  return failed ? 1 : 0;
}
