// Event line parsing: a scanner for the common shape of a queue line and the
// general JSON parser it defers to for everything else. Both fill the same
// fields; an optional member of the wrong type keeps its initial value.
// Stateless; safe on any thread.
#ifndef ORVEX_SRC_QUEUE_EVENT_PARSER_H_
#define ORVEX_SRC_QUEUE_EVENT_PARSER_H_

#include <json/json.h>

#include <cstdint>
#include <string>

namespace orvex {
namespace fileindex {

struct EventFields {
  uint32_t event = 0;
  bool is_dir = false;
  std::string path;
  std::string path_old;
  Json::Value data;
};

// Parses the lines the daemon and the library write themselves: one flat
// object of strings without control bytes and with only one-letter escapes
// (\" \\ \/ \b \f \n \r \t, not in keys), unsigned 32-bit integer
// literals, true, false and null, with "event" an integer, "path" a string
// and, when present, "is_dir" true or false, "path_old" a string and "data"
// null, none of them repeated. Returns false, leaving out untouched, for any
// other line; ParseEventJson then decides it, so the result never differs
// from what ParseEventJson gives. A NUL byte can never reach a path from
// here (neither raw control bytes nor \u escapes are taken).
bool ParseEventFast(const std::string& line, EventFields& out);

// The general parse: any JSON text. Throws Error 906 (logged first) when the
// line is not JSON or "path" or "path_old" holds a NUL byte ("\u0000"), and
// Error 120 when "event" or "path" is missing or mistyped; out may then be
// partly filled.
void ParseEventJson(const std::string& line, EventFields& out);

}  // namespace fileindex
}  // namespace orvex

#endif  // ORVEX_SRC_QUEUE_EVENT_PARSER_H_
