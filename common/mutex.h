#pragma once

#include <pthread.h>

#include "common/export.h"

namespace quivra {

/// A non-recursive mutex for the threads of one process.
class QUIVRA_EXPORT Mutex {
  public:
    Mutex();
    ~Mutex();
    Mutex(const Mutex&) = delete;
    Mutex& operator=(const Mutex&) = delete;

    /// Each returns whether the underlying call succeeded.
    bool Lock();
    bool TryLock();  ///< does not wait
    bool Unlock();   ///< by the thread that holds it

  private:
    pthread_mutex_t mutex_;
};

/// Holds a mutex for a scope. The mutex must outlive it.
class QUIVRA_EXPORT LockMutex {
  public:
    /// Waits for the mutex.
    explicit LockMutex(Mutex& mutex);
    ~LockMutex();
    LockMutex(const LockMutex&) = delete;
    LockMutex& operator=(const LockMutex&) = delete;

  private:
    Mutex& mutex_;
};

}  // namespace quivra
