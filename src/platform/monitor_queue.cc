#include "platform/monitor_queue.h"

#include "kalo/kalo_notify.h"

namespace orvex {
namespace sdk {

using KALO::KALONOTIFYD::MONITOR_QUEUE_TYPE_APPLICATION;
using KALO::KALONOTIFYD::MonitorQueue;

bool UpsertMonitorQueue(const Json::Value& description, const std::string& app_name) {
  const MonitorQueue monitor_queue(description);
  return MonitorQueue::Upsert(monitor_queue, app_name, MONITOR_QUEUE_TYPE_APPLICATION);
}

bool DeleteMonitorQueue(const std::string& queue_path, const std::string& app_name) {
  return MonitorQueue::Delete(queue_path, app_name, MONITOR_QUEUE_TYPE_APPLICATION);
}

}  // namespace sdk
}  // namespace orvex
