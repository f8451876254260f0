// One notification to the administrators, as vellis-notify receives it.
#pragma once

#include <json/json.h>

#include <map>
#include <string>
#include <vector>

namespace vellis::notify {

// Where notifications are kept, one JSON object per line; resolve it with
// RootPath().
inline constexpr char kNotificationsPath[] = "/var/packages/Vellis/var/notifications.jsonl";

struct Notification {
  std::string app;                             // -c: the sending application
  std::map<std::string, std::string> options;  // -b, -e: the notifier's options, as given
  std::string recipients;                      // "@<group>" or a user name
  std::string title;                           // title key
  std::string message;                         // message key
  std::vector<std::string> params;             // texts substituted into the message
};

// Reads the argument list
//   -c APP [-b VALUE] [-e VALUE] RECIPIENTS TITLE MESSAGE [PARAM...]
// (options before the first other argument, in any order). Returns false
// with *problem set when -c is missing, an option lacks its value or is
// unknown, or fewer than three other arguments follow. Pure.
bool ParseNotifyArgs(const std::vector<std::string>& args, Notification* out, std::string* problem);

// The JSON line (without newline) of `n` sent at `time` (seconds since the
// epoch). Pure.
std::string NotificationLine(const Notification& n, int64_t time);

// Appends `line` and a newline to RootPath(kNotificationsPath) in one write
// (creating the file, mode 0644, and its folders). Returns false with errno
// set when it cannot.
bool AppendNotification(const std::string& line);

}  // namespace vellis::notify
