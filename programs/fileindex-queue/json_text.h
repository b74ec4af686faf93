// JSON text for values whose strings are file-system paths: bytes, not
// necessarily UTF-8. Valid UTF-8 is written as it is; each byte of a sequence
// that is not valid UTF-8 is written as the escape \udcXX (XX its value),
// as Python's "surrogateescape" error handler does, so that a reader gets
// every byte back. Control characters are escaped. The text is always valid
// JSON. Pure functions: safe on any thread.
#ifndef ORVEX_PROGRAMS_FILEINDEX_QUEUE_JSON_TEXT_H_
#define ORVEX_PROGRAMS_FILEINDEX_QUEUE_JSON_TEXT_H_

#include <json/json.h>

#include <string>
#include <string_view>

namespace fileindex_queue {

// Appends value as compact JSON text (members in the value's own order).
void AppendJsonText(const Json::Value& value, std::string& out);

// Appends bytes as one JSON string, quotes included.
void AppendJsonString(std::string_view bytes, std::string& out);

}  // namespace fileindex_queue

#endif  // ORVEX_PROGRAMS_FILEINDEX_QUEUE_JSON_TEXT_H_
