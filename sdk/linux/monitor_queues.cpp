#include "sdk/linux/monitor_queues.h"

#include <sys/stat.h>

#include <cerrno>
#include <exception>

#include "common/json_util.h"
#include "common/lock_file.h"
#include "common/root_path.h"
#include "sdk/linux/last_error.h"
#include "sdk/linux/linux_platform.h"

namespace vellis::sdk {
namespace {

// Records the failure (with its line here) and answers false.
bool Refuse(int err, int line) {
  FailAt(err, __FILE__, line);
  return false;
}

bool IsAbsolute(const Json::Value& v) {
  return v.isString() && !v.asString().empty() && v.asString()[0] == '/' &&
         v.asString().find('\0') == std::string::npos;
}

void MakeDirs(const std::string& dir) {
  for (size_t pos = 1; pos <= dir.size(); ++pos) {
    if (pos == dir.size() || dir[pos] == '/') mkdir(dir.substr(0, pos).c_str(), 0755);
  }
}

// Loads, changes and saves the application's file under its lock. A file
// that is there but unreadable or not of our shape is never overwritten.
template <typename Change>
bool UpdateFile(const std::string& app, int type, Change change) {
  const std::string file = MonitorQueueFile(app);
  if (file.empty() || type <= 0) return Refuse(EINVAL, __LINE__);
  try {
    MakeDirs(RootPath(kMonitorQueueDir));
    LockFile lock(RootPath(std::string(kMonitorQueueLockPrefix) + app + ".lock"), true);
    Json::Value doc(Json::objectValue);
    struct stat st;
    if (lstat(file.c_str(), &st) == 0) {
      if (!JsonFromFile(doc, file) || !doc.isObject() ||
          (doc.isMember("queues") && !doc["queues"].isObject())) {
        return Refuse(EBADMSG, __LINE__);
      }
    } else if (errno != ENOENT) {
      return Refuse(errno, __LINE__);
    }
    doc["app"] = app;
    if (!doc.isMember("queues")) doc["queues"] = Json::Value(Json::objectValue);
    if (!change(doc["queues"])) return true;  // nothing to write
    if (!JsonToFile(doc, file)) return Refuse(errno ? errno : EIO, __LINE__);
    return true;
  } catch (const std::exception&) {
    // The lock could not be taken.
    return Refuse(EAGAIN, __LINE__);
  }
}

}  // namespace

std::string MonitorQueueFile(const std::string& app) {
  if (app.empty() || app == "." || app == ".." || app.find('/') != std::string::npos ||
      app.find('\0') != std::string::npos) {
    return "";
  }
  return RootPath(std::string(kMonitorQueueDir) + "/" + app + ".json");
}

bool IsValidMonitorQueue(const Json::Value& queue) {
  if (!queue.isObject() || !IsAbsolute(queue["queue"]) || !queue["config"].isArray()) {
    return false;
  }
  for (const Json::Value& item : queue["config"]) {
    if (!item.isObject() || !IsAbsolute(item["path"]) || !item["mask"].isIntegral() ||
        !item["ignore"].isArray()) {
      return false;
    }
    for (const Json::Value& name : item["ignore"]) {
      if (!name.isString()) return false;
    }
  }
  return true;
}

bool LinuxPlatform::MonitorQueueUpsert(const Json::Value& queue, const std::string& app, int type) {
  if (!IsValidMonitorQueue(queue)) return Refuse(EINVAL, __LINE__);
  return UpdateFile(app, type, [&](Json::Value& queues) {
    Json::Value entry(Json::objectValue);
    entry["type"] = type;
    entry["config"] = queue["config"];
    queues[queue["queue"].asString()] = entry;
    return true;
  });
}

bool LinuxPlatform::MonitorQueueDelete(const std::string& queue_path, const std::string& app,
                                       int type) {
  if (!IsAbsolute(Json::Value(queue_path))) return Refuse(EINVAL, __LINE__);
  return UpdateFile(app, type, [&](Json::Value& queues) {
    if (!queues.isMember(queue_path)) return false;
    queues.removeMember(queue_path);
    return true;
  });
}

}  // namespace vellis::sdk
