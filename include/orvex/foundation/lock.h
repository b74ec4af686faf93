// Locks: Mutex, an in-process mutex; LockMutex, a scoped holder of one; and
// LockFile, a cross-process advisory lock on a file taken with bounded,
// randomised retry. A Mutex is safe for concurrent use (that is its purpose);
// a LockMutex or LockFile object belongs to one thread at a time.
#ifndef ORVEX_FOUNDATION_LOCK_H_
#define ORVEX_FOUNDATION_LOCK_H_

#include <pthread.h>

#include <string>

#include "orvex/export.h"

namespace orvex {

// A default pthread mutex (not recursive: locking it twice from one thread
// deadlocks, and TryLock by the holder fails).
class ORVEX_EXPORT Mutex {
 public:
  Mutex();
  Mutex(const Mutex&) = delete;
  Mutex& operator=(const Mutex&) = delete;
  // The mutex must not be held.
  ~Mutex();

  // Each returns true when the pthread call succeeded. Never throws.
  bool Lock();
  bool TryLock();
  bool Unlock();

 private:
  pthread_mutex_t mutex_;
};

// Holds a Mutex for its own lifetime; the mutex must outlive it. The result of
// the lock is not checked.
class ORVEX_EXPORT LockMutex {
 public:
  explicit LockMutex(Mutex& mutex);
  LockMutex(const LockMutex&) = delete;
  LockMutex& operator=(const LockMutex&) = delete;
  ~LockMutex();

 private:
  Mutex& mutex_;
};

// An flock lock on a file, held for the object's lifetime. flock locks belong
// to the open file description, so two LockFiles on one path exclude each
// other within a process as they do between processes. Move-only.
class ORVEX_EXPORT LockFile {
 public:
  // Opens path (created with mode 0644 if missing; used as given, so callers
  // apply RootPath to fixed lock paths) and takes an exclusive or shared lock
  // without blocking. While another holder conflicts, it closes the file,
  // sleeps 0 to 0.9 s at random and tries again, 64 attempts in all. A lock
  // won on a file that was renamed away meanwhile (a queue rotated into its
  // snapshot) counts as a failed attempt: the lock held is always on the file
  // the path names. Returns only with the lock held. Throws Error 506: "Exceed max retry" after the
  // 64th failed attempt; "open failed, reason=<text>" (logged) when the file
  // cannot be opened; the system error text when flock fails otherwise.
  LockFile(const std::string& path, bool exclusive);
  LockFile(LockFile&& other) noexcept;
  LockFile& operator=(LockFile&& other) noexcept;
  LockFile(const LockFile&) = delete;
  LockFile& operator=(const LockFile&) = delete;
  // Unlocks and closes. The lock file itself stays in place.
  ~LockFile();

  const std::string& path() const { return path_; }

 private:
  bool TryLockOnce(int operation);
  // True while the open file is still the one the path names.
  bool StillNamedByPath() const;
  void Release();

  int fd_;
  std::string path_;
};

}  // namespace orvex

#endif  // ORVEX_FOUNDATION_LOCK_H_
