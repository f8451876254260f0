#include "tools/notify/notification.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

#include "common/fs_util.h"
#include "common/json_util.h"
#include "common/root_path.h"

namespace vellis::notify {

bool ParseNotifyArgs(const std::vector<std::string>& args, Notification* out,
                     std::string* problem) {
  size_t i = 0;
  for (; i < args.size() && !args[i].empty() && args[i][0] == '-'; i += 2) {
    const std::string& option = args[i];
    if (option != "-c" && option != "-b" && option != "-e") {
      *problem = "unknown option " + option;
      return false;
    }
    if (i + 1 >= args.size()) {
      *problem = "option " + option + " needs a value";
      return false;
    }
    if (option == "-c") {
      out->app = args[i + 1];
    } else {
      out->options[option.substr(1)] = args[i + 1];
    }
  }
  if (out->app.empty()) {
    *problem = "-c APP is required";
    return false;
  }
  if (args.size() - i < 3) {
    *problem = "RECIPIENTS TITLE MESSAGE are required";
    return false;
  }
  out->recipients = args[i];
  out->title = args[i + 1];
  out->message = args[i + 2];
  out->params.assign(args.begin() + static_cast<long>(i) + 3, args.end());
  return true;
}

std::string NotificationLine(const Notification& n, int64_t time) {
  Json::Value v(Json::objectValue);
  v["time"] = static_cast<Json::Int64>(time);
  v["app"] = n.app;
  v["to"] = n.recipients;
  v["title"] = n.title;
  v["message"] = n.message;
  v["params"] = Json::Value(Json::arrayValue);
  for (const std::string& p : n.params) v["params"].append(p);
  v["options"] = Json::Value(Json::objectValue);
  for (const auto& option : n.options) v["options"][option.first] = option.second;
  return JsonToString(v);
}

bool AppendNotification(const std::string& line) {
  std::string path = RootPath(kNotificationsPath);
  std::string dir = Dirname(path);
  for (size_t pos = 1; pos <= dir.size(); ++pos) {
    if (pos == dir.size() || dir[pos] == '/') mkdir(dir.substr(0, pos).c_str(), 0755);
  }
  int fd = open(path.c_str(), O_WRONLY | O_APPEND | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0644);
  if (fd < 0) return false;
  // One write of the whole line: appends of concurrent notifiers do not
  // interleave.
  std::string data = line + "\n";
  ssize_t n = write(fd, data.data(), data.size());
  int err = errno;
  close(fd);
  if (n == static_cast<ssize_t>(data.size())) return true;
  errno = n < 0 ? err : EIO;
  return false;
}

}  // namespace vellis::notify
