// Compact JSON text of a Json::Value, written straight into a string: the
// daemon writes one for every document it stores and every answer it gives,
// and jsoncpp's stream writer costs a stream and a virtual call per value.
// The text parses back to an equal value (strings as UTF-8, as received).
// Safe for concurrent use.
#ifndef ORVEX_SEARCH_JSON_TEXT_H_
#define ORVEX_SEARCH_JSON_TEXT_H_

#include <json/json.h>

#include <string>

namespace orvex {
namespace search {

// Appends the text of value to out.
void AppendJsonText(const Json::Value& value, std::string& out);

inline std::string JsonText(const Json::Value& value) {
  std::string out;
  AppendJsonText(value, out);
  return out;
}

}  // namespace search
}  // namespace orvex

#endif  // ORVEX_SEARCH_JSON_TEXT_H_
