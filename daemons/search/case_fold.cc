#include "search/case_fold.h"

#include <unicode/uchar.h>
#include <unicode/unistr.h>

namespace orvex {
namespace search {

std::string FoldCase(const std::string& utf8) {
  // Most names are ASCII, whose full case folding is exactly A-Z to a-z:
  // no conversion to UTF-16 and back.
  bool ascii = true;
  for (const unsigned char c : utf8) ascii &= c < 0x80;
  if (ascii) {
    std::string out = utf8;
    for (char& c : out) {
      if (c >= 'A' && c <= 'Z') c = static_cast<char>(c - 'A' + 'a');
    }
    return out;
  }
  icu::UnicodeString text = icu::UnicodeString::fromUTF8(utf8);
  text.foldCase(U_FOLD_CASE_DEFAULT);
  std::string out;
  text.toUTF8String(out);
  return out;
}

size_t CodePointCount(const std::string& utf8) {
  size_t count = 0;
  for (const unsigned char c : utf8) count += (c & 0xC0) != 0x80;
  return count;
}

}  // namespace search
}  // namespace orvex
