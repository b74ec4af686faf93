#include "orvex/portable/atomic_file.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>

#include "orvex/portable/file_descriptor.h"

namespace orvex {
namespace portable {
namespace {

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

// rename() would put the new file in place of a symbolic link (leaving what
// it pointed to stale) and fails late, after all the writing, over a
// directory. Both are somebody's mistake to be reported, not papered over.
bool TargetReplaceable(const std::string& path) {
  const int saved = errno;
  struct stat st;
  if (::lstat(path.c_str(), &st) != 0) {
    if (errno != ENOENT) return false;
    errno = saved;  // a missing target is the normal first save
    return true;
  }
  if (S_ISLNK(st.st_mode)) {
    errno = ELOOP;
    return false;
  }
  if (S_ISDIR(st.st_mode)) {
    errno = EISDIR;
    return false;
  }
  return true;
}

}  // namespace

bool WriteFileAtomic(const std::string& path, const std::string& data, mode_t mode) {
  if (!TargetReplaceable(path)) return false;
  const std::string tmp = TempNameFor(path);
  FileDescriptor fd(::open(tmp.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, mode));
  if (!fd) return false;
  const bool ok = WriteAll(fd.get(), data.data(), data.size()) && ::fchmod(fd.get(), mode) == 0 &&
                  ::fsync(fd.get()) == 0 && fd.Close() && ::rename(tmp.c_str(), path.c_str()) == 0;
  if (!ok) {
    fd.reset();  // keeps errno
    const int saved = errno;
    ::unlink(tmp.c_str());
    errno = saved;
  }
  return ok;
}

bool MakeDirectories(const std::string& dir) {
  for (size_t slash = dir.find('/', 1);; slash = dir.find('/', slash + 1)) {
    const std::string part = dir.substr(0, slash);
    if (!part.empty() && ::mkdir(part.c_str(), 0755) != 0 && errno != EEXIST) return false;
    if (slash == std::string::npos) break;
  }
  struct stat st;
  if (::stat(dir.c_str(), &st) != 0) return false;
  if (!S_ISDIR(st.st_mode)) {
    errno = ENOTDIR;
    return false;
  }
  return true;
}

bool ReadWholeFile(const std::string& path, std::string& data) {
  FileDescriptor fd(::open(path.c_str(), O_RDONLY | O_CLOEXEC));
  if (!fd) return false;
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
