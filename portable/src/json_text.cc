#include "orvex/portable/json_text.h"

#include <unicode/utf8.h>

#include <cstdint>

namespace orvex {
namespace portable {
namespace {

constexpr char kHex[] = "0123456789abcdef";

void AppendEscape(const char* prefix, unsigned char byte, std::string& out) {
  out += prefix;
  out += kHex[byte >> 4];
  out += kHex[byte & 0xF];
}

// The escape of an ASCII character that JSON does not allow as itself.
void AppendAsciiEscape(unsigned char c, std::string& out) {
  switch (c) {
    case '"':
      out += "\\\"";
      return;
    case '\\':
      out += "\\\\";
      return;
    case '\n':
      out += "\\n";
      return;
    case '\t':
      out += "\\t";
      return;
    case '\r':
      out += "\\r";
      return;
    case '\b':
      out += "\\b";
      return;
    case '\f':
      out += "\\f";
      return;
    default:
      AppendEscape("\\u00", c, out);
  }
}

// The length of the UTF-8 sequence at bytes[at]: a well-formed one, or an
// ill-formed one (its maximal subpart), as *well_formed says. Overlong
// forms, encoded surrogates and code points past U+10FFFF are ill-formed.
size_t SequenceAt(std::string_view bytes, size_t at, bool* well_formed) {
  const auto* data = reinterpret_cast<const uint8_t*>(bytes.data());
  const int32_t length = static_cast<int32_t>(bytes.size());
  int32_t i = static_cast<int32_t>(at);
  UChar32 c;
  U8_NEXT(data, i, length, c);
  *well_formed = c >= 0;
  return static_cast<size_t>(i) - at;
}

}  // namespace

void AppendJsonString(std::string_view bytes, std::string& out, NonUtf8Bytes non_utf8) {
  const bool escape_ill_formed = non_utf8 == NonUtf8Bytes::kSurrogateEscape;
  out += '"';
  size_t run = 0;  // the start of the bytes not yet appended
  for (size_t i = 0; i < bytes.size();) {
    const unsigned char c = static_cast<unsigned char>(bytes[i]);
    if (c >= 0x80 && escape_ill_formed) {
      bool well_formed = false;
      const size_t end = i + SequenceAt(bytes, i, &well_formed);
      if (!well_formed) {
        out.append(bytes.data() + run, i - run);
        for (; i < end; ++i) AppendEscape("\\udc", static_cast<unsigned char>(bytes[i]), out);
        run = end;
      }
      i = end;
      continue;
    }
    if (c < 0x20 || c == '"' || c == '\\') {
      out.append(bytes.data() + run, i - run);
      AppendAsciiEscape(c, out);
      run = i + 1;
    }
    ++i;
  }
  out.append(bytes.data() + run, bytes.size() - run);
  out += '"';
}

void AppendJsonText(const Json::Value& value, std::string& out, NonUtf8Bytes non_utf8) {
  switch (value.type()) {
    case Json::nullValue:
      out += "null";
      return;
    case Json::intValue:
      out += std::to_string(value.asLargestInt());
      return;
    case Json::uintValue:
      out += std::to_string(value.asLargestUInt());
      return;
    case Json::realValue:
      out += Json::valueToString(value.asDouble());
      return;
    case Json::booleanValue:
      out += value.asBool() ? "true" : "false";
      return;
    case Json::stringValue: {
      const char* begin = nullptr;
      const char* end = nullptr;
      value.getString(&begin, &end);
      AppendJsonString(std::string_view(begin, static_cast<size_t>(end - begin)), out, non_utf8);
      return;
    }
    case Json::arrayValue: {
      out += '[';
      bool first = true;
      for (const Json::Value& item : value) {  // an index would look each item up
        if (!first) out += ',';
        first = false;
        AppendJsonText(item, out, non_utf8);
      }
      out += ']';
      return;
    }
    case Json::objectValue: {
      out += '{';
      bool first = true;
      for (auto it = value.begin(); it != value.end(); ++it) {
        if (!first) out += ',';
        first = false;
        // Member names are bytes like any string.
        const char* end = nullptr;
        const char* begin = it.memberName(&end);
        AppendJsonString(std::string_view(begin, static_cast<size_t>(end - begin)), out, non_utf8);
        out += ':';
        AppendJsonText(*it, out, non_utf8);
      }
      out += '}';
      return;
    }
  }
}

}  // namespace portable
}  // namespace orvex
