// JSON helpers on Json::Value (jsoncpp): typed member reads with uniform
// errors, the merge rule for partial changes, and the four text and file
// operations every subsystem uses. All functions are safe for concurrent use
// on distinct values.
#ifndef ORVEX_FOUNDATION_JSON_H_
#define ORVEX_FOUNDATION_JSON_H_

#include <json/json.h>

#include <string>

#include "orvex/export.h"
#include "orvex/foundation/error.h"

namespace orvex {

// Type test and conversion for std::string, bool, int, unsigned int,
// long long, double and Json::Value. Except for long long (an exact integer
// type test) the tests are jsoncpp's convertibility tests, so a null passes
// and converts to the type's empty value.
template <typename T>
bool isJsonType(const Json::Value& v);
template <typename T>
T asJsonType(const Json::Value& v);

// ", data=" followed by the one-line text of obj.
ORVEX_EXPORT std::string AppendData(const Json::Value& obj);

// Reads obj[key] into out. Throws Error(120) with "Not an object" when obj is
// not an object, "Missing property: <key>" when a required key is absent and
// "Not a string" when the member has the wrong type (one text for every T),
// each followed by AppendData(obj). An absent optional key leaves out as it
// was.
template <typename T>
void GetJsonValue(T& out, const Json::Value& obj, const std::string& key, bool required) {
  if (!obj.isObject()) throw Error(kErrorBadArgument, "Not an object" + AppendData(obj));
  const Json::Value* member = obj.find(key.data(), key.data() + key.size());
  if (member == nullptr) {
    if (required) throw Error(kErrorBadArgument, "Missing property: " + key + AppendData(obj));
    return;
  }
  if (!isJsonType<T>(*member)) throw Error(kErrorBadArgument, "Not a string" + AppendData(obj));
  out = asJsonType<T>(*member);
}

// Applies a partial change: a null member deletes the key, an object member is
// applied recursively (creating the key), anything else (arrays included)
// replaces the target's member whole.
ORVEX_EXPORT void JsonApplyChanges(Json::Value& target, const Json::Value& changes);

// Parses text into value; false (value unspecified) when it is not exactly one
// valid JSON document.
ORVEX_EXPORT bool fromString(Json::Value& value, const std::string& text);
ORVEX_EXPORT bool fromString(Json::Value& value, const char* begin, const char* end);

// Parses a whole file; false when it cannot be read or parsed.
ORVEX_EXPORT bool fromFile(Json::Value& value, const std::string& path);

// Writes the value's indented text to path by atomic replacement (mode 0644);
// false with errno set on any failure, the old file then left intact.
ORVEX_EXPORT bool toFile(const Json::Value& value, const std::string& path);

// The value's compact JSON text on one line: never a line break, so it can be
// a queue line or a log field. Strings keep their bytes (UTF-8 unescaped).
ORVEX_EXPORT std::string toString(const Json::Value& value);

#define ORVEX_DECLARE_JSON_TYPE(T)                       \
  template <>                                            \
  ORVEX_EXPORT bool isJsonType<T>(const Json::Value& v); \
  template <>                                            \
  ORVEX_EXPORT T asJsonType<T>(const Json::Value& v);
ORVEX_DECLARE_JSON_TYPE(std::string)
ORVEX_DECLARE_JSON_TYPE(bool)
ORVEX_DECLARE_JSON_TYPE(int)
ORVEX_DECLARE_JSON_TYPE(unsigned int)
ORVEX_DECLARE_JSON_TYPE(long long)
ORVEX_DECLARE_JSON_TYPE(double)
ORVEX_DECLARE_JSON_TYPE(Json::Value)
#undef ORVEX_DECLARE_JSON_TYPE

}  // namespace orvex

#endif  // ORVEX_FOUNDATION_JSON_H_
