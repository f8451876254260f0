// A plain process-local mutex and its scoped guard.
#pragma once

#include <pthread.h>

namespace vellis {

// A default (non-recursive, non-error-checking) POSIX mutex. Not copyable.
class Mutex {
 public:
  Mutex();
  ~Mutex();
  Mutex(const Mutex&) = delete;
  Mutex& operator=(const Mutex&) = delete;

  // Each returns true when the underlying call returned 0. Never throw.
  bool Lock();
  bool TryLock();
  bool Unlock();

 private:
  pthread_mutex_t mutex_;
};

// Holds a Mutex from construction to destruction.
class LockMutex {
 public:
  explicit LockMutex(Mutex& mutex);
  ~LockMutex();
  LockMutex(const LockMutex&) = delete;
  LockMutex& operator=(const LockMutex&) = delete;

 private:
  Mutex& mutex_;
};

}  // namespace vellis
