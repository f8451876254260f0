// Service control on Linux (docs/platform.md, "Services").
//
// Where systemd runs (the folder /run/systemd/system exists under the root)
// each service is a systemd unit driven with systemctl through the process
// runner. Elsewhere (a plain container) the platform starts and stops our own
// daemons itself: it runs the program detached, in a session of its own, and
// keeps "<pid> <start time>" in a pid file under the root, so that a pid that
// the system has meanwhile given to another process is never signalled.
// With $VELLIS_SERVICES set to "none", nothing is started, stopped or
// restarted: each request is only written to the system log and succeeds.
#pragma once

#include <string>

namespace vellis::sdk {

// "none": log service requests instead of carrying them out.
inline constexpr char kServicesEnv[] = "VELLIS_SERVICES";
// The folder of our daemon programs; unset, the folder of the running
// executable.
inline constexpr char kDaemonDirEnv[] = "VELLIS_DAEMON_DIR";
// Fixed paths, resolved with RootPath() at use.
inline constexpr char kSystemdRunDir[] = "/run/systemd/system";
inline constexpr char kServicePidDir[] = "/var/run/vellis";
inline constexpr char kServiceLockPrefix[] = "/tmp/vellis_service_";
inline constexpr char kSambaInitScript[] = "/etc/init.d/smbd";
inline constexpr char kSystemctlProgram[] = "/bin/systemctl";

// The search daemon as a service of its own: the appliance starts it with
// the system, the command line (`vellis services start`) without one.
inline constexpr char kSearchService[] = "vellis-searchd";
// The file-change monitor; it also starts and stops with the indexing
// daemon.
inline constexpr char kMonitorService[] = "vellis-monitord";

// What an appliance service name stands for here.
struct ServiceMapping {
  const char* service;  // the appliance's name ("pkg-Vellis-fileindexd")
  const char* unit;     // the systemd unit ("vellis-fileindexd.service")
  const char* program;  // our program run without systemd; null for samba
  // Our program that comes and goes with this one without systemd (where
  // the unit wants it instead); null for none.
  const char* companion = nullptr;
};

// The mapping of `service`; null for a name we do not know.
const ServiceMapping* FindService(const std::string& service);

// Where our program `program` is run from: $VELLIS_DAEMON_DIR, else the
// folder of the running executable; "" when neither is known.
std::string ServiceProgramPath(const std::string& program);

// The pid file of our program `program` under the root.
std::string ServicePidFile(const std::string& program);

// The pid recorded for `program` when that process still runs (and is not a
// zombie) and is the one that was started; 0 otherwise.
int RunningServicePid(const std::string& program);

}  // namespace vellis::sdk
