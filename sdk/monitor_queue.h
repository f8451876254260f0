// The file-change monitor's queue interface, as the management operations
// call it. Each call goes to the platform (Platform::MonitorQueueUpsert and
// MonitorQueueDelete); on Linux the configuration is one file per
// application (sdk/linux/monitor_queues.h).
#pragma once

#include <json/json.h>

#include <string>

namespace vellis::sdk {

// Queue types of the monitor interface, under the interface's own names.
enum MonitorQueueType : int {
  MONITOR_QUEUE_TYPE_APPLICATION = 1,  // a queue that an application reads
};

class MonitorQueue {
 public:
  // `config` is {"queue": <queue file>, "config": [<watched folder>...]}.
  explicit MonitorQueue(Json::Value config) : config_(std::move(config)) {}
  const Json::Value& config() const { return config_; }

  // Enters or replaces the queue for application `app`. True on success.
  static bool Upsert(const MonitorQueue& queue, const std::string& app, int type);
  // Removes the queue `queue_path` of `app`; true on success, also when it
  // was not there.
  static bool Delete(const std::string& queue_path, const std::string& app, int type);

 private:
  Json::Value config_;
};

}  // namespace vellis::sdk
