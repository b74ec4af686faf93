#include <cstring>

#include "orvex/foundation/lock.h"

namespace orvex {

Mutex::Mutex() {
  std::memset(&mutex_, 0, sizeof(mutex_));
  ::pthread_mutex_init(&mutex_, nullptr);
}

Mutex::~Mutex() { ::pthread_mutex_destroy(&mutex_); }

bool Mutex::Lock() { return ::pthread_mutex_lock(&mutex_) == 0; }

bool Mutex::TryLock() { return ::pthread_mutex_trylock(&mutex_) == 0; }

bool Mutex::Unlock() { return ::pthread_mutex_unlock(&mutex_) == 0; }

LockMutex::LockMutex(Mutex& mutex) : mutex_(mutex) { mutex_.Lock(); }

LockMutex::~LockMutex() { mutex_.Unlock(); }

}  // namespace orvex
