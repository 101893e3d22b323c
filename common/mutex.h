// A process-local, non-recursive mutex and its scope guard.
#pragma once

#include <pthread.h>

#include "common/export.h"

CORVLUMEX_API_BEGIN

namespace corvlumex {

class Mutex {
 public:
  Mutex();
  ~Mutex();
  Mutex(const Mutex&) = delete;
  Mutex& operator=(const Mutex&) = delete;

  // Each returns true when the underlying pthread call returned 0.
  bool Lock();
  bool TryLock();
  bool Unlock();

 private:
  pthread_mutex_t mutex_;
};

class LockMutex {
 public:
  explicit LockMutex(Mutex& mutex);
  ~LockMutex();
  LockMutex(const LockMutex&) = delete;
  LockMutex& operator=(const LockMutex&) = delete;

 private:
  Mutex& mutex_;
};

}  // namespace corvlumex

CORVLUMEX_API_END
