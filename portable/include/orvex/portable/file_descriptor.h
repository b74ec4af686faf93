// FileDescriptor: sole owner of one open file descriptor, closed when the
// owner goes away. Move-only, so a descriptor has exactly one owner at any
// time and is closed exactly once on every way out of a scope (return,
// exception). A plain type with no platform call: every layer may use it.
// One thread at a time per object.
#ifndef ORVEX_PORTABLE_FILE_DESCRIPTOR_H_
#define ORVEX_PORTABLE_FILE_DESCRIPTOR_H_

#include <unistd.h>

#include <cerrno>
#include <utility>

namespace orvex {

class FileDescriptor {
 public:
  FileDescriptor() = default;
  // Takes ownership of fd; a negative fd means "none".
  explicit FileDescriptor(int fd) : fd_(fd) {}
  FileDescriptor(const FileDescriptor&) = delete;
  FileDescriptor& operator=(const FileDescriptor&) = delete;
  FileDescriptor(FileDescriptor&& other) noexcept : fd_(other.release()) {}
  FileDescriptor& operator=(FileDescriptor&& other) noexcept {
    if (this != &other) reset(other.release());
    return *this;
  }
  ~FileDescriptor() { reset(); }

  int get() const { return fd_; }
  bool valid() const { return fd_ >= 0; }
  explicit operator bool() const { return valid(); }

  // Gives the descriptor up without closing it.
  int release() { return std::exchange(fd_, -1); }

  // Closes the descriptor held (if any) and takes fd. errno is kept: callers
  // often close on an error path and then report that error's errno.
  void reset(int fd = -1) {
    if (fd_ >= 0) {
      const int saved = errno;
      ::close(fd_);
      errno = saved;
    }
    fd_ = fd;
  }

  // Closes now and reports whether close succeeded (errno set when not): for
  // writers, whose data is only safe once close has said so.
  bool Close() {
    if (fd_ < 0) return true;
    return ::close(std::exchange(fd_, -1)) == 0;
  }

 private:
  int fd_ = -1;
};

}  // namespace orvex

#endif  // ORVEX_PORTABLE_FILE_DESCRIPTOR_H_
