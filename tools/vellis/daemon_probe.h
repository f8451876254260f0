// What the command line knows of the service's daemons: which are built,
// which should run now, which run and which answer on their sockets.
#pragma once

#include <json/json.h>

#include <string>
#include <vector>

namespace vellis::cli {

struct DaemonState {
  std::string program;      // "vellis-searchd"
  std::string service;      // the name the services layer starts it by
  bool installed = false;   // the program is beside this one
  bool should_run = false;  // the search daemon always; the others while folders are indexed
  int pid = 0;              // from the daemon's own pid file; 0 when it does not run
  bool answers = false;     // a request on its socket was answered
  Json::Value status;       // the indexing daemon's "status" data, when it answered
};

// Every daemon of the service, in start order, each probed once.
std::vector<DaemonState> ProbeDaemons();

// Probes `program` until it answers or `timeout_ms` passes.
bool WaitUntilAnswers(const std::string& program, int timeout_ms);

}  // namespace vellis::cli
