// Event: one parsed line of a share's event queue, a file-system change
// reported by the notification daemon or a custom event the library queued
// itself. Immutable once built; shared through std::shared_ptr.
#ifndef ORVEX_QUEUE_EVENT_H_
#define ORVEX_QUEUE_EVENT_H_

#include <json/json.h>

#include <cstdint>
#include <string>

#include "orvex/export.h"

namespace orvex {
namespace fileindex {

// Bits of an event's mask, with their wire values. Other bits are ignored.
enum EventMask : uint32_t {
  EVENT_MODIFY = 0x2,           // content changed
  EVENT_ATTR = 0x4,             // attributes changed
  EVENT_CREATE = 0x40,          // created or moved in
  EVENT_DELETE = 0x80,          // deleted or moved out
  EVENT_RENAME = 0x100,         // renamed from path_old to path
  EVENT_QUEUE_CRASHED = 0x200,  // the producer lost events
  EVENT_REINDEX = 0x10000,      // custom: reindex this path
  EVENT_UPDATE_CFG = 0x20000,   // custom: folder configuration changed, data holds it
};

class ORVEX_EXPORT Event {
 public:
  // Parses one queue line: {"event": mask, "path": p} with optional "is_dir",
  // "path_old" and "data"; other keys are ignored, and an optional key of the
  // wrong type keeps its initial value. Throws Error 906 ("Malformed
  // event_raw: " + line, logged first) when the text is not JSON, and Error
  // 120 when it is not an object or "event" (a JSON number) or "path" (a
  // string) is missing or mistyped.
  explicit Event(const std::string& event_raw);
  ~Event();

  uint32_t event = 0;
  bool is_dir = false;
  std::string path;
  std::string path_old;
  Json::Value data;
};

}  // namespace fileindex
}  // namespace orvex

#endif  // ORVEX_QUEUE_EVENT_H_
