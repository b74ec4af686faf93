#include "orvex/portable/utf8_text.h"

#include <cstdio>

namespace orvex {
namespace portable {

std::string QuoteForDisplay(const std::string& text) {
  std::string out = "\"";
  ForEachCodePoint(text, [&](UChar32 c, size_t begin, size_t end) {
    if (c < 0 || IsControlCodePoint(c)) {
      for (size_t i = begin; i < end; ++i) {
        char hex[8];
        std::snprintf(hex, sizeof(hex), "\\x%02X", static_cast<unsigned char>(text[i]));
        out += hex;
      }
    } else if (c == '\\') {
      out += "\\\\";
    } else {
      out.append(text, begin, end - begin);
    }
  });
  return out + "\"";
}

std::string ToValidUtf8(const std::string& text) {
  static const char kReplacement[] = "\xEF\xBF\xBD";
  std::string out;
  out.reserve(text.size());
  ForEachCodePoint(text, [&](UChar32 c, size_t begin, size_t end) {
    if (c < 0) {
      out += kReplacement;
    } else {
      out.append(text, begin, end - begin);
    }
  });
  return out;
}

}  // namespace portable
}  // namespace orvex
