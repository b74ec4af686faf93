#include "terminal_text.h"

#include <unicode/uchar.h>

#include <algorithm>
#include <cctype>
#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <ctime>

#include "orvex/portable/utf8_text.h"

namespace orvex_cli {
namespace {

// Hangul vowel and final jamo join the syllable before them on screen.
bool IsConjoiningJamo(UChar32 c) {
  const int type = u_getIntPropertyValue(c, UCHAR_HANGUL_SYLLABLE_TYPE);
  return type == U_HST_VOWEL_JAMO || type == U_HST_TRAILING_JAMO;
}

size_t CodePointWidth(UChar32 c) {
  if (c < 0) return 1;
  if (orvex::portable::IsControlCodePoint(c) || IsConjoiningJamo(c)) return 0;
  const int8_t category = u_charType(c);
  if (category == U_NON_SPACING_MARK || category == U_ENCLOSING_MARK || category == U_FORMAT_CHAR) {
    return 0;
  }
  const int width = u_getIntPropertyValue(c, UCHAR_EAST_ASIAN_WIDTH);
  return width == U_EA_WIDE || width == U_EA_FULLWIDTH ? 2 : 1;
}

}  // namespace

std::string Quote(const std::string& text) { return orvex::portable::QuoteForDisplay(text); }

size_t DisplayWidth(const std::string& text) {
  size_t width = 0;
  orvex::portable::ForEachCodePoint(
      text, [&width](UChar32 c, size_t, size_t) { width += CodePointWidth(c); });
  return width;
}

std::string PadToWidth(const std::string& text, size_t width) {
  const size_t columns = DisplayWidth(text);
  return columns >= width ? text : text + std::string(width - columns, ' ');
}

std::string FormatTable(const std::vector<std::vector<std::string>>& rows) {
  std::vector<size_t> widths;
  for (const auto& row : rows) {
    if (widths.size() < row.size()) widths.resize(row.size(), 0);
    for (size_t i = 0; i < row.size(); ++i) widths[i] = std::max(widths[i], DisplayWidth(row[i]));
  }
  std::string out;
  for (const auto& row : rows) {
    for (size_t i = 0; i < row.size(); ++i) {
      out += i + 1 == row.size() ? row[i] : PadToWidth(row[i], widths[i]) + "  ";
    }
    out += "\n";
  }
  return out;
}

std::string LocalTime(int64_t seconds) {
  const time_t t = static_cast<time_t>(seconds);
  struct tm local;
  char text[64];
  if (::localtime_r(&t, &local) == nullptr ||
      std::strftime(text, sizeof(text), "%Y-%m-%d %H:%M:%S %Z", &local) == 0) {
    return std::to_string(seconds);
  }
  return text;
}

std::string Cause(int err) {
  std::string text = std::strerror(err);
  if (!text.empty()) text[0] = static_cast<char>(std::tolower(static_cast<unsigned char>(text[0])));
  return text;
}

std::string NextStep(int err) {
  switch (err) {
    case EACCES:
    case EPERM:
      return "run orvex as root, or point ORVEX_ROOT at a directory of your own";
    case ENOSPC:
    case EDQUOT:
      return "free some space on that file system and try again";
    case EROFS:
      return "remount that file system read-write and try again";
    case ELOOP:
      return "put the file itself in place of the link (every save replaces the file whole "
             "and would cut the link)";
    case EISDIR:
      return "move the directory out of the way";
    default:
      return "";
  }
}

}  // namespace orvex_cli
