// LineReader: reads a queue file line by line through one fixed buffer, the
// way std::getline splits text (a last line without its newline still counts;
// no empty line after a final newline). A line of any length is returned
// whole; memory is the buffer plus the longest line. One thread at a time.
#ifndef ORVEX_SRC_QUEUE_LINE_READER_H_
#define ORVEX_SRC_QUEUE_LINE_READER_H_

#include <cstddef>
#include <memory>
#include <string>

namespace orvex {
namespace fileindex {

class LineReader {
 public:
  // Opens path for reading. On failure (including a directory, as EISDIR)
  // ok() is false and errno tells why.
  explicit LineReader(const std::string& path);
  LineReader(const LineReader&) = delete;
  LineReader& operator=(const LineReader&) = delete;
  ~LineReader();

  bool ok() const { return fd_ >= 0; }

  // The next line without its newline; false at the end of the file or on a
  // read error (the lines before it were all returned).
  bool Next(std::string& line);

 private:
  bool Fill();

  int fd_ = -1;
  // Not zero-filled: only bytes read from the file are ever looked at.
  std::unique_ptr<char[]> buffer_;
  size_t capacity_ = 0;
  size_t begin_ = 0;  // first unread byte in buffer_
  size_t end_ = 0;    // one past the last valid byte
  bool eof_ = false;
};

}  // namespace fileindex
}  // namespace orvex

#endif  // ORVEX_SRC_QUEUE_LINE_READER_H_
