#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <utility>

#include "foundation/check.h"
#include "orvex/foundation/lock.h"
#include "orvex/foundation/system_hooks.h"

namespace orvex {
namespace {

constexpr char kLogSource[] = "lock_file";

// About 29 s of waiting on average, 57.6 s at worst: long enough for any
// writer of a state file to finish, short enough never to hang a request.
constexpr int kMaxAttempts = 64;
constexpr unsigned long kSleepStepMicros = 100000;

}  // namespace

LockFile::LockFile(const std::string& path, bool exclusive) : fd_(-1), path_(path) {
  const int operation = (exclusive ? LOCK_EX : LOCK_SH) | LOCK_NB;
  for (int attempt = 1;; ++attempt) {
    if (TryLockOnce(operation)) return;
    // Even the last failed attempt sleeps before giving up.
    SleepMicros(kSleepStepMicros * static_cast<unsigned long>(Random() % 10));
    if (attempt == kMaxAttempts) throw Error(kErrorLockFile, "Exceed max retry");
  }
}

LockFile::LockFile(LockFile&& other) noexcept
    : fd_(std::exchange(other.fd_, -1)), path_(std::move(other.path_)) {}

LockFile& LockFile::operator=(LockFile&& other) noexcept {
  if (this != &other) {
    Release();
    fd_ = std::exchange(other.fd_, -1);
    path_ = std::move(other.path_);
  }
  return *this;
}

LockFile::~LockFile() { Release(); }

// One attempt: true with the lock held; false, file closed, when another
// holder conflicts. The file is opened afresh each time so that a lock file
// removed and recreated meanwhile is the one locked.
bool LockFile::TryLockOnce(int operation) {
  ORVEX_CHECK(0 > (fd_ = open(path_.c_str(), O_RDWR | O_CREAT, 0644)), kErrorLockFile,
              "open failed, reason=" + std::string(std::strerror(errno)));
  if (::flock(fd_, operation) == 0) {
    if (StillNamedByPath()) return true;
    // The file was renamed or removed between open and flock (a queue being
    // rotated into its snapshot): the lock guards a file nobody else will
    // lock through this path. Try again on the file the path names now.
    Release();
    return false;
  }
  const int error = errno;
  ::close(fd_);
  fd_ = -1;
  // EWOULDBLOCK is EAGAIN on Linux: contention. Anything else will not go
  // away by waiting.
  if (error != EINTR && error != EAGAIN) throw Error(kErrorLockFile, std::strerror(error));
  return false;
}

bool LockFile::StillNamedByPath() const {
  struct stat locked;
  struct stat named;
  return ::fstat(fd_, &locked) == 0 && ::stat(path_.c_str(), &named) == 0 &&
         locked.st_dev == named.st_dev && locked.st_ino == named.st_ino;
}

void LockFile::Release() {
  if (fd_ < 0) return;
  ::flock(fd_, LOCK_UN);
  ::close(fd_);
  fd_ = -1;
}

}  // namespace orvex
