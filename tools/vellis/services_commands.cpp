// vellis services prepare|start|stop|status
#include <iostream>
#include <string>
#include <vector>

#include "fileindex/index_mgr.h"
#include "sdk/platform.h"
#include "tools/vellis/commands.h"
#include "tools/vellis/daemon_probe.h"
#include "tools/vellis/table.h"

namespace vellis::cli {
namespace {

// A daemon that was started gets this long to answer on its socket.
constexpr int kStartAnswerMs = 15 * 1000;

std::string PidText(int pid) { return pid > 0 ? std::to_string(pid) : "-"; }

// Starts what should run and does not answer, in order (the search daemon
// before those that talk to it). False when one did not come up.
bool StartAll() {
  bool ok = true;
  for (const DaemonState& d : ProbeDaemons()) {
    if (!d.should_run) {
      std::cout << d.program << ": "
                << (d.installed ? "not needed (no indexed folder)" : "not built") << "\n";
      continue;
    }
    if (d.answers) {
      std::cout << d.program << ": running (pid " << PidText(d.pid) << ")\n";
      continue;
    }
    sdk::Platform* p = sdk::GetPlatform();
    const int rc = d.service == fileindex::kFileIndexService
                       ? p->QLIBServicectlStart(d.service, sdk::kServicectlUpstart)
                       : p->QLIBServiceStart(d.service, true);
    if (rc < 0) {
      std::cout << d.program << ": cannot start (error " << p->QLIBCErrGet() << " at "
                << p->QLIBCErrorGetFile() << ":" << p->QLIBCErrorGetLine() << ")\n";
      ok = false;
    } else if (!WaitUntilAnswers(d.program, kStartAnswerMs)) {
      std::cout << d.program << ": started but does not answer\n";
      ok = false;
    } else {
      std::cout << d.program << ": started\n";
    }
  }
  return ok;
}

// Stops every daemon, in the reverse order: the indexing daemon commits
// to the search daemon before that one goes.
bool StopAll() {
  std::vector<DaemonState> daemons = ProbeDaemons();
  bool ok = true;
  sdk::Platform* p = sdk::GetPlatform();
  for (auto it = daemons.rbegin(); it != daemons.rend(); ++it) {
    if (it->pid == 0 && !it->answers) continue;
    const int rc = it->service == fileindex::kFileIndexService
                       ? p->QLIBServicectlStop(it->service, sdk::kServicectlUpstart)
                       : p->QLIBServiceStop(it->service, true);
    if (rc < 0) {
      std::cout << it->program << ": cannot stop (error " << p->QLIBCErrGet() << ")\n";
      ok = false;
    }
  }
  daemons = ProbeDaemons();
  for (auto d = daemons.rbegin(); d != daemons.rend(); ++d) {
    if (d->pid > 0 || d->answers) {
      // Started by hand or by another root: the services layer has no
      // record of it and leaves it alone.
      std::cout << d->program << ": still running (pid " << PidText(d->pid)
                << "), not started as a service\n";
      ok = false;
    } else if (d->installed) {
      std::cout << d->program << ": stopped\n";
    }
  }
  return ok;
}

// Prints the daemons; true when every one that should run answers.
bool PrintStatus(bool json) {
  std::vector<DaemonState> daemons = ProbeDaemons();
  bool ok = true;
  Json::Value out(Json::arrayValue);
  std::vector<std::vector<std::string>> rows;
  for (const DaemonState& d : daemons) {
    if (d.should_run && !d.answers) ok = false;
    Json::Value item(Json::objectValue);
    item["program"] = d.program;
    item["installed"] = d.installed;
    item["should_run"] = d.should_run;
    item["pid"] = d.pid;
    item["answers"] = d.answers;
    out.append(item);
    rows.push_back({d.program, d.installed ? YesNo(d.should_run) : "not built", PidText(d.pid),
                    YesNo(d.answers)});
  }
  if (json) {
    PrintJson(std::cout, out);
  } else {
    PrintTable(std::cout, {"PROGRAM", "SHOULD RUN", "PID", "ANSWERS"}, rows);
  }
  return ok;
}

}  // namespace

void AddServicesCommands(CLI::App& app, Context& ctx) {
  CLI::App* services = app.add_subcommand("services", "The daemons of the service");
  services->require_subcommand(1);
  CLI::App* prepare = services->add_subcommand(
      "prepare",
      "Start the content-extraction service and the indexing daemon (and switch on the "
      "file-sharing search support) when folders are indexed; stop them when none is");
  prepare->callback([&ctx] {
    ctx.action = [] {
      fileindex::PrepareServices();
      std::cout << "services prepared\n";
    };
  });

  CLI::App* start = services->add_subcommand(
      "start",
      "Start the search daemon, then the daemons that indexed folders need, each only when it "
      "does not answer; wait until each answers (exit 1 when one does not)");
  start->callback([&ctx] { ctx.action = [&ctx] { ctx.exit_status = StartAll() ? 0 : 1; }; });

  CLI::App* stop = services->add_subcommand("stop", "Stop every daemon of the service");
  stop->callback([&ctx] { ctx.action = [&ctx] { ctx.exit_status = StopAll() ? 0 : 1; }; });

  auto json = std::make_shared<bool>(false);
  CLI::App* status = services->add_subcommand(
      "status",
      "The daemons: built, needed, running, answering (exit 1 when one that should "
      "run does not answer)");
  status->add_flag("--json", *json, "Print JSON");
  status->callback([&ctx, json] {
    ctx.action = [&ctx, json] { ctx.exit_status = PrintStatus(*json) ? 0 : 1; };
  });
}

}  // namespace vellis::cli
