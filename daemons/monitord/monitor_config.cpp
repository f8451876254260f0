#include "daemons/monitord/monitor_config.h"

#include <json/json.h>

#include <memory>

namespace vellis::monitord {
namespace {

constexpr size_t kMaxPath = 4095;

bool ParseFolder(const Json::Value& item, const std::string& queue, WatchedFolder* out,
                 std::string* why) {
  if (!item.isObject()) return *why = "a folder entry is not an object", false;
  const Json::Value& path = item["path"];
  if (!path.isString() || !IsCanonicalFullPath(path.asString())) {
    return *why = "\"path\" is not a canonical full path", false;
  }
  out->path = path.asString();
  const Json::Value& mask = item["mask"];
  if (!mask.isIntegral() || mask.asLargestInt() < 0 || mask.asLargestInt() > 0xFFFFFFFFLL) {
    return *why = out->path + ": \"mask\" is not an unsigned 32-bit integer", false;
  }
  out->mask = static_cast<uint32_t>(mask.asLargestUInt());
  const Json::Value& ignore = item.get("ignore", Json::Value(Json::arrayValue));
  if (!ignore.isArray()) return *why = out->path + ": \"ignore\" is not an array", false;
  for (const Json::Value& name : ignore) {
    if (!name.isString() || name.asString().empty() ||
        name.asString().find('/') != std::string::npos) {
      return *why = out->path + ": an \"ignore\" entry is not a file name", false;
    }
    out->ignore.push_back(name.asString());
  }
  out->queue = queue;
  return true;
}

}  // namespace

bool IsCanonicalFullPath(const std::string& path) {
  if (path.empty() || path[0] != '/' || path.size() > kMaxPath) return false;
  if (path == "/") return true;
  size_t start = 1;
  for (;;) {
    const size_t end = path.find('/', start);
    const std::string part = path.substr(start, end == std::string::npos ? end : end - start);
    if (part.empty() || part == "." || part == "..") return false;
    if (part.find('\0') != std::string::npos) return false;
    if (end == std::string::npos) return true;
    start = end + 1;
  }
}

void ParseMonitorConfig(const std::string& name, const std::string& text, MonitorConfig* config) {
  Json::CharReaderBuilder builder;
  builder["collectComments"] = false;
  builder["failIfExtra"] = true;
  std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
  Json::Value root;
  std::string parse_error;
  if (!reader->parse(text.data(), text.data() + text.size(), &root, &parse_error)) {
    config->errors.push_back(name + ": not JSON: " + parse_error);
    return;
  }
  if (!root.isObject() || !root["queues"].isObject()) {
    config->errors.push_back(name + ": no \"queues\" object");
    return;
  }
  const Json::Value& queues = root["queues"];
  for (const std::string& queue : queues.getMemberNames()) {
    if (!IsCanonicalFullPath(queue)) {
      config->errors.push_back(name + ": queue \"" + queue + "\" is not a canonical full path");
      continue;
    }
    const Json::Value& folders = queues[queue]["config"];
    if (!folders.isArray()) {
      config->errors.push_back(name + ": queue " + queue + " has no \"config\" array");
      continue;
    }
    for (const Json::Value& item : folders) {
      WatchedFolder folder;
      std::string why;
      if (ParseFolder(item, queue, &folder, &why)) {
        config->folders.push_back(std::move(folder));
      } else {
        config->errors.push_back(name + ": queue " + queue + ": " + why);
      }
    }
  }
}

}  // namespace vellis::monitord
