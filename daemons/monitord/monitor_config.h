// The monitor's configuration: the files that the library's management
// operations keep in /var/packages/Vellis/etc/monitor/<app>.json, one per
// application, read here into what to watch and where to report it.
//
//   {"app": "fileindex",
//    "queues": {"<queue file>": {"type": 1,
//                                "config": [{"path": "<folder>", "mask": 65478,
//                                            "ignore": ["@eaDir"]}]}}}
//
// Pure: text in, values out. A malformed entry is left out with its reason;
// the others stand.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

namespace vellis::monitord {

struct WatchedFolder {
  std::string path;                 // canonical full path
  uint32_t mask = 0;                // the event bits to report
  std::vector<std::string> ignore;  // folder names never entered
  std::string queue;                // the queue file its changes go to
};

struct MonitorConfig {
  std::vector<WatchedFolder> folders;  // in file order
  std::vector<std::string> errors;     // "<file>: <what was left out and why>"
};

// Adds what the configuration text `text` (the file `name`, for messages)
// holds to `config`. A text that is not a JSON object of this shape adds
// nothing but its error.
void ParseMonitorConfig(const std::string& name, const std::string& text, MonitorConfig* config);

// True for "/" followed by non-empty components without "." or "..", no
// doubled or trailing "/", at most 4095 bytes.
bool IsCanonicalFullPath(const std::string& path);

}  // namespace vellis::monitord
