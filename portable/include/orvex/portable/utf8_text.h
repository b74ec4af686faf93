// UTF-8 text as people see it: walking its code points, showing any bytes
// safely in a message, and making it valid for readers that reject stray
// bytes. Pure functions: safe for concurrent use.
// Who may include it: the portable platform, the programs and the tests; in
// the library, only the platform layer and the foundation.
#ifndef ORVEX_PORTABLE_UTF8_TEXT_H_
#define ORVEX_PORTABLE_UTF8_TEXT_H_

#include <unicode/utf8.h>

#include <cstddef>
#include <cstdint>
#include <string>

namespace orvex {
namespace portable {

// Calls visit(c, begin, end) for each code point of text: c is the code
// point, or negative for an ill-formed sequence (each maximal ill-formed
// subpart is one call), and [begin, end) its bytes.
template <typename Visit>
void ForEachCodePoint(const std::string& text, Visit visit) {
  const auto* bytes = reinterpret_cast<const uint8_t*>(text.data());
  const int32_t length = static_cast<int32_t>(text.size());
  for (int32_t i = 0; i < length;) {
    const int32_t start = i;
    UChar32 c;
    U8_NEXT(bytes, i, length, c);
    visit(c, static_cast<size_t>(start), static_cast<size_t>(i));
  }
}

// C0 and C1 control characters and DEL.
inline bool IsControlCodePoint(UChar32 c) { return c < 0x20 || (c >= 0x7F && c <= 0x9F); }

// text in double quotes, printable whatever it holds: control characters and
// bytes that are not UTF-8 become \xNN, a backslash "\\". For messages that
// name a share, a path or a key a user typed.
std::string QuoteForDisplay(const std::string& text);

// text with each ill-formed sequence replaced by one U+FFFD (Unicode's
// "maximal subpart" practice); valid text comes back unchanged.
std::string ToValidUtf8(const std::string& text);

}  // namespace portable
}  // namespace orvex

#endif  // ORVEX_PORTABLE_UTF8_TEXT_H_
