#include "orvex/queue/event.h"

#include "foundation/check.h"
#include "orvex/foundation/json.h"
#include "queue/event_parser.h"

namespace orvex {
namespace fileindex {
namespace {

constexpr char kLogSource[] = "optree";

template <typename T>
void GetOptional(T& out, const Json::Value& obj, const char* key) {
  try {
    GetJsonValue<T>(out, obj, key, /*required=*/false);
  } catch (const Error&) {
  }
}

bool HoldsNul(const std::string& path) { return path.find('\0') != std::string::npos; }

}  // namespace

void ParseEventJson(const std::string& event_raw, EventFields& out) {
  Json::Value data_json;
  ORVEX_CHECK_AS(!fromString(data_json, event_raw), "!data.fromString(event_raw)",
                 kErrorMalformedEvent, "Malformed event_raw: " + event_raw);
  unsigned int mask = 0;
  GetJsonValue<unsigned int>(mask, data_json, "event", /*required=*/true);
  out.event = mask;
  // Optional members of the wrong type are ignored: the field keeps its
  // initial value rather than failing the whole line.
  GetOptional<bool>(out.is_dir, data_json, "is_dir");
  GetJsonValue<std::string>(out.path, data_json, "path", /*required=*/true);
  GetOptional<std::string>(out.path_old, data_json, "path_old");
  GetOptional<Json::Value>(out.data, data_json, "data");
  // Every file-system call reads a path up to its first NUL byte: such a
  // path would name another file than the event's.
  ORVEX_CHECK(HoldsNul(out.path) || HoldsNul(out.path_old), kErrorMalformedEvent,
              "Malformed event_raw: " + event_raw);
}

Event::Event(const std::string& event_raw) {
  EventFields fields;
  if (!ParseEventFast(event_raw, fields)) ParseEventJson(event_raw, fields);
  event = fields.event;
  is_dir = fields.is_dir;
  path = std::move(fields.path);
  path_old = std::move(fields.path_old);
  data = std::move(fields.data);
}

Event::~Event() = default;

}  // namespace fileindex
}  // namespace orvex
