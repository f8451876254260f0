// vellis-fileindexd: the indexing daemon of the file-indexing service.
//
// Turns the share queues into search documents: one worker per share with
// indexed folders (docs/fileindexd.md), and the command socket that the
// library's management operations talk to. Runs detached by default;
// --foreground keeps it attached and copies log lines to stderr. SIGTERM or
// SIGINT stop it cleanly: each worker commits what it sent and leaves the
// rest of its round in the side file.
#include <signal.h>
#include <syslog.h>
#include <time.h>
#include <unistd.h>

#include <CLI/CLI.hpp>

#include "common/error.h"
#include "common/root_path.h"
#include "daemons/common/process.h"
#include "daemons/common/server_loop.h"
#include "daemons/fileindexd/indexing_service.h"
#include "sdk/platform.h"

namespace {

void Log(int priority, const std::string& text) {
  vellis::sdk::GetPlatform()->Syslog(priority, text);
}

int64_t EpochMs() {
  timespec ts;
  clock_gettime(CLOCK_REALTIME, &ts);
  return static_cast<int64_t>(ts.tv_sec) * 1000 + ts.tv_nsec / 1000000;
}

int Serve(const vellis::fileindexd::WorkerOptions& options) {
  using namespace vellis;
  const int stop_fd = daemon::StopSignalDescriptor();

  daemon::RaiseDescriptorLimit();
  daemon::PidFile pid_file(RootPath(daemon::PidFilePath("vellis-fileindexd")));
  fileindexd::IndexingService service(options, EpochMs);
  service.Load();

  daemon::ServerOptions server_options;
  server_options.socket_path = RootPath(fileindexd::kCommandSocketPath);
  server_options.socket_mode = 0666;  // anyone may ask "status"; changes check the peer
  server_options.log_name = "fileindexd";
  server_options.workers = 2;
  server_options.request_timeout_ms = 10 * 1000;
  server_options.idle_after_ms = 0;
  daemon::ServerLoop server(server_options, [&service](const daemon::Request& r) {
    return service.Handle(r.text, r.peer);
  });
  server.Listen();
  Log(LOG_INFO, "fileindexd: listening on " + server_options.socket_path);
  server.Run(stop_fd);
  Log(LOG_INFO, "fileindexd: stopping");
  close(stop_fd);
  return 0;  // the service's destructor stops the workers
}

}  // namespace

int main(int argc, char** argv) {
  CLI::App app{"vellis-fileindexd: the indexing daemon of the file-indexing service"};
  bool foreground = false;
  vellis::fileindexd::WorkerOptions options;
  app.add_flag("-f,--foreground", foreground, "Stay attached to the terminal (default: detach)");
  app.add_option("--settle-ms", options.settle_ms,
                 "Quiet time after a queue grows, so that bursts fold together")
      ->check(CLI::Range(0, 60 * 1000));
  app.add_option("--batch", options.indexer.batch_size, "Requests per compound request")
      ->check(CLI::Range(1, 10000));
  app.add_option("--commit-every", options.indexer.commit_every_ops, "Operations between commits")
      ->check(CLI::Range(1, 10000000));
  app.add_option("--commit-seconds", options.indexer.commit_every_seconds,
                 "Seconds between commits")
      ->check(CLI::Range(1, 3600));
  CLI11_PARSE(app, argc, argv);

  openlog("vellis-fileindexd", vellis::daemon::LogOptions(foreground), LOG_DAEMON);
  try {
    if (!foreground) vellis::daemon::Daemonize();
    return Serve(options);
  } catch (const vellis::Error& e) {
    Log(LOG_ERR,
        "fileindexd: cannot run: code=" + std::to_string(e.GetCode()) + ", reason=" + e.what());
  } catch (const std::exception& e) {
    Log(LOG_ERR, std::string("fileindexd: cannot run: ") + e.what());
  }
  return 1;
}
