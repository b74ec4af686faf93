#include "orvex/queue/event.h"

#include "foundation/check.h"
#include "orvex/foundation/json.h"

namespace orvex {
namespace fileindex {
namespace {

constexpr char kLogSource[] = "optree";

// Optional members of the wrong type are ignored: the field keeps its
// initial value rather than failing the whole line.
template <typename T>
void GetOptional(T& out, const Json::Value& obj, const char* key) {
  try {
    GetJsonValue<T>(out, obj, key, /*required=*/false);
  } catch (const Error&) {
  }
}

}  // namespace

Event::Event(const std::string& event_raw) {
  Json::Value data_json;
  ORVEX_CHECK_AS(!fromString(data_json, event_raw), "!data.fromString(event_raw)",
                 kErrorMalformedEvent, "Malformed event_raw: " + event_raw);
  unsigned int mask = 0;
  GetJsonValue<unsigned int>(mask, data_json, "event", /*required=*/true);
  event = mask;
  GetOptional<bool>(is_dir, data_json, "is_dir");
  GetJsonValue<std::string>(path, data_json, "path", /*required=*/true);
  GetOptional<std::string>(path_old, data_json, "path_old");
  GetOptional<Json::Value>(data, data_json, "data");
}

Event::~Event() = default;

}  // namespace fileindex
}  // namespace orvex
