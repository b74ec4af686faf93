// Compact JSON text of a Json::Value, written straight into a string: the
// search daemon writes one for every document it stores and every answer it
// gives, and jsoncpp's stream writer costs a stream and a virtual call per
// value. Members come in the value's own order; quotes, backslashes and
// control characters are escaped, other characters written as themselves.
// Strings are bytes: how those that are not UTF-8 are written is the
// caller's choice. Pure functions: safe for concurrent use.
// Who may include it: the portable platform, the daemons, the programs and
// the tests.
#ifndef ORVEX_PORTABLE_JSON_TEXT_H_
#define ORVEX_PORTABLE_JSON_TEXT_H_

#include <json/json.h>

#include <string>
#include <string_view>

namespace orvex {
namespace portable {

// How a string's bytes that are not UTF-8 are written.
enum class NonUtf8Bytes {
  // As they are: the text parses back to an equal value with jsoncpp, which
  // takes strings as bytes, but a strict reader may refuse it.
  kAsIs,
  // Each byte of an ill-formed sequence as the escape \udcXX (XX its value),
  // as Python's "surrogateescape" error handler does: the text is valid JSON
  // for any reader, and a reader that knows the convention gets every byte
  // back. For file-system paths, which are bytes, not necessarily UTF-8.
  kSurrogateEscape,
};

// Appends bytes as one JSON string, quotes included.
void AppendJsonString(std::string_view bytes, std::string& out,
                      NonUtf8Bytes non_utf8 = NonUtf8Bytes::kAsIs);

// Appends the text of value to out. Numbers read back exactly (reals with 17
// significant digits, as jsoncpp writes them).
void AppendJsonText(const Json::Value& value, std::string& out,
                    NonUtf8Bytes non_utf8 = NonUtf8Bytes::kAsIs);

inline std::string JsonText(const Json::Value& value, NonUtf8Bytes non_utf8 = NonUtf8Bytes::kAsIs) {
  std::string out;
  AppendJsonText(value, out, non_utf8);
  return out;
}

}  // namespace portable
}  // namespace orvex

#endif  // ORVEX_PORTABLE_JSON_TEXT_H_
