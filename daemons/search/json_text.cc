#include "search/json_text.h"

#include <cstdio>

namespace orvex {
namespace search {
namespace {

void AppendQuoted(const char* text, const char* end, std::string& out) {
  static const char kHex[] = "0123456789abcdef";
  out += '"';
  const char* run = text;
  for (const char* p = text; p != end; ++p) {
    const unsigned char c = static_cast<unsigned char>(*p);
    if (c >= 0x20 && c != '"' && c != '\\') continue;
    out.append(run, p);
    run = p + 1;
    switch (c) {
      case '"':
        out += "\\\"";
        break;
      case '\\':
        out += "\\\\";
        break;
      case '\n':
        out += "\\n";
        break;
      case '\t':
        out += "\\t";
        break;
      case '\r':
        out += "\\r";
        break;
      case '\b':
        out += "\\b";
        break;
      case '\f':
        out += "\\f";
        break;
      default: {
        const char escape[] = {'\\', 'u', '0', '0', kHex[c >> 4], kHex[c & 0xF]};
        out.append(escape, sizeof(escape));
      }
    }
  }
  out.append(run, end);
  out += '"';
}

}  // namespace

void AppendJsonText(const Json::Value& value, std::string& out) {
  switch (value.type()) {
    case Json::nullValue:
      out += "null";
      break;
    case Json::intValue:
      out += std::to_string(value.asLargestInt());
      break;
    case Json::uintValue:
      out += std::to_string(value.asLargestUInt());
      break;
    case Json::realValue:
      // jsoncpp's own rendering: 17 significant digits, so the value reads
      // back exactly.
      out += Json::valueToString(value.asDouble());
      break;
    case Json::stringValue: {
      const char* begin = nullptr;
      const char* end = nullptr;
      value.getString(&begin, &end);
      AppendQuoted(begin, end, out);
      break;
    }
    case Json::booleanValue:
      out += value.asBool() ? "true" : "false";
      break;
    case Json::arrayValue: {
      out += '[';
      bool first = true;
      for (const Json::Value& item : value) {
        if (!first) out += ',';
        first = false;
        AppendJsonText(item, out);
      }
      out += ']';
      break;
    }
    case Json::objectValue: {
      out += '{';
      bool first = true;
      for (auto it = value.begin(); it != value.end(); ++it) {
        if (!first) out += ',';
        first = false;
        const char* end = nullptr;
        const char* name = it.memberName(&end);
        AppendQuoted(name, end, out);
        out += ':';
        AppendJsonText(*it, out);
      }
      out += '}';
      break;
    }
  }
}

}  // namespace search
}  // namespace orvex
