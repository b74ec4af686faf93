#include "extract_util.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

namespace orvex {
namespace extract {
namespace {

// A property value longer than this is cut: a title or an author is never
// that long, and a hostile tag must not bloat every document.
constexpr size_t kMaxValueBytes = 16 * 1024;

bool IsSpace(uint32_t cp) {
  return cp == ' ' || cp == '\t' || cp == '\n' || cp == '\r' || cp == '\f' || cp == '\v' ||
         cp == 0xA0 || cp == 0x2028 || cp == 0x2029;
}

bool IsDropped(uint32_t cp) {
  if (cp == 0xFEFF) return true;  // byte-order mark, or a zero-width no-break space
  if (cp < 0x20) return cp != '\t' && cp != '\n';
  return cp == 0x7F || (cp >= 0x80 && cp < 0xA0);
}

size_t EncodeUtf8(uint32_t cp, char* out) {
  if (cp < 0x80) {
    out[0] = static_cast<char>(cp);
    return 1;
  }
  if (cp < 0x800) {
    out[0] = static_cast<char>(0xC0 | (cp >> 6));
    out[1] = static_cast<char>(0x80 | (cp & 0x3F));
    return 2;
  }
  if (cp < 0x10000) {
    out[0] = static_cast<char>(0xE0 | (cp >> 12));
    out[1] = static_cast<char>(0x80 | ((cp >> 6) & 0x3F));
    out[2] = static_cast<char>(0x80 | (cp & 0x3F));
    return 3;
  }
  out[0] = static_cast<char>(0xF0 | (cp >> 18));
  out[1] = static_cast<char>(0x80 | ((cp >> 12) & 0x3F));
  out[2] = static_cast<char>(0x80 | ((cp >> 6) & 0x3F));
  out[3] = static_cast<char>(0x80 | (cp & 0x3F));
  return 4;
}

// Reads exactly n decimal digits at *pos.
bool Digits(std::string_view s, size_t* pos, size_t n, int* value) {
  if (*pos + n > s.size()) return false;
  int v = 0;
  for (size_t i = 0; i < n; ++i) {
    const char c = s[*pos + i];
    if (c < '0' || c > '9') return false;
    v = v * 10 + (c - '0');
  }
  *pos += n;
  *value = v;
  return true;
}

bool Skip(std::string_view s, size_t* pos, char c) {
  if (*pos < s.size() && s[*pos] == c) {
    ++*pos;
    return true;
  }
  return false;
}

// The zone suffix at *pos: "Z", "+HH:MM", "+HHMM", "-HH" or nothing.
bool ParseZone(std::string_view s, size_t* pos, int* offset_seconds) {
  *offset_seconds = 0;
  if (*pos == s.size() || Skip(s, pos, 'Z')) return *pos == s.size();
  const char sign = s[*pos];
  if (sign != '+' && sign != '-') return false;
  ++*pos;
  int hours = 0, minutes = 0;
  if (!Digits(s, pos, 2, &hours)) return false;
  Skip(s, pos, ':');
  if (*pos < s.size() && !Digits(s, pos, 2, &minutes)) return false;
  if (*pos != s.size() || hours > 23 || minutes > 59) return false;
  *offset_seconds = (sign == '+' ? 1 : -1) * (hours * 3600 + minutes * 60);
  return true;
}

// The length of the run at the start of text that needs no decoding or
// filtering: printable ASCII, tabs and newlines.
size_t PlainAsciiRun(std::string_view text) {
  size_t n = 0;
  while (n < text.size()) {
    const unsigned char c = static_cast<unsigned char>(text[n]);
    if ((c < 0x20 && c != '\t' && c != '\n') || c >= 0x7F) break;
    ++n;
  }
  return n;
}

}  // namespace

size_t DecodeUtf8(std::string_view s, uint32_t* cp) {
  const auto byte = [&](size_t i) { return static_cast<unsigned char>(s[i]); };
  const unsigned char b0 = byte(0);
  if (b0 < 0x80) {
    *cp = b0;
    return 1;
  }
  size_t len;
  uint32_t value, min;
  if (b0 >= 0xC2 && b0 <= 0xDF) {
    len = 2, value = b0 & 0x1F, min = 0x80;
  } else if (b0 >= 0xE0 && b0 <= 0xEF) {
    len = 3, value = b0 & 0x0F, min = 0x800;
  } else if (b0 >= 0xF0 && b0 <= 0xF4) {
    len = 4, value = b0 & 0x07, min = 0x10000;
  } else {
    return 0;
  }
  for (size_t i = 1; i < len; ++i) {
    if (i == s.size()) return kIncomplete;
    if ((byte(i) & 0xC0) != 0x80) return 0;
    value = (value << 6) | (byte(i) & 0x3F);
    // Reject overlong forms, surrogates and values past U+10FFFF as soon as
    // the second byte shows them, so that a split sequence is judged alike.
    if (i == 1 && len >= 3) {
      const uint32_t top = value << (6 * (len - 2));
      if (top < min || (top >= 0xD800 && top <= 0xDFFF) || top > 0x10FFFF) return 0;
    }
  }
  if (value < min) return 0;
  *cp = value;
  return len;
}

void TextSink::Append(std::string_view text) {
  if (full_) return;
  if (carry_.empty()) {
    AppendChars(text, /*collapse=*/false);
    return;
  }
  std::string joined = std::move(carry_);
  carry_.clear();
  joined.append(text.data(), text.size());
  AppendChars(joined, /*collapse=*/false);
}

void TextSink::AppendCollapsed(std::string_view text) {
  if (!carry_.empty()) {
    carry_.clear();
    PutChar(0xFFFD, /*collapse=*/true);
  }
  AppendChars(text, /*collapse=*/true);
}

void TextSink::AppendChars(std::string_view text, bool collapse) {
  size_t pos = 0;
  while (pos < text.size() && !full_) {
    if (!collapse && !pending_space_) {
      // Most text is ASCII: copy such runs whole, as far as the cap allows.
      const size_t run = std::min(PlainAsciiRun(text.substr(pos)), max_bytes_ - text_.size());
      text_.append(text.data() + pos, run);
      pos += run;
      if (pos == text.size()) return;
    }
    uint32_t cp = 0;
    const size_t n = DecodeUtf8(text.substr(pos), &cp);
    if (n == kIncomplete) {
      if (collapse) {
        PutChar(0xFFFD, collapse);
      } else {
        carry_.assign(text.substr(pos));
      }
      return;
    }
    if (n == 0) {
      PutChar(0xFFFD, collapse);
      ++pos;
      continue;
    }
    PutChar(cp, collapse);
    pos += n;
  }
}

void TextSink::PutChar(uint32_t cp, bool collapse) {
  if (collapse && IsSpace(cp)) {
    if (!text_.empty() && text_.back() != '\n' && text_.back() != '\t') pending_space_ = true;
    return;
  }
  if (cp == '\r' || IsDropped(cp)) return;
  if (pending_space_) {
    pending_space_ = false;
    if (!PutBytes(" ", 1)) return;
  }
  char bytes[4];
  PutBytes(bytes, EncodeUtf8(cp, bytes));
}

bool TextSink::PutBytes(const char* bytes, size_t n) {
  if (full_) return false;
  if (text_.size() + n > max_bytes_) {
    full_ = true;
    return false;
  }
  text_.append(bytes, n);
  return true;
}

void TextSink::Break() {
  pending_space_ = false;
  if (text_.empty() || text_.back() == '\n') return;
  while (!text_.empty() && (text_.back() == ' ' || text_.back() == '\t')) text_.pop_back();
  PutBytes("\n", 1);
}

void TextSink::Tab() {
  pending_space_ = false;
  PutBytes("\t", 1);
}

std::string TextSink::Take() {
  if (!carry_.empty()) {
    carry_.clear();
    PutChar(0xFFFD, /*collapse=*/false);
  }
  while (!text_.empty() && (text_.back() == ' ' || text_.back() == '\n' || text_.back() == '\t')) {
    text_.pop_back();
  }
  std::string text = std::move(text_);
  text_.clear();
  return text;
}

std::string CleanValue(std::string_view value) {
  TextSink sink(kMaxValueBytes);
  sink.AppendCollapsed(value);
  return sink.Take();
}

void SetText(Json::Value& out, const char* name, std::string_view value) {
  std::string clean = CleanValue(value);
  if (!clean.empty()) out[name] = std::move(clean);
}

void SetTextList(Json::Value& out, const char* name, const std::vector<std::string>& values) {
  std::string joined;
  for (const std::string& value : values) {
    const std::string clean = CleanValue(value);
    if (clean.empty() || joined.size() + clean.size() > kMaxValueBytes) continue;
    if (!joined.empty()) joined += ", ";
    joined += clean;
  }
  if (!joined.empty()) out[name] = joined;
}

void SetInt(Json::Value& out, const char* name, int64_t value) {
  out[name] = static_cast<Json::Int64>(value);
}

void SetPositiveInt(Json::Value& out, const char* name, int64_t value) {
  if (value > 0) SetInt(out, name, value);
}

bool ParseIsoDate(std::string_view text, int64_t* seconds) {
  const std::string clean = CleanValue(text);
  std::string_view s = clean;
  size_t pos = 0;
  struct tm tm = {};
  int year = 0, month = 1, day = 1, hour = 0, minute = 0, second = 0;
  if (!Digits(s, &pos, 4, &year)) return false;
  if (Skip(s, &pos, '-')) {
    if (!Digits(s, &pos, 2, &month)) return false;
    if (Skip(s, &pos, '-') && !Digits(s, &pos, 2, &day)) return false;
  }
  if (Skip(s, &pos, 'T') || Skip(s, &pos, ' ')) {
    if (!Digits(s, &pos, 2, &hour) || !Skip(s, &pos, ':') || !Digits(s, &pos, 2, &minute)) {
      return false;
    }
    if (Skip(s, &pos, ':') && !Digits(s, &pos, 2, &second)) return false;
    if (Skip(s, &pos, '.') || Skip(s, &pos, ',')) {
      while (pos < s.size() && s[pos] >= '0' && s[pos] <= '9') ++pos;
    }
  }
  int offset = 0;
  if (!ParseZone(s, &pos, &offset)) return false;
  if (month < 1 || month > 12 || day < 1 || day > 31 || hour > 23 || minute > 59 || second > 60) {
    return false;
  }
  tm.tm_year = year - 1900;
  tm.tm_mon = month - 1;
  tm.tm_mday = day;
  tm.tm_hour = hour;
  tm.tm_min = minute;
  tm.tm_sec = second;
  *seconds = static_cast<int64_t>(::timegm(&tm)) - offset;
  return true;
}

bool Fail(std::string* problem, const std::string& reason) {
  if (problem != nullptr) *problem = reason;
  return false;
}

InputFile::~InputFile() {
  if (fd_ >= 0) ::close(fd_);
}

bool InputFile::Open(const std::string& path, std::string* problem) {
  fd_ = ::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NOCTTY);
  if (fd_ < 0) return Fail(problem, "open " + path + ": " + std::strerror(errno));
  return true;
}

ssize_t InputFile::Read(char* buf, size_t len) {
  for (;;) {
    const ssize_t n = ::read(fd_, buf, len);
    if (n >= 0 || errno != EINTR) return n;
  }
}

}  // namespace extract
}  // namespace orvex
