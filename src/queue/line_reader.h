// LineReader: reads a queue file line by line through one fixed buffer, the
// way std::getline splits text (a last line without its newline still counts;
// no empty line after a final newline), and says of each line whether its
// newline was there. Memory stays bounded whatever the file holds: a line
// longer than the cap is not kept whole but reported as too long with its
// first bytes and its length, and reading goes on after its newline. One
// thread at a time.
#ifndef ORVEX_SRC_QUEUE_LINE_READER_H_
#define ORVEX_SRC_QUEUE_LINE_READER_H_

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>

#include "orvex/portable/file_descriptor.h"

namespace orvex {
namespace fileindex {

class LineReader {
 public:
  // No event line comes near this; anything longer is garbage that must not
  // take the daemon's memory with it.
  static constexpr size_t kDefaultMaxLine = 1 << 20;
  // What is kept of a line over the cap: enough to recognise it in a log.
  static constexpr size_t kLongLineHead = 200;

  // Opens path for reading. On failure (including a directory, as EISDIR)
  // ok() is false and errno tells why. Lines longer than max_line bytes
  // (newline excluded) are reported as too long.
  explicit LineReader(const std::string& path, size_t max_line = kDefaultMaxLine);
  LineReader(const LineReader&) = delete;
  LineReader& operator=(const LineReader&) = delete;
  ~LineReader();

  bool ok() const { return fd_.valid(); }

  // The next line without its newline; false at the end of the file or on a
  // read error (the lines before it were all returned). A line longer than
  // the cap comes back as its first kLongLineHead bytes (fewer when the cap
  // is smaller), with last_line_too_long() set.
  bool Next(std::string& line);

  // About the line Next returned last. Complete: it ended with its newline
  // (only the last line of a file may not). Too long: it was longer than the
  // cap and only its head was returned. Length: its full length in the
  // file, newline excluded.
  bool last_line_complete() const { return last_complete_; }
  bool last_line_too_long() const { return last_too_long_; }
  uint64_t last_line_length() const { return last_length_; }
  size_t max_line() const { return max_line_; }

 private:
  bool Fill();
  // Returns buffered text [begin_, begin_ + length) as the next line and
  // moves past it and its newline when it has one.
  void Take(std::string& line, size_t length, bool complete);
  // The current line has outgrown the cap: keeps its head, drops the rest up
  // to its newline (or the end of the file) without storing it.
  void SkipLongLine(std::string& line);

  FileDescriptor fd_;
  const size_t max_line_;
  // Not zero-filled: only bytes read from the file are ever looked at.
  std::unique_ptr<char[]> buffer_;
  size_t capacity_ = 0;  // always more than max_line_: a whole line fits
  size_t begin_ = 0;     // first unread byte in buffer_
  size_t end_ = 0;       // one past the last valid byte
  bool eof_ = false;
  bool last_complete_ = false;
  bool last_too_long_ = false;
  uint64_t last_length_ = 0;
};

// An over-long line as logs and errors show it: its head, then "...".
std::string LongLineHead(const std::string& head);

// The reason of the malformed-event error an over-long line gets, naming
// its length and the cap, then its head.
std::string LongLineReason(const std::string& head, uint64_t length, size_t max_line);

}  // namespace fileindex
}  // namespace orvex

#endif  // ORVEX_SRC_QUEUE_LINE_READER_H_
