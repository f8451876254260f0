#include "sdk/monitor_queue.h"

#include "sdk/platform.h"

namespace vellis::sdk {

bool MonitorQueue::Upsert(const MonitorQueue& queue, const std::string& app, int type) {
  return GetPlatform()->MonitorQueueUpsert(queue.config_, app, type);
}

bool MonitorQueue::Delete(const std::string& queue_path, const std::string& app, int type) {
  return GetPlatform()->MonitorQueueDelete(queue_path, app, type);
}

}  // namespace vellis::sdk
