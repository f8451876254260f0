// The indexing pipeline end to end: the built vellis-searchd and
// vellis-fileindexd as child processes (--foreground) under a fresh
// temporary root ($VELLIS_ROOT, services not started: VELLIS_SERVICES=none),
// driven the way a user and the file-change monitor drive them.
//
//   1. corpus       a deterministic tree of --files files (default 20,000;
//                   fileindexd_corpus.h) in the share "bench", folder
//                   /bench/corpus.
//   2. full index   FolderAdd of the folder (as `vellis folder add` does) on
//                   an empty index, until the round is over; files/second.
//   3. reindex      FolderReindex of the unchanged folder (`vellis folder
//                   reindex`), until the round is over. Target: < 5 s.
//   4. latency      --samples times: a file is changed or created, its queue
//                   lines are appended as the monitor appends them, and a
//                   search for a word only it holds is repeated until it
//                   answers; median and max. Target: < 2 s.
//   5. event burst  --events queue lines (default 100,000) written at once:
//                   creates, repeated edits and attribute changes of the
//                   same files, and deletes; until drained, then the
//                   documents are checked.
//
// Every phase prints its wall time and the CPU time (user + system, from
// /proc/<pid>/stat) that each daemon and this program spent in it; the
// daemons' round times come from the "status" command. Each wait polls
// "status" (or a search) and has a time-out that ends the run. Documents
// are the folder itself, its subfolders and its files. A worker lets its
// queue settle (--settle-ms, 1 s by default) before each round, so the
// figures of phases 2 to 5 include that wait; the notes give the rounds'
// own times.
//
// Binaries: $SEARCHD_BIN / $FILEINDEXD_BIN, else build/bin/ below the
// current folder, else ../bin/ next to this program. Run from the source
// folder, in a process namespace of its own ($FILEINDEXD_BENCH_FILES also
// sets --files):
//
//   unshare -fp --mount-proc build/bench/fileindexd_bench [--files=2000]
//       [--events=N] [--samples=N] [--seed=N] [--keep]
//       [--daemon-arg=--settle-ms=200 ...]
//
// --keep leaves the temporary root (with the daemons' logs) in place; a run
// that ends with an error always does. Exit status 0: every phase ran and
// every check held (targets missed are reported, not failed); 1 otherwise.
#include <fcntl.h>
#include <ftw.h>
#include <json/json.h>
#include <signal.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <functional>
#include <stdexcept>
#include <string>
#include <utility>
#include <vector>

#include "bench/fileindexd_bench_util.h"
#include "bench/fileindexd_corpus.h"
#include "common/error.h"
#include "common/json_util.h"
#include "common/lock_file.h"
#include "common/root_path.h"
#include "fileindex/elastic/comm.h"
#include "fileindex/elastic/communication.h"
#include "fileindex/index_mgr.h"
#include "fileindex/optree.h"
#include "fileindex/queue_mgr.h"
#include "sdk/domain_socket.h"
#include "sdk/linux/share_registry.h"
#include "sdk/share.h"

namespace {

using vellis::bench::Clock;
using vellis::bench::Corpus;
using vellis::bench::Daemon;
using vellis::bench::SecondsSince;
using vellis::bench::Sleep;

constexpr char kShare[] = "bench";
constexpr char kFolder[] = "/bench/corpus";  // share form
constexpr char kIndex[] = "fileindex_bench";

volatile sig_atomic_t g_stop = 0;

struct Options {
  size_t files = 20000;
  size_t events = 100000;
  int samples = 20;
  uint64_t seed = 20240611;
  bool keep = false;
  std::vector<std::string> daemon_args;  // extra arguments of vellis-fileindexd
};

struct Daemons {
  Daemon searchd;
  Daemon fileindexd;
};

// CPU seconds spent so far by the two daemons and this program.
struct CpuSnapshot {
  double searchd = 0, fileindexd = 0, self = 0;
};

CpuSnapshot TakeCpu(const Daemons& d) {
  return {vellis::bench::ProcessCpuSeconds(d.searchd.pid()),
          vellis::bench::ProcessCpuSeconds(d.fileindexd.pid()), vellis::bench::SelfCpuSeconds()};
}

// One line of the result table.
struct Row {
  std::string phase;
  double wall_s = 0;
  std::string rate;
  CpuSnapshot cpu;  // spent during the phase
  std::string note;
};

Row MakeRow(const std::string& phase, Clock::time_point start, const CpuSnapshot& before,
            const Daemons& d) {
  Row r;
  r.phase = phase;
  r.wall_s = SecondsSince(start);
  const CpuSnapshot now = TakeCpu(d);
  r.cpu = {now.searchd - before.searchd, now.fileindexd - before.fileindexd,
           now.self - before.self};
  return r;
}

std::string Format(const char* fmt, double v) {
  char buf[64];
  snprintf(buf, sizeof(buf), fmt, v);
  return buf;
}

// The share's part of the indexing daemon's "status" answer.
Json::Value ShareStatus() {
  const std::string text = vellis::fileindex::SendCommandToDaemon("status", Json::Value());
  Json::Value answer;
  if (!vellis::JsonFromString(answer, text) || !answer["success"].asBool()) {
    throw std::runtime_error("status failed: " + text);
  }
  return answer["data"]["shares"][kShare];
}

// The number of documents of the share's index that match `query`.
int64_t SearchTotal(const std::string& query) {
  Json::Value request(Json::objectValue);
  request["command"] = "document_search";
  request["data"]["id"] = kIndex;
  request["data"]["query"] = query;
  request["data"]["limit"] = 0;
  Json::Value answer =
      vellis::sdk::Exchange(vellis::RootPath(vellis::kElasticSocketPath), request, 10000);
  if (!answer["success"].asBool()) {
    throw std::runtime_error("search failed: " + vellis::JsonToString(answer));
  }
  return answer["data"]["total"].asInt64();
}

// Polls `done` every `poll_ms` until it holds; throws after `timeout_s`.
// Progress goes to stderr every 5 s.
void WaitFor(Daemons& d, const std::string& what, double timeout_s, int poll_ms,
             const std::function<bool(const Json::Value&)>& done) {
  const Clock::time_point start = Clock::now();
  double next_report = 5;
  for (;;) {
    if (g_stop) throw std::runtime_error("interrupted");
    d.searchd.CheckAlive();
    d.fileindexd.CheckAlive();
    const Json::Value s = ShareStatus();
    if (done(s)) return;
    const double t = SecondsSince(start);
    if (t > timeout_s) {
      throw std::runtime_error(what + ": not done after " + Format("%.0f", t) +
                               " s; status: " + vellis::JsonToString(s));
    }
    if (t >= next_report) {
      fprintf(stderr, "  %s: %.0f s, state %s, %s documents, %s waiting, crawled %s\n",
              what.c_str(), t, s["state"].asCString(), s["documents"].asString().c_str(),
              s["events_waiting"].asString().c_str(), s["crawl"]["crawled"].asString().c_str());
      next_report += 5;
    }
    Sleep(poll_ms);
  }
}

// A round that began after `rounds_before` rounds is over and no event
// waits.
std::function<bool(const Json::Value&)> RoundsDone(uint64_t rounds_before) {
  return [rounds_before](const Json::Value& s) {
    return s["rounds"].asUInt64() > rounds_before && s["state"].asString() == "idle" &&
           s["events_waiting"].asInt64() == 0;
  };
}

// One queue line in the monitor's format.
std::string QueueLine(int event, const std::string& path) {
  return "{\"event\":" + std::to_string(event) +
         ",\"path\":" + Json::valueToQuotedString(path.c_str()) + "}\n";
}

// Appends whole lines to the share's queue under the queue's lock, with one
// write(2) of at most 64 KiB of whole lines on an O_APPEND descriptor each,
// as the library's own writers append (so a rotation never splits a line).
void AppendQueue(const std::vector<std::string>& lines) {
  const std::string queue = vellis::sdk::SDKShare(kShare).GetQueuePath();
  for (size_t i = 0; i < lines.size();) {
    std::string chunk;
    while (i < lines.size() && (chunk.empty() || chunk.size() + lines[i].size() <= 65536)) {
      chunk += lines[i++];
    }
    vellis::LockFile lock(vellis::fileindex::QueueLockPath(queue), true);
    const int fd = open(queue.c_str(), O_WRONLY | O_APPEND | O_CREAT | O_CLOEXEC, 0644);
    if (fd < 0) throw std::runtime_error("cannot open " + queue + ": " + strerror(errno));
    const ssize_t n = write(fd, chunk.data(), chunk.size());
    close(fd);
    if (n != static_cast<ssize_t>(chunk.size())) throw std::runtime_error("short write: " + queue);
  }
}

std::string Check(bool met) { return met ? "met" : "MISSED"; }

// --- The run ---

struct Bench {
  Options opt;
  std::string root;        // the temporary root
  std::string share_path;  // full path of the share
  Corpus corpus;
  Daemons d;
  int64_t expected_documents = 0;
  std::vector<Row> rows;
  std::vector<std::string> problems;  // wrong results; targets are in the rows
};

// The indexing daemon's log lines about rounds written since `offset`;
// `offset` moves past them.
std::vector<std::string> NewRoundLogLines(const std::string& log, std::streamoff* offset) {
  std::ifstream in(log);
  in.seekg(*offset);
  std::vector<std::string> out;
  for (std::string line; std::getline(in, line);) {
    const size_t at = line.find("fileindexd: ");
    if (at != std::string::npos && line.find("round", at) != std::string::npos) {
      out.push_back(line.substr(at));
    }
  }

  in.clear();
  in.seekg(0, std::ios::end);
  *offset = in.tellg();
  return out;
}

void Setup(Bench& b) {
  const char* tmpdir = getenv("TMPDIR");
  std::string tmpl =
      std::string(tmpdir && *tmpdir ? tmpdir : "/tmp") + "/vellis-fileindexd-bench-XXXXXX";
  if (mkdtemp(tmpl.data()) == nullptr) throw std::runtime_error("mkdtemp failed");
  b.root = tmpl;
  setenv(vellis::kRootEnv, b.root.c_str(), 1);
  setenv("VELLIS_SERVICES", "none", 1);  // the daemons are ours to run
  vellis::PrepareRoot();
  b.share_path = b.root + "/volume1/" + kShare;
  vellis::bench::MakeDirs(b.share_path + "/corpus");
  vellis::sdk::ShareInfo share;
  share.szName = kShare;
  share.szPath = b.share_path;
  vellis::sdk::RegisterShare(share);
}

void MakeCorpusPhase(Bench& b) {
  const Clock::time_point start = Clock::now();
  const CpuSnapshot before = TakeCpu(b.d);
  b.corpus = vellis::bench::MakeCorpus(b.share_path + "/corpus", b.opt.files, b.opt.seed);
  b.expected_documents = static_cast<int64_t>(b.corpus.files.size() + b.corpus.dirs.size());
  Row r = MakeRow("corpus", start, before, b.d);
  r.rate = std::to_string(b.corpus.files.size()) + " files, " +
           std::to_string(b.corpus.dirs.size()) + " folders, " +
           Format("%.1f MiB", static_cast<double>(b.corpus.bytes) / (1 << 20));
  b.rows.push_back(r);
}

void StartDaemons(Bench& b) {
  b.d.searchd.Start(vellis::bench::FindBinary("SEARCHD_BIN", "vellis-searchd"), {"-f"},
                    b.root + "/searchd.log", vellis::RootPath(vellis::kElasticSocketPath));
  std::vector<std::string> args = {"-f"};
  args.insert(args.end(), b.opt.daemon_args.begin(), b.opt.daemon_args.end());
  b.d.fileindexd.Start(vellis::bench::FindBinary("FILEINDEXD_BIN", "vellis-fileindexd"), args,
                       b.root + "/fileindexd.log",
                       vellis::RootPath(vellis::fileindex::kFileIndexDaemonSocketPath));
}

// The round's figures from "status", for the notes.
std::string RoundNote(const Json::Value& s) {
  const Json::Value& r = s["last_round"];
  return "last round " + r["duration_ms"].asString() + " ms: " + r["upserted"].asString() +
         " upserted, " + r["unchanged"].asString() + " unchanged, " + r["deleted"].asString() +
         " deleted, " + r["failed"].asString() + " failed";
}

void CheckDocuments(Bench& b, const Json::Value& s, const std::string& phase) {
  if (s["documents"].asInt64() != b.expected_documents) {
    b.problems.push_back(phase + ": the index holds " + s["documents"].asString() +
                         " documents, expected " + std::to_string(b.expected_documents));
  }
}

void FullIndexPhase(Bench& b) {
  Json::Value folder(Json::objectValue);
  folder["path"] = kFolder;
  folder["name"] = "corpus";
  for (const char* c : {"document", "audio", "video", "photo"}) folder[c] = true;
  Json::Value list(Json::arrayValue);
  list.append(folder);
  const Clock::time_point start = Clock::now();
  const CpuSnapshot before = TakeCpu(b.d);
  vellis::fileindex::FolderAdd(list, false);
  const double add_ms = SecondsSince(start) * 1000;
  WaitFor(b.d, "full index", 60 + 0.05 * static_cast<double>(b.opt.files), 100, RoundsDone(0));
  Row r = MakeRow("full index", start, before, b.d);
  const Json::Value s = ShareStatus();
  r.rate = Format("%.0f files/s", static_cast<double>(b.corpus.files.size()) / r.wall_s);
  r.note = "FolderAdd " + Format("%.0f ms", add_ms) + "; " + RoundNote(s) + "; " +
           s["documents"].asString() + " documents";
  CheckDocuments(b, s, "full index");
  b.rows.push_back(r);
}

void ReindexPhase(Bench& b) {
  const uint64_t rounds = ShareStatus()["rounds"].asUInt64();
  Json::Value paths(Json::arrayValue);
  paths.append(kFolder);
  const Clock::time_point start = Clock::now();
  const CpuSnapshot before = TakeCpu(b.d);
  vellis::fileindex::FolderReindex(paths);
  WaitFor(b.d, "reindex", 120, 20, RoundsDone(rounds));
  Row r = MakeRow("reindex, unchanged", start, before, b.d);
  const Json::Value s = ShareStatus();
  r.rate = Format("%.0f files/s", static_cast<double>(b.corpus.files.size()) / r.wall_s);
  r.note = "target < 5 s: " + Check(r.wall_s < 5) + "; " + RoundNote(s);
  CheckDocuments(b, s, "reindex");
  if (s["last_round"]["upserted"].asUInt64() > 1) {  // the folder itself may be written again
    b.problems.push_back("reindex of an unchanged folder wrote " +
                         s["last_round"]["upserted"].asString() + " documents");
  }
  b.rows.push_back(r);
}

double Percentile(std::vector<double> v, double p) {
  std::sort(v.begin(), v.end());
  return v[std::min(v.size() - 1,
                    static_cast<size_t>(p * static_cast<double>(v.size() - 1) + 0.5))];
}

void LatencyPhase(Bench& b) {
  vellis::bench::CorpusRandom rnd(b.opt.seed + 1);
  std::vector<const vellis::bench::CorpusFile*> texts;
  for (const auto& f : b.corpus.files) {
    if (f.text) texts.push_back(&f);
  }
  std::vector<double> ms;
  const Clock::time_point start = Clock::now();
  const CpuSnapshot before = TakeCpu(b.d);
  for (int i = 0; i < b.opt.samples; ++i) {
    const std::string word = vellis::bench::MarkerWord("lat", static_cast<size_t>(i));
    std::vector<std::string> lines;
    std::string path;
    if (i % 2 == 0) {  // an edit: a line appended to a text file
      path = texts[rnd.Below(texts.size())]->path;
      std::ofstream(path, std::ios::app) << "\n" << word << "\n";
      lines = {QueueLine(vellis::fileindex::kEventModify, path)};
    } else {  // a new file, reported as created and then written
      path =
          b.corpus.dirs[rnd.Below(b.corpus.dirs.size())] + "/latency_" + std::to_string(i) + ".txt";
      vellis::bench::WriteWholeFile(path, "a note about " + word + "\n");
      lines = {QueueLine(vellis::fileindex::kEventCreate, path),
               QueueLine(vellis::fileindex::kEventModify, path)};
      ++b.expected_documents;
    }
    const Clock::time_point t0 = Clock::now();
    for (const std::string& line : lines) AppendQueue({line});
    while (SearchTotal(word) < 1) {
      if (g_stop) throw std::runtime_error("interrupted");
      if (SecondsSince(t0) > 30)
        throw std::runtime_error("latency: " + path + " not found in 30 s");
      Sleep(10);
    }
    ms.push_back(SecondsSince(t0) * 1000);
    // The next sample starts from a quiet daemon.
    WaitFor(b.d, "latency", 60, 20, [](const Json::Value& s) {
      return s["state"].asString() == "idle" && s["events_waiting"].asInt64() == 0;
    });
  }
  Row r = MakeRow("queue line to search", start, before, b.d);
  const double median = Percentile(ms, 0.5), max = *std::max_element(ms.begin(), ms.end());
  r.rate = Format("median %.0f ms", median) + Format(", max %.0f ms", max);
  r.note = std::to_string(ms.size()) + " samples (edits and creates, alternating), min " +
           Format("%.0f ms", *std::min_element(ms.begin(), ms.end())) +
           "; target < 2 s: " + Check(max < 2000);
  CheckDocuments(b, ShareStatus(), "latency");
  b.rows.push_back(r);
}

void BurstPhase(Bench& b) {
  using vellis::fileindex::kEventAttr;
  using vellis::fileindex::kEventCreate;
  using vellis::fileindex::kEventDelete;
  using vellis::fileindex::kEventModify;
  vellis::bench::CorpusRandom rnd(b.opt.seed + 2);
  const std::string mark = vellis::bench::MarkerWord("burst", 0);
  const size_t n = b.corpus.files.size();
  const size_t created = std::max<size_t>(1, n / 10), edited = std::max<size_t>(1, n / 10),
               deleted = std::max<size_t>(1, n / 100);
  // Which files change: a shuffled order of the corpus; text files are
  // edited, any other file may go.
  std::vector<size_t> order(n);
  for (size_t i = 0; i < n; ++i) order[i] = i;
  for (size_t i = n; i > 1; --i) std::swap(order[i - 1], order[rnd.Below(i)]);
  std::vector<std::string> touched, gone;
  for (size_t i : order) {
    const vellis::bench::CorpusFile& f = b.corpus.files[i];
    if (f.text && touched.size() < edited) {
      std::ofstream(f.path, std::ios::app) << "\n" << mark << "\n";
      touched.push_back(f.path);
    } else if (!f.text && gone.size() < deleted) {
      if (unlink(f.path.c_str()) != 0) throw std::runtime_error("cannot delete " + f.path);
      gone.push_back(f.path);
    }
  }
  std::vector<std::string> fresh;
  for (size_t i = 0; i < created; ++i) {
    fresh.push_back(b.corpus.dirs[rnd.Below(b.corpus.dirs.size())] + "/burst_" + std::to_string(i) +
                    ".txt");
    vellis::bench::WriteWholeFile(fresh.back(),
                                  vellis::bench::MakeText(rnd, b.corpus.words, 2048) + mark + "\n");
  }
  b.expected_documents += static_cast<int64_t>(fresh.size()) - static_cast<int64_t>(gone.size());

  // The lines: each new file created and written, each edited file
  // written, then repeated writes and attribute changes of the same files
  // (an editor saving again and again), then the deletes.
  std::vector<std::string> lines;
  for (const std::string& p : fresh) {
    lines.push_back(QueueLine(kEventCreate, p));
    lines.push_back(QueueLine(kEventModify, p));
  }
  for (const std::string& p : touched) lines.push_back(QueueLine(kEventModify, p));
  touched.insert(touched.end(), fresh.begin(), fresh.end());
  const size_t total = std::max(b.opt.events, lines.size() + gone.size());
  while (lines.size() < total - gone.size()) {
    const std::string& p = touched[rnd.Below(touched.size())];
    lines.push_back(QueueLine(rnd.Below(10) < 7 ? kEventModify : kEventAttr, p));
  }
  for (const std::string& p : gone) lines.push_back(QueueLine(kEventDelete, p));

  const uint64_t rounds = ShareStatus()["rounds"].asUInt64();
  const Clock::time_point start = Clock::now();
  const CpuSnapshot before = TakeCpu(b.d);
  AppendQueue(lines);
  const double write_ms = SecondsSince(start) * 1000;
  WaitFor(b.d, "event burst", 120 + 0.002 * static_cast<double>(total), 50, RoundsDone(rounds));
  Row r = MakeRow(std::to_string(total) + " queued events", start, before, b.d);
  const Json::Value s = ShareStatus();
  r.rate = Format("%.0f events/s", static_cast<double>(total) / r.wall_s);
  r.note = Format("lines written in %.0f ms; ", write_ms) +
           std::to_string(s["rounds"].asUInt64() - rounds) + " round(s); " + RoundNote(s) + "; " +
           std::to_string(fresh.size()) + " created, " +
           std::to_string(touched.size() - fresh.size()) + " edited, " +
           std::to_string(gone.size()) + " deleted";
  b.rows.push_back(r);

  CheckDocuments(b, s, "event burst");
  const int64_t marked = SearchTotal(mark);
  if (marked != static_cast<int64_t>(touched.size())) {
    b.problems.push_back("event burst: " + std::to_string(marked) +
                         " documents hold the new word, expected " +
                         std::to_string(touched.size()));
  }
  for (size_t i = 0; i < gone.size() && i < 20; ++i) {
    if (SearchTotal("QORUMDPath:" + gone[i]) != 0)
      b.problems.push_back("event burst: deleted " + gone[i] + " still found");
  }
  for (size_t i = 0; i < fresh.size() && i < 20; ++i) {
    if (SearchTotal("QORUMDPath:" + fresh[i]) != 1)
      b.problems.push_back("event burst: new " + fresh[i] + " not found");
  }
}

void PrintTable(const Bench& b) {
  printf("\nfileindexd_bench: %zu files, seed %llu, vellis-fileindexd -f", b.opt.files,
         static_cast<unsigned long long>(b.opt.seed));
  for (const std::string& a : b.opt.daemon_args) printf(" %s", a.c_str());
  printf("\n\n%-22s %8s  %-36s %14s %17s %12s\n", "phase", "wall s", "figure", "searchd CPU s",
         "fileindexd CPU s", "bench CPU s");
  for (const Row& r : b.rows) {
    printf("%-22s %8.2f  %-36s %14.2f %17.2f %12.2f\n", r.phase.c_str(), r.wall_s, r.rate.c_str(),
           r.cpu.searchd, r.cpu.fileindexd, r.cpu.self);
  }
  printf("\n");
  for (const Row& r : b.rows) {
    if (!r.note.empty()) printf("%s: %s\n", r.phase.c_str(), r.note.c_str());
  }
  printf("peak memory: vellis-searchd %.0f MiB, vellis-fileindexd %.0f MiB\n",
         vellis::bench::PeakRssMiB(b.d.searchd.pid()),
         vellis::bench::PeakRssMiB(b.d.fileindexd.pid()));
  for (const std::string& p : b.problems) printf("PROBLEM: %s\n", p.c_str());
}

int RemoveEntry(const char* path, const struct stat*, int, FTW*) {
  remove(path);
  return 0;
}

void OnSignal(int) { g_stop = 1; }

bool ParseArgs(int argc, char** argv, Options* o) {
  if (const char* env = getenv("FILEINDEXD_BENCH_FILES"); env != nullptr && *env != '\0') {
    o->files = std::strtoull(env, nullptr, 10);
  }
  for (int i = 1; i < argc; ++i) {
    const std::string a = argv[i];
    auto value = [&a](const char* name) -> const char* {
      const std::string prefix = std::string(name) + "=";
      return a.rfind(prefix, 0) == 0 ? a.c_str() + prefix.size() : nullptr;
    };
    if (const char* v = value("--files")) {
      o->files = std::strtoull(v, nullptr, 10);
    } else if (const char* v = value("--events")) {
      o->events = std::strtoull(v, nullptr, 10);
    } else if (const char* v = value("--samples")) {
      o->samples = std::atoi(v);
    } else if (const char* v = value("--seed")) {
      o->seed = std::strtoull(v, nullptr, 10);
    } else if (const char* v = value("--daemon-arg")) {
      o->daemon_args.push_back(v);
    } else if (a == "--keep") {
      o->keep = true;
    } else {
      fprintf(stderr,
              "usage: %s [--files=N] [--events=N] [--samples=N] [--seed=N] [--keep] "
              "[--daemon-arg=ARG ...]\n",
              argv[0]);
      return false;
    }
  }
  return o->files >= 10 && o->samples >= 1;
}

}  // namespace

int main(int argc, char** argv) {
  Bench b;
  if (!ParseArgs(argc, argv, &b.opt)) return 2;
  signal(SIGINT, OnSignal);
  signal(SIGTERM, OnSignal);
  signal(SIGPIPE, SIG_IGN);
  bool failed = false;
  try {
    Setup(b);
    fprintf(stderr, "root %s\n", b.root.c_str());
    const std::vector<std::pair<const char*, void (*)(Bench&)>> phases = {
        {"corpus", MakeCorpusPhase}, {"daemons", StartDaemons}, {"full index", FullIndexPhase},
        {"reindex", ReindexPhase},   {"latency", LatencyPhase}, {"event burst", BurstPhase}};
    std::streamoff log_offset = 0;
    for (const auto& [name, run] : phases) {
      fprintf(stderr, "== %s\n", name);
      run(b);
      for (const std::string& line : NewRoundLogLines(b.root + "/fileindexd.log", &log_offset)) {
        fprintf(stderr, "  %s\n", line.c_str());
      }
    }
  } catch (const std::exception& e) {
    b.problems.push_back(std::string("run ended: ") + e.what());
    failed = true;
  }
  PrintTable(b);
  b.d.fileindexd.Stop();
  b.d.searchd.Stop();
  if (b.opt.keep || failed) {
    if (!b.root.empty()) printf("root kept, with the daemons' logs: %s\n", b.root.c_str());
  } else {
    nftw(b.root.c_str(), RemoveEntry, 64, FTW_DEPTH | FTW_PHYS);
  }
  return failed || !b.problems.empty() ? 1 : 0;
}
