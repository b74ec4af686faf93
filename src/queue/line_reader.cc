#include "queue/line_reader.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

namespace orvex {
namespace fileindex {
namespace {

constexpr size_t kBufferSize = 1 << 20;

}  // namespace

LineReader::LineReader(const std::string& path, size_t max_line)
    // Opening a FIFO for reading waits for a writer, maybe forever, even when
    // one has already written and gone (a queue piped in through
    // /dev/stdin): open without waiting, then read as usual.
    : fd_(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK)), max_line_(max_line) {
  if (!fd_) return;
  struct stat st;
  const int flags = ::fcntl(fd_.get(), F_GETFL);
  if (flags < 0 || ::fcntl(fd_.get(), F_SETFL, flags & ~O_NONBLOCK) != 0 ||
      ::fstat(fd_.get(), &st) != 0) {
    fd_.reset();  // keeps the failed call's errno
    return;
  }
  if (S_ISDIR(st.st_mode)) {
    fd_.reset();
    errno = EISDIR;
    return;
  }
  capacity_ = kBufferSize;
  buffer_.reset(new char[capacity_]);
}

LineReader::~LineReader() = default;

bool LineReader::Fill() {
  if (begin_ > 0) {  // keep the unread tail at the front
    std::memmove(buffer_.get(), buffer_.get() + begin_, end_ - begin_);
    end_ -= begin_;
    begin_ = 0;
  }
  if (end_ == capacity_) {
    // One unfinished line fills the buffer but is still within the cap:
    // grow, never past what the longest allowed line and its newline need.
    const size_t grown = std::min(2 * capacity_, max_line_) + 1;
    std::unique_ptr<char[]> bigger(new char[grown]);
    std::memcpy(bigger.get(), buffer_.get(), end_);
    buffer_ = std::move(bigger);
    capacity_ = grown;
  }
  for (;;) {
    ssize_t n = ::read(fd_.get(), buffer_.get() + end_, capacity_ - end_);
    if (n < 0 && errno == EINTR) continue;
    if (n <= 0) {
      eof_ = true;
      return false;
    }
    end_ += static_cast<size_t>(n);
    return true;
  }
}

void LineReader::Take(std::string& line, size_t length, bool complete) {
  line.assign(buffer_.get() + begin_, length);
  begin_ += complete ? length + 1 : length;
  last_complete_ = complete;
  last_too_long_ = false;
  last_length_ = length;
}

void LineReader::SkipLongLine(std::string& line) {
  // Called with more than max_line_ bytes of the line buffered, so the head
  // is all there.
  line.assign(buffer_.get() + begin_, std::min(kLongLineHead, max_line_));
  uint64_t length = 0;
  bool complete = false;
  for (;;) {
    const char* from = buffer_.get() + begin_;
    const void* newline = std::memchr(from, '\n', end_ - begin_);
    if (newline != nullptr) {
      const size_t n = static_cast<size_t>(static_cast<const char*>(newline) - from);
      length += n;
      begin_ += n + 1;
      complete = true;
      break;
    }
    length += end_ - begin_;
    begin_ = end_ = 0;  // the buffer is free again: nothing of the line is kept
    if (eof_ || !Fill()) break;
  }
  last_complete_ = complete;
  last_too_long_ = true;
  last_length_ = length;
}

bool LineReader::Next(std::string& line) {
  if (!fd_) return false;
  size_t scanned = 0;  // bytes after begin_ known to hold no newline
  for (;;) {
    const char* from = buffer_.get() + begin_;
    const void* newline = std::memchr(from + scanned, '\n', end_ - begin_ - scanned);
    if (newline != nullptr) {
      const size_t length = static_cast<size_t>(static_cast<const char*>(newline) - from);
      if (length > max_line_) {
        SkipLongLine(line);
      } else {
        Take(line, length, /*complete=*/true);
      }
      return true;
    }
    scanned = end_ - begin_;
    if (scanned > max_line_) {
      SkipLongLine(line);
      return true;
    }
    if (eof_ || !Fill()) break;
  }
  if (begin_ == end_) return false;
  Take(line, end_ - begin_, /*complete=*/false);  // within the cap: checked above
  return true;
}

std::string LongLineHead(const std::string& head) { return head + "..."; }

std::string LongLineReason(const std::string& head, uint64_t length, size_t max_line) {
  // The length comes before the head: a head of NUL bytes would end the
  // text in a log line.
  return "Malformed event_raw of " + std::to_string(length) + " bytes, longer than " +
         std::to_string(max_line) + ": " + LongLineHead(head);
}

}  // namespace fileindex
}  // namespace orvex
