// vellis status [--json] [--watch [--timeout S]]
#include <unistd.h>

#include <chrono>
#include <cstdio>
#include <iostream>
#include <memory>
#include <set>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

#include "common/error.h"
#include "common/json_util.h"
#include "common/root_path.h"
#include "fileindex/folder.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/status_mgr.h"
#include "sdk/linux/monitor_queues.h"
#include "sdk/platform.h"
#include "tools/vellis/commands.h"
#include "tools/vellis/daemon_probe.h"
#include "tools/vellis/table.h"

namespace vellis::cli {
namespace {

constexpr int kBarWidth = 30;

struct StatusArgs {
  bool json = false;
  bool watch = false;
  int timeout_s = 0;  // 0: wait as long as it takes
};

// The whole picture in one value: daemons, pause, and per folder its status
// text with its share's figures from the indexing daemon.
Json::Value Collect() {
  Json::Value out(Json::objectValue);
  Json::Value indexing;  // the indexing daemon's status data, null when silent
  out["daemons"] = Json::Value(Json::arrayValue);
  for (const DaemonState& d : ProbeDaemons()) {
    if (!d.installed && d.pid == 0) continue;
    Json::Value item(Json::objectValue);
    item["program"] = d.program;
    item["pid"] = d.pid;
    item["answers"] = d.answers;
    item["should_run"] = d.should_run;
    out["daemons"].append(item);
    if (d.program == "vellis-fileindexd" && d.answers) indexing = d.status;
    if (d.program == "vellis-monitord" && d.pid > 0) {
      Json::Value monitor;
      if (JsonFromFile(monitor, RootPath(sdk::kMonitorStatusFile))) out["monitor"] = monitor;
    }
  }
  const long long resume = fileindex::StatusMgr().GetPauseInfo();
  out["pause"]["paused"] = resume == 0 || resume > sdk::GetPlatform()->Time();
  out["pause"]["resume_time"] = static_cast<Json::Int64>(resume);
  out["folders"] = Json::Value(Json::arrayValue);
  fileindex::FolderMgr folders;
  for (const std::shared_ptr<fileindex::Folder>& f : folders.GetFolders()) {
    Json::Value item(Json::objectValue);
    item["path"] = f->GetPath();
    Json::Value status(Json::objectValue);
    std::string share;
    try {
      share = f->GetShare();
      f->GetStatus(status);
    } catch (const Error& e) {
      status["text"] = "error";
      status["desc"] = e.what();
    }
    item["share"] = share;
    item["status"] = status["text"];
    if (status.isMember("desc")) item["desc"] = status["desc"];
    const Json::Value& s = indexing["shares"][share];
    item["state"] = s.isObject() ? s["state"] : Json::Value();
    item["documents"] = s["documents"];
    item["events_waiting"] = s["events_waiting"];
    item["crawled"] = s["crawl"]["crawled"];
    item["rate"] = s["crawl"]["rate"];
    item["eta_seconds"] = s["crawl"]["eta_seconds"];
    item["errors"] = s.isObject() ? s["errors"] : Json::Value(Json::arrayValue);
    out["folders"].append(item);
  }
  return out;
}

bool Finished(const Json::Value& st) {
  for (const Json::Value& f : st["folders"]) {
    if (f["status"].asString() != "finished") return false;
    if (f["state"].isString() && f["state"].asString() != "idle") return false;
  }
  return true;
}

std::string Text(const Json::Value& v) {
  if (v.isNull()) return "-";
  if (v.isString()) return v.asString();
  if (v.isDouble()) {
    char buf[32];
    snprintf(buf, sizeof(buf), "%.0f", v.asDouble());
    return buf;
  }
  const std::string styled = v.toStyledString();
  return styled.substr(0, styled.find('\n'));
}

void PrintHuman(const Json::Value& st) {
  std::ostringstream daemons;
  for (const Json::Value& d : st["daemons"]) {
    daemons << "  " << d["program"].asString() << ": ";
    if (d["answers"].asBool()) {
      daemons << "running (pid " << d["pid"].asInt() << ")";
    } else if (d["pid"].asInt() > 0) {
      daemons << "not answering (pid " << d["pid"].asInt() << ")";
    } else {
      daemons << (d["should_run"].asBool() ? "NOT RUNNING" : "not running (not needed)");
    }
    daemons << "\n";
  }
  std::cout << "daemons:\n" << daemons.str();
  if (st.isMember("monitor")) {
    const Json::Value& m = st["monitor"];
    std::cout << "monitor: " << m["backend"].asString() << ", " << m["folders"].size()
              << " folders, " << m["watches"].asUInt64() << " watches";
    if (m["watch_limit"].asUInt64() > 0) std::cout << " of " << m["watch_limit"].asUInt64();
    std::cout << ", " << static_cast<long long>(m["events_per_second"].asDouble()) << " events/s, "
              << m["overflows"].asUInt64() << " overflows";
    if (m["unwatched"].asUInt64() > 0)
      std::cout << ", " << m["unwatched"].asUInt64() << " folders rescanned (watch limit)";
    if (m["skipped_names"].asUInt64() > 0)
      std::cout << ", " << m["skipped_names"].asUInt64() << " names not UTF-8 skipped";
    std::cout << "\n";
  }
  const long long resume = st["pause"]["resume_time"].asInt64();
  std::cout << "pause: "
            << (!st["pause"]["paused"].asBool() ? "none"
                : resume == 0                   ? "until resumed"
                                                : "until " + std::to_string(resume))
            << "\n";
  if (st["folders"].empty()) {
    std::cout << "no indexed folder\n";
    return;
  }
  std::vector<std::vector<std::string>> rows;
  for (const Json::Value& f : st["folders"]) {
    rows.push_back({f["path"].asString(), Text(f["status"]), Text(f["state"]), Text(f["documents"]),
                    Text(f["events_waiting"]), Text(f["eta_seconds"])});
  }
  PrintTable(std::cout, {"FOLDER", "STATUS", "STATE", "DOCUMENTS", "WAITING", "ETA(S)"}, rows);
}

// One line of progress over every share: documents against what is known to
// be left; a first crawl knows no total and shows its count and rate.
std::string ProgressLine(const Json::Value& st) {
  long long documents = 0, waiting = 0, crawled = 0;
  double rate = 0, eta = -1;
  bool crawling_unknown = false;
  std::set<std::string> seen;  // a share's figures count once, however many folders
  for (const Json::Value& f : st["folders"]) {
    if (!seen.insert(f["share"].asString()).second) continue;
    documents += f["documents"].isIntegral() ? f["documents"].asInt64() : 0;
    waiting += f["events_waiting"].isIntegral() ? f["events_waiting"].asInt64() : 0;
    if (f["state"].asString() == "crawling") {
      crawled += f["crawled"].asInt64();
      rate += f["rate"].asDouble();
      if (f["eta_seconds"].isNumeric()) {
        eta = std::max(eta, f["eta_seconds"].asDouble());
      } else {
        crawling_unknown = true;
      }
    }
  }
  std::ostringstream line;
  const bool done = Finished(st);
  if (crawling_unknown && !done) {
    line << "[" << std::string(kBarWidth, '?') << "] crawling: " << crawled << " files ("
         << static_cast<long long>(rate) << "/s), " << documents << " documents";
    return line.str();
  }
  const double total = static_cast<double>(documents + waiting);
  const double fraction = done ? 1.0 : total > 0 ? static_cast<double>(documents) / total : 0.0;
  const int fill = static_cast<int>(fraction * kBarWidth);
  line << "[" << std::string(fill, '#') << std::string(kBarWidth - fill, '-') << "] "
       << static_cast<int>(fraction * 100) << "%  " << documents << " documents, " << waiting
       << " events waiting";
  if (eta >= 0) line << ", ETA " << static_cast<long long>(eta) << " s";
  if (done) line << ", finished";
  return line.str();
}

int Watch(const StatusArgs& args) {
  const bool tty = isatty(STDOUT_FILENO);
  const auto start = std::chrono::steady_clock::now();
  std::string last;
  for (;;) {
    Json::Value st = Collect();
    const bool done = Finished(st);
    const std::string line = ProgressLine(st);
    if (tty) {
      std::cout << "\r\033[K" << line << std::flush;
    } else if (line != last) {
      std::cout << line << "\n" << std::flush;
    }
    last = line;
    if (done) {
      if (tty) std::cout << "\n";
      return 0;
    }
    if (args.timeout_s > 0 &&
        std::chrono::steady_clock::now() - start >= std::chrono::seconds(args.timeout_s)) {
      if (tty) std::cout << "\n";
      std::cout << "not finished after " << args.timeout_s << " s\n";
      return 1;
    }
    std::this_thread::sleep_for(std::chrono::milliseconds(tty ? 250 : 1000));
  }
}

}  // namespace

void AddStatusCommands(CLI::App& app, Context& ctx) {
  auto args = std::make_shared<StatusArgs>();
  CLI::App* status = app.add_subcommand(
      "status", "The daemons, the pause, and per indexed folder its status, documents and backlog");
  status->add_flag("--json", args->json, "Print JSON");
  status->add_flag("--watch", args->watch,
                   "Redraw a progress bar until every folder is finished (exit 0 then)");
  status
      ->add_option("--timeout", args->timeout_s,
                   "With --watch: give up after this many seconds (exit 1)")
      ->check(CLI::NonNegativeNumber);
  status->callback([&ctx, args] {
    ctx.action = [&ctx, args] {
      if (args->watch) {
        ctx.exit_status = Watch(*args);
        return;
      }
      Json::Value st = Collect();
      if (args->json) {
        PrintJson(std::cout, st);
      } else {
        PrintHuman(st);
      }
    };
  });
}

}  // namespace vellis::cli
