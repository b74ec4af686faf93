// Monitor queues of the file-change notification daemon: the library's door
// to the platform's registration calls. A registration names a share's queue
// file and the folders whose changes go into it; it is always an
// application's registration. Safe for concurrent use.
#ifndef ORVEX_SRC_PLATFORM_MONITOR_QUEUE_H_
#define ORVEX_SRC_PLATFORM_MONITOR_QUEUE_H_

#include <json/json.h>

#include <string>

namespace orvex {
namespace sdk {

// Registers or replaces the queue described by description ({"queue": path,
// "config": [{"path", "mask", "ignore"}, ...]}) for app_name. False on
// failure, errno set. Never throws.
bool UpsertMonitorQueue(const Json::Value& description, const std::string& app_name);

// Removes the registration of queue_path for app_name; a queue that is not
// registered counts as removed. False on failure, errno set. Never throws.
bool DeleteMonitorQueue(const std::string& queue_path, const std::string& app_name);

}  // namespace sdk
}  // namespace orvex

#endif  // ORVEX_SRC_PLATFORM_MONITOR_QUEUE_H_
