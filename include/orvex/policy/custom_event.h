// Custom events and notifications: the library's own way of putting work
// into a share's event queue (re-index requests, configuration changes,
// renames), in the line format the notification daemon writes, and of
// telling the administrators about conditions that stop indexing. Safe for
// concurrent use: appends serialise on the queue file's lock, and each
// notification runs the notification tool as a separate process.
#ifndef ORVEX_POLICY_CUSTOM_EVENT_H_
#define ORVEX_POLICY_CUSTOM_EVENT_H_

#include <json/json.h>

#include <string>

#include "orvex/export.h"

namespace orvex {
namespace fileindex {

// The platform's notification tool (opened under ORVEX_ROOT when set).
inline constexpr char kPMXNotifyPath[] = "/usr/kalo/bin/kalopmxnotify";

// Appends {"event": event, "path": path, "path_old": path_old, "data": data}
// as one line to the live queue of the share that holds the full path path,
// under the exclusive lock of the queue file. Writes nothing when a pure
// re-index of path or of an ancestor already waits in the live queue or its
// snapshot: that re-index covers any event. The queue's directory
// (<share>/@eaDir/@fileindex) is created (mode 0755) when missing; a queue
// file that still cannot be opened loses the line silently.
//
// Throws the Error of the share lookup (120 when no registered share holds
// path, 502 when the registry cannot be read) as it stands: no share is
// known to mark. Any later Error (800 share record, 502 queue path or
// unreadable queue, 906/120 malformed queue line, 506 lock) is logged, the
// share is marked as needing a re-index (status flag 1) and the same Error
// is thrown again.
ORVEX_EXPORT void AddCustomEvent(int event, const std::string& path, const std::string& path_old,
                                 const Json::Value& data);

// Tells the administrators that the index has run out of space, through the
// notification tool, with a link to the package's preferences. Waits for the
// tool; its result is ignored and a missing tool is only logged. Never throws.
ORVEX_EXPORT void SendPMXNotify();

// Tells the administrators that indexing lacks memory, through the
// notification tool. Never throws.
ORVEX_EXPORT void NotifyLackOfMemory();

}  // namespace fileindex
}  // namespace orvex

#endif  // ORVEX_POLICY_CUSTOM_EVENT_H_
