// vellis-searchd: the search daemon of the file-indexing service.
//
// Listens on the search socket, keeps every index in SQLite (FTS5) and
// answers the protocol of docs/searchd.md. Runs detached by default;
// --foreground keeps it attached. SIGTERM or SIGINT stop it cleanly: no new
// connections are taken, accepted ones are answered, pending writes are
// committed.
#include <signal.h>
#include <syslog.h>
#include <unistd.h>

#include <CLI/CLI.hpp>
#include <iostream>

#include "common/error.h"
#include "common/root_path.h"
#include "daemons/common/process.h"
#include "daemons/searchd/handler.h"
#include "daemons/searchd/registry.h"
#include "daemons/searchd/server.h"
#include "daemons/searchd/sqlite_engine.h"
#include "fileindex/elastic/comm.h"
#include "sdk/platform.h"

namespace {

constexpr int kDefaultWorkers = 4;

void Log(int priority, const std::string& text) {
  vellis::sdk::GetPlatform()->Syslog(priority, text);
}

int Serve(int workers, int recv_timeout_ms) {
  using namespace vellis::searchd;
  // The stop signals arrive on a descriptor, in no thread.
  const int stop_fd = vellis::daemon::StopSignalDescriptor();

  vellis::daemon::RaiseDescriptorLimit();
  vellis::daemon::PidFile pid_file(vellis::RootPath(vellis::daemon::PidFilePath("vellis-searchd")));
  SqliteEngine engine(vellis::RootPath(kRegistryPath));
  Handler handler(engine);
  const std::string socket = vellis::RootPath(vellis::kElasticSocketPath);
  std::unique_ptr<vellis::daemon::ServerLoop> server =
      MakeServer(handler, socket, workers, recv_timeout_ms);
  server->Listen();
  Log(LOG_INFO, "searchd: listening on " + socket);
  server->Run(stop_fd);
  server.reset();  // requests still running finish before the commit
  int status = 0;
  try {
    engine.CommitAll();
  } catch (const vellis::Error& e) {
    Log(LOG_ERR, std::string("searchd: ") + e.what());
    status = 1;
  }
  Log(LOG_INFO, "searchd: stopped");
  close(stop_fd);
  return status;
}

}  // namespace

int main(int argc, char** argv) {
  CLI::App app{"vellis-searchd: the search daemon of the file-indexing service"};
  bool foreground = false;
  int workers = kDefaultWorkers;
  app.add_flag("-f,--foreground", foreground, "Stay attached to the terminal (default: detach)");
  app.add_option("--workers", workers,
                 "Worker threads running requests (requests run one at a time)")
      ->check(CLI::Range(1, 64));
  int recv_timeout_ms = vellis::searchd::kRecvTimeoutMs;
  app.add_option("--recv-timeout-ms", recv_timeout_ms,
                 "Time a whole request may take to arrive before the connection is dropped")
      ->check(CLI::Range(1, 3600 * 1000));
  CLI11_PARSE(app, argc, argv);

  openlog("vellis-searchd", vellis::daemon::LogOptions(foreground), LOG_DAEMON);
  try {
    if (!foreground) vellis::daemon::Daemonize();
    return Serve(workers, recv_timeout_ms);
  } catch (const vellis::Error& e) {
    Log(LOG_ERR,
        "searchd: cannot run: code=" + std::to_string(e.GetCode()) + ", reason=" + e.what());
  } catch (const std::exception& e) {
    Log(LOG_ERR, std::string("searchd: cannot run: ") + e.what());
  }
  return 1;
}
