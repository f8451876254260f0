// The search daemon through its real socket, against bare SQLite.
//
// Upserts of small documents (a path, 20 metadata fields and 2 KB of text),
// one request each and in compound requests of 500, against a bare SQLite
// FTS5 insert loop of the same documents (transactions of 500, WAL,
// synchronous=FULL). Then search latency, median and 99th percentile, for a
// one-word query and a file-name substring query once the index holds
// SEARCHD_BENCH_DOCS documents (default 100,000), after the daemon's
// idle-time merging has run.
//
//   build/bench/searchd_bench [--benchmark_filter=...]
//   SEARCHD_BENCH_DOCS=20000 build/bench/searchd_bench
//   SEARCHD_BENCH_KEEP=1 ... keeps the index files (the path is printed)
#include <benchmark/benchmark.h>
#include <sqlite3.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <map>
#include <memory>
#include <random>
#include <string>
#include <thread>
#include <vector>

#include "common/json_util.h"
#include "common/root_path.h"
#include "fileindex/elastic/comm.h"
#include "fileindex/elastic/schema.h"
#include "sdk/domain_socket.h"
#include "daemons/searchd/handler.h"
#include "daemons/searchd/registry.h"
#include "daemons/searchd/server.h"
#include "daemons/searchd/sqlite_engine.h"

namespace {

using namespace vellis::searchd;

constexpr char kIndex[] = "fileindex_bench";
constexpr int kCompound = 500;
constexpr int kQueries = 500;

std::string TempDir() {
  static std::string dir = [] {
    const char* tmp = getenv("TMPDIR");
    std::string tmpl = std::string(tmp && *tmp ? tmp : "/tmp") + "/vellis-bench-XXXXXX";
    if (mkdtemp(&tmpl[0]) == nullptr) abort();
    return tmpl;
  }();
  return dir;
}

// A vocabulary of made-up words; texts draw from it with a skew, as real
// text does.
const std::vector<std::string>& Vocabulary() {
  static std::vector<std::string> words = [] {
    std::vector<std::string> out;
    std::mt19937 rng(7);
    const char* syllables[] = {"ka", "lo", "mi", "ren", "sto", "va", "ter", "un",  "dis", "pra",
                               "go", "li", "ne", "or",  "que", "sa", "ti",  "bel", "cor", "fu"};
    for (int i = 0; i < 8000; ++i) {
      std::string w;
      int n = 2 + static_cast<int>(rng() % 3);
      for (int j = 0; j < n; ++j) w += syllables[rng() % 20];
      out.push_back(w + std::to_string(i % 10));
    }
    return out;
  }();
  return words;
}

std::string Word(std::mt19937& rng) {
  // Square of a uniform draw: a skew towards the first words.
  double u = std::uniform_real_distribution<double>(0, 1)(rng);
  return Vocabulary()[static_cast<size_t>(u * u * (Vocabulary().size() - 1))];
}

const char* kExtensions[] = {"pdf", "docx", "txt", "mp3", "jpg", "mkv", "xlsx", "md"};

// Document number `i`: path, 20 metadata fields, 2 KB of text.
Json::Value MakeDoc(int64_t i) {
  std::mt19937 rng(static_cast<uint32_t>(i * 2654435761u));
  Json::Value d(Json::objectValue);
  std::string name =
      Word(rng) + "_" + Word(rng) + "_" + std::to_string(i) + "." + kExtensions[i % 8];
  std::string dir = "/volume1/share/d" + std::to_string(i / 1000) + "/s" + std::to_string(i % 37);
  d["QORUMDPath"] = dir + "/" + name;
  d["QORUMDFSName"] = name;
  d["QORUMDSearchFileName"] = name;
  d["QORUMDParent"] = dir;
  d["QORUMDExtension"] = kExtensions[i % 8];
  d["QORUMDFSSize"] = static_cast<Json::Int64>(rng() % 100000000);
  d["QORUMDFSContentChangeDate"] = static_cast<Json::Int64>(1600000000 + rng() % 100000000);
  d["QORUMDFSCreationDate"] = static_cast<Json::Int64>(1600000000 + rng() % 100000000);
  d["QORUMDAttributeChangeDate"] = static_cast<Json::Int64>(1600000000 + rng() % 100000000);
  d["QORUMDOwnerUserID"] = std::to_string(1000 + rng() % 20);
  d["QORUMDOwnerGroupID"] = "100";
  d["QORUMDPrivilege"] = "rwxr-x---";
  d["QORUMDIsDir"] = false;
  d["QORUMDTitle"] = Word(rng) + " " + Word(rng) + " " + Word(rng);
  d["QORUMDAuthors"] = Word(rng) + " " + Word(rng);
  d["QORUMDKeywords"] = Word(rng) + ", " + Word(rng);
  d["QORUMDComment"] = Word(rng) + " " + Word(rng) + " " + Word(rng) + " " + Word(rng);
  d["QORUMDLogicalSize"] = d["QORUMDFSSize"];
  d["QORUMDPhysicalSize"] = d["QORUMDFSSize"];
  d["QORUMDMediaTypes"] = "text";
  std::string text;
  while (text.size() < 2048) text += Word(rng) + (rng() % 12 == 0 ? ". " : " ");
  d["QORUMDTextContent"] = text;
  return d;
}

Json::Value Request(const std::string& command, const Json::Value& data) {
  Json::Value r(Json::objectValue);
  r["command"] = command;
  r["data"] = data;
  return r;
}

Json::Value Upsert(const Json::Value& doc) {
  Json::Value d(Json::objectValue);
  d["id"] = kIndex;
  d["doc_id"] = doc["QORUMDPath"];
  d["data"] = doc;
  return Request("document_upsert_by_id", d);
}

// The daemon, in this process, on its real socket.
class Daemon {
 public:
  Daemon() {
    setenv(vellis::kRootEnv, TempDir().c_str(), 1);
    engine_ = std::make_unique<SqliteEngine>(vellis::RootPath(kRegistryPath));
    handler_ = std::make_unique<Handler>(*engine_);
    socket_ = vellis::RootPath(vellis::kElasticSocketPath);
    mkdir((TempDir() + "/var").c_str(), 0755);
    mkdir((TempDir() + "/var/run").c_str(), 0755);
    server_ = MakeServer(*handler_, socket_, 2);
    server_->Listen();
    if (pipe(stop_) != 0) abort();
    thread_ = std::thread([this] { server_->Run(stop_[0]); });
    Json::Value d(Json::objectValue);
    d["id"] = kIndex;
    d["path"] = TempDir() + "/db";
    d["mappings"] = vellis::fileindex::elastic::GetFileIndexMappings();
    Call(Request("index_create", d));
  }
  ~Daemon() {
    if (write(stop_[1], "x", 1) != 1) abort();
    thread_.join();
  }
  Json::Value Call(const Json::Value& req) {
    Json::Value answer = vellis::sdk::Exchange(socket_, req);
    if (!answer["success"].asBool() || answer["has_fail"].asBool()) {
      fprintf(stderr, "request failed: %s\n", vellis::JsonToString(answer).substr(0, 400).c_str());
      abort();
    }
    return answer["data"];
  }
  void Commit() {
    Json::Value d(Json::objectValue);
    d["id"] = kIndex;
    Call(Request("commit", d));
  }
  int64_t next_doc = 0;

 private:
  std::unique_ptr<SqliteEngine> engine_;
  std::unique_ptr<Handler> handler_;
  std::unique_ptr<vellis::daemon::ServerLoop> server_;
  std::string socket_;
  int stop_[2];
  std::thread thread_;
};

Daemon& TheDaemon() {
  static Daemon daemon;
  return daemon;
}

std::map<std::string, double> g_rate;  // documents per second by benchmark

void BM_UpsertOneEach(benchmark::State& state) {
  Daemon& d = TheDaemon();
  std::vector<Json::Value> docs;
  for (int i = 0; i < 2000; ++i) docs.push_back(MakeDoc(d.next_doc + i));
  size_t n = 0;
  for (auto _ : state) {
    d.Call(Upsert(docs[n % docs.size()]));
    ++n;
  }
  d.Commit();
  d.next_doc += static_cast<int64_t>(std::min(n, docs.size()));
  state.SetItemsProcessed(static_cast<int64_t>(n));
}

void BM_UpsertCompound500(benchmark::State& state) {
  Daemon& d = TheDaemon();
  int64_t n = 0;
  for (auto _ : state) {
    state.PauseTiming();
    Json::Value req(Json::objectValue);
    req["compound"] = Json::Value(Json::arrayValue);
    for (int i = 0; i < kCompound; ++i) req["compound"].append(Upsert(MakeDoc(d.next_doc++)));
    state.ResumeTiming();
    d.Call(req);
    d.Commit();
    n += kCompound;
  }
  state.SetItemsProcessed(n);
}

// The same documents straight into SQLite: a row with the JSON body and an
// FTS5 row with the text, in transactions of 500.
void BM_BareSqlite(benchmark::State& state) {
  std::string file = TempDir() + "/bare.sqlite";
  sqlite3* db = nullptr;
  sqlite3_open(file.c_str(), &db);
  sqlite3_exec(
      db,
      "PRAGMA journal_mode=WAL; PRAGMA synchronous=FULL;"
      "CREATE TABLE IF NOT EXISTS docs(rid INTEGER PRIMARY KEY, doc_id TEXT UNIQUE, body TEXT);"
      "CREATE VIRTUAL TABLE IF NOT EXISTS fts USING fts5(content);",
      nullptr, nullptr, nullptr);
  sqlite3_stmt* doc_st = nullptr;
  sqlite3_stmt* fts_st = nullptr;
  sqlite3_prepare_v2(db, "INSERT INTO docs(doc_id, body) VALUES (?, ?)", -1, &doc_st, nullptr);
  sqlite3_prepare_v2(db, "INSERT INTO fts(rowid, content) VALUES (?, ?)", -1, &fts_st, nullptr);
  int64_t next = 10000000;
  int64_t n = 0;
  for (auto _ : state) {
    state.PauseTiming();
    std::vector<Json::Value> docs;
    for (int i = 0; i < kCompound; ++i) docs.push_back(MakeDoc(next++));
    state.ResumeTiming();
    sqlite3_exec(db, "BEGIN", nullptr, nullptr, nullptr);
    for (const Json::Value& doc : docs) {
      std::string path = doc["QORUMDPath"].asString() + "#" + std::to_string(n);
      std::string body = vellis::JsonToString(doc);
      std::string text = doc["QORUMDTextContent"].asString();
      sqlite3_bind_text(doc_st, 1, path.c_str(), -1, SQLITE_TRANSIENT);
      sqlite3_bind_text(doc_st, 2, body.c_str(), -1, SQLITE_TRANSIENT);
      sqlite3_step(doc_st);
      sqlite3_reset(doc_st);
      sqlite3_bind_int64(fts_st, 1, sqlite3_last_insert_rowid(db));
      sqlite3_bind_text(fts_st, 2, text.c_str(), -1, SQLITE_TRANSIENT);
      sqlite3_step(fts_st);
      sqlite3_reset(fts_st);
      ++n;
    }
    sqlite3_exec(db, "COMMIT", nullptr, nullptr, nullptr);
  }
  sqlite3_finalize(doc_st);
  sqlite3_finalize(fts_st);
  sqlite3_close(db);
  state.SetItemsProcessed(n);
}

// Rates are per second of the whole process's CPU time (client and daemon
// threads alike), which a machine shared with other work disturbs less than
// wall time. Bare SQLite runs first, before the daemon exists, so that none
// of the daemon's idle-time merging falls into its measurement.
BENCHMARK(BM_BareSqlite)->Unit(benchmark::kMillisecond)->Iterations(40)->MeasureProcessCPUTime();
BENCHMARK(BM_UpsertOneEach)
    ->Unit(benchmark::kMicrosecond)
    ->Iterations(2000)
    ->MeasureProcessCPUTime();
BENCHMARK(BM_UpsertCompound500)
    ->Unit(benchmark::kMillisecond)
    ->Iterations(40)
    ->MeasureProcessCPUTime();

// Keeps the rates so that main() can print the ratio.
class RateReporter : public benchmark::ConsoleReporter {
 public:
  void ReportRuns(const std::vector<Run>& runs) override {
    for (const Run& r : runs) {
      auto it = r.counters.find("items_per_second");
      if (it != r.counters.end()) g_rate[r.benchmark_name()] = it->second;
    }
    ConsoleReporter::ReportRuns(runs);
  }
};

double Percentile(std::vector<double> v, double p) {
  std::sort(v.begin(), v.end());
  size_t i = static_cast<size_t>(p * static_cast<double>(v.size() - 1) + 0.5);
  return v[std::min(i, v.size() - 1)];
}

void MeasureSearch(int64_t target) {
  Daemon& d = TheDaemon();
  auto t0 = std::chrono::steady_clock::now();
  while (d.next_doc < target) {
    Json::Value req(Json::objectValue);
    req["compound"] = Json::Value(Json::arrayValue);
    for (int i = 0; i < kCompound && d.next_doc < target; ++i) {
      req["compound"].append(Upsert(MakeDoc(d.next_doc++)));
    }
    d.Call(req);
    if (d.next_doc % (10 * kCompound) == 0) d.Commit();
  }
  d.Commit();
  double build_s = std::chrono::duration<double>(std::chrono::steady_clock::now() - t0).count();
  // The daemon merges full-text segments when idle; searches are measured on
  // the index as it stands once that is done (the time is printed).
  Json::Value stats_req(Json::objectValue);
  stats_req["id"] = kIndex;
  auto m0 = std::chrono::steady_clock::now();
  Json::Value stats = d.Call(Request("index_stats", stats_req));
  while (stats["merging"].asBool() &&
         std::chrono::steady_clock::now() - m0 < std::chrono::seconds(600)) {
    // Seldom: every connection holds the merging off for a quiet second.
    std::this_thread::sleep_for(std::chrono::seconds(3));
    stats = d.Call(Request("index_stats", stats_req));
  }
  double merge_s = std::chrono::duration<double>(std::chrono::steady_clock::now() - m0).count();
  printf(
      "\nIndex: %lld documents, %.1f MB on disk (filled in %.1f s, merged when idle in %.1f s)\n",
      static_cast<long long>(stats["documents"].asInt64()),
      static_cast<double>(stats["disk_bytes"].asInt64()) / 1e6, build_s, merge_s);

  std::mt19937 rng(99);
  for (const char* kind : {"word", "name"}) {
    std::vector<double> ms;
    int64_t hits = 0;
    for (int q = 0; q < kQueries; ++q) {
      Json::Value data(Json::objectValue);
      data["id"] = kIndex;
      if (kind[0] == 'w') {
        data["query"] = Word(rng);
      } else {
        // Four letters from the middle of a word of some file name.
        std::string w = Word(rng);
        data["name"] = w.substr(1, 4);
      }
      data["limit"] = 20;
      auto start = std::chrono::steady_clock::now();
      Json::Value answer = d.Call(Request("document_search", data));
      ms.push_back(
          std::chrono::duration<double, std::milli>(std::chrono::steady_clock::now() - start)
              .count());
      hits += answer["total"].asInt64();
    }
    printf(
        "search %-4s: median %.2f ms, p99 %.2f ms, mean total hits %.0f (%d queries, 20 per "
        "page)\n",
        kind, Percentile(ms, 0.5), Percentile(ms, 0.99), static_cast<double>(hits) / kQueries,
        kQueries);
  }
}

}  // namespace

int main(int argc, char** argv) {
  benchmark::Initialize(&argc, argv);
  RateReporter reporter;
  benchmark::RunSpecifiedBenchmarks(&reporter);
  double one = g_rate["BM_UpsertOneEach/iterations:2000/process_time"];
  double compound = g_rate["BM_UpsertCompound500/iterations:40/process_time"];
  double bare = g_rate["BM_BareSqlite/iterations:40/process_time"];
  if (bare > 0) {
    printf("\nUpserts per second: one per request %.0f, compound of %d %.0f, bare SQLite %.0f\n",
           one, kCompound, compound, bare);
    printf("compound / bare SQLite = %.2f (target >= 0.5); one each / bare = %.2f\n",
           compound / bare, one / bare);
  }
  const char* env = getenv("SEARCHD_BENCH_DOCS");
  MeasureSearch(env ? atoll(env) : 100000);
  if (getenv("SEARCHD_BENCH_KEEP") != nullptr) {
    printf("index kept in %s/db\n", TempDir().c_str());
    return 0;
  }
  char cmd[512];
  snprintf(cmd, sizeof(cmd), "rm -rf '%s'", TempDir().c_str());
  if (system(cmd) != 0) fprintf(stderr, "could not remove %s\n", TempDir().c_str());
  return 0;
}
