// Small pieces every extractor shares: the capped UTF-8 text buffer that
// becomes KALOMDTextContent, setters that leave out what a file does not
// provide, date parsing, and an owned file descriptor. One thread at a time
// per object; no shared state.
#ifndef ORVEX_PORTABLE_EXTRACT_EXTRACT_UTIL_H_
#define ORVEX_PORTABLE_EXTRACT_EXTRACT_UTIL_H_

#include <json/json.h>
#include <sys/types.h>

#include <cstddef>
#include <cstdint>
#include <ctime>
#include <string>
#include <string_view>
#include <vector>

namespace orvex {
namespace extract {

// Text of at most max_bytes bytes of valid UTF-8, never cut inside a
// character. Invalid bytes become U+FFFD; control characters other than tab
// and newline, and byte-order marks, are dropped. Once a character does not
// fit the buffer is full and takes nothing more, so readers stop early.
class TextSink {
 public:
  explicit TextSink(size_t max_bytes) : max_bytes_(max_bytes) {}

  // Appends text as it stands (plain text files). A character split across
  // two calls is joined again.
  void Append(std::string_view text);
  // Appends text from markup, where layout is in the elements: runs of white
  // space become one blank, and none is kept at the start of a line.
  void AppendCollapsed(std::string_view text);
  // Ends the current line, unless the text is empty or already ends one.
  void Break();
  void Tab();

  bool full() const { return full_; }
  size_t size() const { return text_.size(); }
  size_t max_bytes() const { return max_bytes_; }
  // The text without trailing white space.
  std::string Take();

 private:
  void AppendChars(std::string_view text, bool collapse);
  void PutChar(uint32_t cp, bool collapse);
  bool PutBytes(const char* bytes, size_t n);

  size_t max_bytes_;
  std::string text_;
  std::string carry_;  // the start of a character split across Append calls
  bool pending_space_ = false;
  bool full_ = false;
};

// Decodes one UTF-8 character at the start of s: returns its length and sets
// *cp, or returns 0 for an invalid sequence and -1 (as size_t max) when s
// ends inside a sequence that is valid so far.
constexpr size_t kIncomplete = static_cast<size_t>(-1);
size_t DecodeUtf8(std::string_view s, uint32_t* cp);

// Trims white space at both ends and collapses inner runs to one blank.
std::string CleanValue(std::string_view value);

// Sets out[name] to the cleaned value unless it is empty.
void SetText(Json::Value& out, const char* name, std::string_view value);
// Sets out[name] to the values joined by ", ", skipping empty ones.
void SetTextList(Json::Value& out, const char* name, const std::vector<std::string>& values);
void SetInt(Json::Value& out, const char* name, int64_t value);
// Sets out[name] only for a positive value: 0 means "unknown" in every
// library we read.
void SetPositiveInt(Json::Value& out, const char* name, int64_t value);

// Seconds since the epoch of an ISO 8601 date ("2024-03-01",
// "2024-03-01T10:20:30Z", "...+01:00", fractions ignored); no zone means UTC.
// Returns false for anything else.
bool ParseIsoDate(std::string_view text, int64_t* seconds);

// Sets *problem (when given) to reason and returns false.
bool Fail(std::string* problem, const std::string& reason);

// An open read-only file descriptor, closed on destruction.
class InputFile {
 public:
  InputFile() = default;
  InputFile(const InputFile&) = delete;
  InputFile& operator=(const InputFile&) = delete;
  ~InputFile();

  // Opens path for reading; on failure returns false with *problem naming
  // the path and the system's reason.
  bool Open(const std::string& path, std::string* problem);
  // Reads up to len bytes, retrying on EINTR; -1 on error.
  ssize_t Read(char* buf, size_t len);
  int fd() const { return fd_; }

 private:
  int fd_ = -1;
};

}  // namespace extract
}  // namespace orvex

#endif  // ORVEX_PORTABLE_EXTRACT_EXTRACT_UTIL_H_
