#include "json_text.h"

#include <cstdint>

#include "orvex/foundation/json.h"

namespace fileindex_queue {
namespace {

bool Between(unsigned char c, unsigned char low, unsigned char high) {
  return c >= low && c <= high;
}

// The length of the well-formed UTF-8 sequence at the start of s, or 0 when
// none starts there. Overlong forms, encoded surrogates and code points past
// U+10FFFF are not well-formed.
size_t Utf8Length(std::string_view s) {
  const auto at = [&s](size_t i) { return static_cast<unsigned char>(s[i]); };
  const unsigned char lead = at(0);
  if (lead < 0x80) return 1;
  size_t length = 0;
  unsigned char low = 0x80;  // the range of the second byte
  unsigned char high = 0xBF;
  if (Between(lead, 0xC2, 0xDF)) {
    length = 2;
  } else if (Between(lead, 0xE0, 0xEF)) {
    length = 3;
    if (lead == 0xE0) low = 0xA0;
    if (lead == 0xED) high = 0x9F;
  } else if (Between(lead, 0xF0, 0xF4)) {
    length = 4;
    if (lead == 0xF0) low = 0x90;
    if (lead == 0xF4) high = 0x8F;
  } else {
    return 0;
  }
  if (s.size() < length || !Between(at(1), low, high)) return 0;
  for (size_t i = 2; i < length; ++i) {
    if (!Between(at(i), 0x80, 0xBF)) return 0;
  }
  return length;
}

void AppendEscape(const char* prefix, unsigned char byte, std::string& out) {
  static const char kHex[] = "0123456789abcdef";
  out += prefix;
  out += kHex[byte >> 4];
  out += kHex[byte & 0xF];
}

}  // namespace

void AppendJsonString(std::string_view bytes, std::string& out) {
  out += '"';
  size_t i = 0;
  while (i < bytes.size()) {
    const unsigned char c = static_cast<unsigned char>(bytes[i]);
    if (c >= 0x80) {
      const size_t length = Utf8Length(bytes.substr(i));
      if (length == 0) {
        AppendEscape("\\udc", c, out);
        ++i;
      } else {
        out.append(bytes.data() + i, length);
        i += length;
      }
      continue;
    }
    switch (c) {
      case '"':
        out += "\\\"";
        break;
      case '\\':
        out += "\\\\";
        break;
      case '\b':
        out += "\\b";
        break;
      case '\f':
        out += "\\f";
        break;
      case '\n':
        out += "\\n";
        break;
      case '\r':
        out += "\\r";
        break;
      case '\t':
        out += "\\t";
        break;
      default:
        if (c < 0x20) {
          AppendEscape("\\u00", c, out);
        } else {
          out += static_cast<char>(c);
        }
    }
    ++i;
  }
  out += '"';
}

void AppendJsonText(const Json::Value& value, std::string& out) {
  switch (value.type()) {
    case Json::stringValue: {
      const char* begin = nullptr;
      const char* end = nullptr;
      value.getString(&begin, &end);
      AppendJsonString(std::string_view(begin, static_cast<size_t>(end - begin)), out);
      return;
    }
    case Json::arrayValue: {
      out += '[';
      for (Json::ArrayIndex i = 0; i < value.size(); ++i) {
        if (i > 0) out += ',';
        AppendJsonText(value[i], out);
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
        // Member names come from queue lines too: bytes like any string.
        const char* end = nullptr;
        const char* begin = it.memberName(&end);
        AppendJsonString(std::string_view(begin, static_cast<size_t>(end - begin)), out);
        out += ':';
        AppendJsonText(*it, out);
      }
      out += '}';
      return;
    }
    default:
      // Numbers, booleans and null are plain ASCII.
      out += orvex::toString(value);
  }
}

}  // namespace fileindex_queue
