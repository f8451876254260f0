// vellis-monitord: the file-change monitor of the file-indexing service.
//
// Watches the folders that the monitor configuration names and appends
// each change to its share's queue (docs/monitord.md). Follows the
// configuration's changes without a restart. Runs detached by default;
// --foreground keeps it attached. SIGTERM or SIGINT stop it after the lines
// it has made are written.
#include <poll.h>
#include <signal.h>
#include <sys/inotify.h>
#include <syslog.h>
#include <time.h>
#include <unistd.h>

#include <CLI/CLI.hpp>
#include <cstdio>
#include <fstream>

#include "common/error.h"
#include "common/fs_util.h"
#include "common/json_util.h"
#include "common/root_path.h"
#include "daemons/common/process.h"
#include "daemons/monitord/inotify_watcher.h"
#include "daemons/monitord/monitor.h"
#include "daemons/monitord/watcher_factory.h"
#include "sdk/linux/monitor_queues.h"
#include "sdk/platform.h"

namespace {

void Log(int priority, const std::string& text) {
  vellis::sdk::GetPlatform()->Syslog(priority, text);
}

int64_t MonotonicMs() {
  timespec ts;
  clock_gettime(CLOCK_MONOTONIC, &ts);
  return static_cast<int64_t>(ts.tv_sec) * 1000 + ts.tv_nsec / 1000000;
}

// Replaces the status file in one step, so readers see the old or the new.
void WriteStatus(const Json::Value& status) {
  const std::string path = vellis::RootPath(vellis::sdk::kMonitorStatusFile);
  const std::string tmp = path + ".tmp";
  {
    std::ofstream out(tmp, std::ios::trunc);
    out << vellis::JsonToString(status) << "\n";
    if (!out.flush()) return;
  }
  std::rename(tmp.c_str(), path.c_str());
}

int Serve(const std::string& backend, const vellis::monitord::MonitorOptions& options) {
  using namespace vellis;
  const int stop_fd = daemon::StopSignalDescriptor();

  daemon::PidFile pid_file(RootPath(daemon::PidFilePath("vellis-monitord")));
  std::string why;
  std::unique_ptr<monitord::Watcher> watcher = monitord::MakeWatcher(backend, &why);
  if (!watcher) throw Error(kErrInternal, "no watcher: " + why);
  Log(LOG_INFO,
      "monitord: watching with " + watcher->Name() + (why.empty() ? "" : " (" + why + ")"));

  // The configuration's folder: a file written, replaced or removed there
  // is read again.
  const std::string config_dir = RootPath(sdk::kMonitorQueueDir);
  MakeDirs(config_dir);
  const int config_fd = inotify_init1(IN_NONBLOCK | IN_CLOEXEC);
  if (config_fd < 0 ||
      inotify_add_watch(config_fd, config_dir.c_str(),
                        IN_CLOSE_WRITE | IN_MOVED_TO | IN_MOVED_FROM | IN_DELETE | IN_CREATE) < 0) {
    throw Error(kErrInternal, "cannot watch " + config_dir);
  }

  monitord::Monitor monitor(std::move(watcher), options, MonotonicMs);
  monitor.Reload();
  int64_t status_at = 0;
  for (;;) {
    const int64_t due = monitor.Step();
    const int64_t now = MonotonicMs();
    if (now - status_at >= 1000) {
      WriteStatus(monitor.Status());
      status_at = now;
    }
    int timeout = due < 0 ? 1000 : static_cast<int>(std::max<int64_t>(0, due - now));
    timeout = std::min(timeout, 1000);  // the status file stays fresh
    pollfd fds[3] = {
        {stop_fd, POLLIN, 0}, {monitor.watcher().fd(), POLLIN, 0}, {config_fd, POLLIN, 0}};
    if (poll(fds, 3, timeout) < 0 && errno != EINTR) throw Error(kErrInternal, "poll failed");
    if (fds[0].revents & POLLIN) break;
    if (fds[2].revents & POLLIN) {
      char buf[4096];
      while (read(config_fd, buf, sizeof(buf)) > 0) {
      }
      monitor.Reload();
    }
  }
  monitor.Step();
  monitor.Drain();  // what was made is written before the end
  WriteStatus(monitor.Status());
  Log(LOG_INFO, "monitord: stopping");
  close(config_fd);
  close(stop_fd);
  return 0;
}

}  // namespace

int main(int argc, char** argv) {
  CLI::App app{"vellis-monitord: the file-change monitor of the file-indexing service"};
  bool foreground = false;
  std::string backend = "auto";
  int network_minutes = 10;
  vellis::monitord::MonitorOptions options;
  app.add_flag("-f,--foreground", foreground, "Stay attached to the terminal (default: detach)");
  app.add_option("--backend", backend, "auto, inotify or fanotify")
      ->check(CLI::IsMember({"auto", "inotify", "fanotify"}));
  app.add_option("--network-reindex-minutes", network_minutes,
                 "Reindex folders on file systems that do not report changes this often")
      ->check(CLI::Range(1, 24 * 60));
  app.add_option("--move-grace-ms", options.router.move_grace_ms,
                 "How long the half of a rename that leaves waits for the half that arrives")
      ->check(CLI::Range(0, 10000));
  app.add_option("--modify-flush-ms", options.router.modify_flush_ms,
                 "A file kept open is reported this long after its first write")
      ->check(CLI::Range(0, 600000));
  CLI11_PARSE(app, argc, argv);
  options.network_reindex_ms = static_cast<int64_t>(network_minutes) * 60 * 1000;

  vellis::PrepareRoot();
  openlog("vellis-monitord", vellis::daemon::LogOptions(foreground), LOG_DAEMON);
  try {
    if (!foreground) vellis::daemon::Daemonize();
    return Serve(backend, options);
  } catch (const vellis::Error& e) {
    Log(LOG_ERR,
        "monitord: cannot run: code=" + std::to_string(e.GetCode()) + ", reason=" + e.what());
  } catch (const std::exception& e) {
    Log(LOG_ERR, std::string("monitord: cannot run: ") + e.what());
  }
  return 1;
}
