// JSON text for the extraction service's messages: compact, UTF-8 written as
// itself (escaping every non-ASCII character as \uXXXX would make the
// reader's work grow sixfold). The writer and reader are made once per
// thread: their settings cost more to build than a small message costs to
// write or parse. Safe for concurrent use.
#ifndef ORVEX_PORTABLE_SRC_COMPACT_JSON_H_
#define ORVEX_PORTABLE_SRC_COMPACT_JSON_H_

#include <json/json.h>

#include <string>

namespace orvex {
namespace portable {

std::string CompactJsonText(const Json::Value& value);

// False when [begin, end) is not JSON; value then holds what was read.
bool ParseCompactJson(const char* begin, const char* end, Json::Value& value);
bool ParseCompactJson(const std::string& text, Json::Value& value);

}  // namespace portable
}  // namespace orvex

#endif  // ORVEX_PORTABLE_SRC_COMPACT_JSON_H_
