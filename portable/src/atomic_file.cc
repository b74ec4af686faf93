#include "orvex/portable/atomic_file.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>

namespace orvex {
namespace portable {
namespace {

// Closes on scope exit; keeps errno of the failure that matters.
class Fd {
 public:
  explicit Fd(int fd) : fd_(fd) {}
  Fd(const Fd&) = delete;
  Fd& operator=(const Fd&) = delete;
  ~Fd() { Close(); }
  int get() const { return fd_; }
  bool Close() {
    if (fd_ < 0) return true;
    int saved = errno;
    bool ok = ::close(fd_) == 0;
    if (ok) errno = saved;
    fd_ = -1;
    return ok;
  }

 private:
  int fd_;
};

bool WriteAll(int fd, const char* data, size_t size) {
  while (size > 0) {
    ssize_t n = ::write(fd, data, size);
    if (n < 0 && errno == EINTR) continue;
    if (n <= 0) return false;
    data += n;
    size -= static_cast<size_t>(n);
  }
  return true;
}

std::string TempNameFor(const std::string& path) {
  static std::atomic<unsigned> counter{0};
  return path + ".tmp-" + std::to_string(::getpid()) + "-" + std::to_string(counter++);
}

}  // namespace

bool WriteFileAtomic(const std::string& path, const std::string& data, mode_t mode) {
  const std::string tmp = TempNameFor(path);
  Fd fd(::open(tmp.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, mode));
  if (fd.get() < 0) return false;
  bool ok = WriteAll(fd.get(), data.data(), data.size()) && ::fchmod(fd.get(), mode) == 0 &&
            ::fsync(fd.get()) == 0 && fd.Close() && ::rename(tmp.c_str(), path.c_str()) == 0;
  if (!ok) {
    int saved = errno;
    fd.Close();
    ::unlink(tmp.c_str());
    errno = saved;
  }
  return ok;
}

bool ReadWholeFile(const std::string& path, std::string& data) {
  Fd fd(::open(path.c_str(), O_RDONLY | O_CLOEXEC));
  if (fd.get() < 0) return false;
  struct stat st;
  if (::fstat(fd.get(), &st) != 0) return false;
  if (S_ISDIR(st.st_mode)) {
    errno = EISDIR;
    return false;
  }
  data.clear();
  char buf[65536];
  for (;;) {
    ssize_t n = ::read(fd.get(), buf, sizeof(buf));
    if (n < 0 && errno == EINTR) continue;
    if (n < 0) return false;
    if (n == 0) return true;
    data.append(buf, static_cast<size_t>(n));
  }
}

}  // namespace portable
}  // namespace orvex
