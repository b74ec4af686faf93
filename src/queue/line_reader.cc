#include "queue/line_reader.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

namespace orvex {
namespace fileindex {
namespace {

constexpr size_t kBufferSize = 1 << 20;

}  // namespace

LineReader::LineReader(const std::string& path) {
  fd_ = ::open(path.c_str(), O_RDONLY | O_CLOEXEC);
  if (fd_ < 0) return;
  struct stat st;
  if (::fstat(fd_, &st) != 0 || S_ISDIR(st.st_mode)) {
    int saved = S_ISDIR(st.st_mode) ? EISDIR : errno;
    ::close(fd_);
    fd_ = -1;
    errno = saved;
    return;
  }
  buffer_.reset(new char[kBufferSize]);
  capacity_ = kBufferSize;
}

LineReader::~LineReader() {
  if (fd_ >= 0) ::close(fd_);
}

bool LineReader::Fill() {
  if (begin_ > 0) {  // keep the unread tail at the front
    std::memmove(buffer_.get(), buffer_.get() + begin_, end_ - begin_);
    end_ -= begin_;
    begin_ = 0;
  }
  if (end_ == capacity_) {  // a very long line
    std::unique_ptr<char[]> bigger(new char[2 * capacity_]);
    std::memcpy(bigger.get(), buffer_.get(), end_);
    buffer_ = std::move(bigger);
    capacity_ *= 2;
  }
  for (;;) {
    ssize_t n = ::read(fd_, buffer_.get() + end_, capacity_ - end_);
    if (n < 0 && errno == EINTR) continue;
    if (n <= 0) {
      eof_ = true;
      return false;
    }
    end_ += static_cast<size_t>(n);
    return true;
  }
}

bool LineReader::Next(std::string& line) {
  if (fd_ < 0) return false;
  size_t scanned = 0;  // bytes after begin_ known to hold no newline
  for (;;) {
    const char* start = buffer_.get() + begin_ + scanned;
    const void* newline = std::memchr(start, '\n', end_ - begin_ - scanned);
    if (newline != nullptr) {
      size_t at = static_cast<size_t>(static_cast<const char*>(newline) - buffer_.get());
      line.assign(buffer_.get() + begin_, at - begin_);
      begin_ = at + 1;
      return true;
    }
    scanned = end_ - begin_;
    if (eof_ || !Fill()) break;
  }
  if (begin_ == end_) return false;
  line.assign(buffer_.get() + begin_, end_ - begin_);
  begin_ = end_;
  return true;
}

}  // namespace fileindex
}  // namespace orvex
