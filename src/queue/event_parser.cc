#include "queue/event_parser.h"

#include <string_view>

namespace orvex {
namespace fileindex {
namespace {

constexpr uint64_t kMaxUInt = 0xFFFFFFFFu;
constexpr size_t kMaxDigits = 10;  // "4294967295"

enum class Kind { kString, kNumber, kTrue, kFalse, kNull };

struct Scalar {
  Kind kind;
  std::string_view text;  // a string's bytes between the quotes
  bool escaped = false;   // text holds backslash escapes
  uint32_t number = 0;
};

// The one-letter escapes and what they stand for; any other escape (\u
// among them) is left to the JSON parser.
char Unescaped(char letter) {
  switch (letter) {
    case '"':
    case '\\':
    case '/':
      return letter;
    case 'b':
      return '\b';
    case 'f':
      return '\f';
    case 'n':
      return '\n';
    case 'r':
      return '\r';
    case 't':
      return '\t';
    default:
      return '\0';
  }
}

// Sets out to a string's text, decoding its escapes when it has any.
void AssignText(std::string& out, std::string_view text, bool escaped) {
  if (!escaped) {
    out.assign(text.data(), text.size());
    return;
  }
  out.clear();
  for (size_t i = 0; i < text.size(); ++i) {
    out.push_back(text[i] == '\\' ? Unescaped(text[++i]) : text[i]);
  }
}

// Reads the accepted subset left to right; every method returns false at the
// first byte outside it, and the caller then leaves the line to the JSON
// parser. Only the bytes the JSON parser itself treats as blanks are skipped:
// anything else (comments included) is outside the subset.
class Scanner {
 public:
  Scanner(const char* begin, const char* end) : at_(begin), end_(end) {}

  void SkipBlanks() {
    while (at_ < end_ && (*at_ == ' ' || *at_ == '\t' || *at_ == '\r' || *at_ == '\n')) ++at_;
  }
  bool AtEnd() const { return at_ == end_; }
  bool Peek(char c) const { return at_ < end_ && *at_ == c; }
  bool Consume(char c) {
    if (!Peek(c)) return false;
    ++at_;
    return true;
  }

  // A string with no control bytes and only one-letter escapes: out is its
  // text as written, escaped whether it holds any.
  bool String(std::string_view& out, bool& escaped) {
    if (!Consume('"')) return false;
    const char* start = at_;
    escaped = false;
    for (; at_ < end_; ++at_) {
      const unsigned char c = static_cast<unsigned char>(*at_);
      if (c == '"') {
        out = std::string_view(start, static_cast<size_t>(at_ - start));
        ++at_;
        return true;
      }
      if (c == '\\') {
        if (end_ - at_ < 2 || Unescaped(at_[1]) == '\0') return false;
        escaped = true;
        ++at_;
      } else if (c < 0x20) {
        return false;
      }
    }
    return false;
  }

  bool Value(Scalar& out) {
    if (at_ == end_) return false;
    const char c = *at_;
    if (c == '"') {
      out.kind = Kind::kString;
      return String(out.text, out.escaped);
    }
    if (c >= '0' && c <= '9') {
      out.kind = Kind::kNumber;
      return Number(out.number);
    }
    if (Word("true")) {
      out.kind = Kind::kTrue;
      return true;
    }
    if (Word("false")) {
      out.kind = Kind::kFalse;
      return true;
    }
    if (Word("null")) {
      out.kind = Kind::kNull;
      return true;
    }
    return false;
  }

 private:
  // Digits only, no leading zero, within 32 bits; the byte after them must
  // end the value (a fraction or exponent is left to the JSON parser).
  bool Number(uint32_t& out) {
    const char* start = at_;
    uint64_t value = 0;
    while (at_ < end_ && *at_ >= '0' && *at_ <= '9') {
      if (static_cast<size_t>(at_ - start) == kMaxDigits) return false;
      value = value * 10 + static_cast<uint64_t>(*at_ - '0');
      ++at_;
    }
    if (value > kMaxUInt || (*start == '0' && at_ - start > 1)) return false;
    if (at_ < end_ && *at_ != ',' && *at_ != '}' && *at_ != ' ' && *at_ != '\t' && *at_ != '\r' &&
        *at_ != '\n') {
      return false;
    }
    out = static_cast<uint32_t>(value);
    return true;
  }

  bool Word(std::string_view word) {
    if (static_cast<size_t>(end_ - at_) < word.size() ||
        std::string_view(at_, word.size()) != word) {
      return false;
    }
    at_ += word.size();
    return true;
  }

  const char* at_;
  const char* end_;
};

// The members the event reads, each at most once.
struct Members {
  bool has_event = false, has_path = false, has_is_dir = false, has_path_old = false,
       has_data = false;
  uint32_t event = 0;
  bool is_dir = false;
  std::string_view path;
  std::string_view path_old;
  bool path_escaped = false, path_old_escaped = false;
};

// Takes one member; false when it is repeated or of other than its usual type.
bool Take(Members& m, std::string_view key, const Scalar& value) {
  auto once = [](bool& seen) {
    if (seen) return false;
    seen = true;
    return true;
  };
  if (key == "event") {
    if (!once(m.has_event) || value.kind != Kind::kNumber) return false;
    m.event = value.number;
  } else if (key == "path") {
    if (!once(m.has_path) || value.kind != Kind::kString) return false;
    m.path = value.text;
    m.path_escaped = value.escaped;
  } else if (key == "is_dir") {
    if (!once(m.has_is_dir) || (value.kind != Kind::kTrue && value.kind != Kind::kFalse)) {
      return false;
    }
    m.is_dir = value.kind == Kind::kTrue;
  } else if (key == "path_old") {
    if (!once(m.has_path_old) || value.kind != Kind::kString) return false;
    m.path_old = value.text;
    m.path_old_escaped = value.escaped;
  } else if (key == "data") {
    if (!once(m.has_data) || value.kind != Kind::kNull) return false;
  }
  return true;
}

bool ScanObject(Scanner& in, Members& m) {
  in.SkipBlanks();
  if (!in.Consume('{')) return false;
  in.SkipBlanks();
  if (in.Peek('}')) return false;  // {} lacks the required members anyway
  for (;;) {
    std::string_view key;
    bool key_escaped = false;
    Scalar value;
    // A key is compared as written: one with escapes goes to the parser.
    if (!in.String(key, key_escaped) || key_escaped) return false;
    in.SkipBlanks();
    if (!in.Consume(':')) return false;
    in.SkipBlanks();
    if (!in.Value(value) || !Take(m, key, value)) return false;
    in.SkipBlanks();
    if (in.Consume('}')) break;
    if (!in.Consume(',')) return false;
    in.SkipBlanks();
  }
  in.SkipBlanks();
  return in.AtEnd();
}

}  // namespace

bool ParseEventFast(const std::string& line, EventFields& out) {
  Scanner in(line.data(), line.data() + line.size());
  Members m;
  if (!ScanObject(in, m) || !m.has_event || !m.has_path) return false;
  out.event = m.event;
  AssignText(out.path, m.path, m.path_escaped);
  if (m.has_is_dir) out.is_dir = m.is_dir;
  if (m.has_path_old) AssignText(out.path_old, m.path_old, m.path_old_escaped);
  if (m.has_data) out.data = Json::Value();
  return true;
}

}  // namespace fileindex
}  // namespace orvex
