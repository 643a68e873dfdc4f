#pragma once

#include <pthread.h>

namespace maruseeker {

/// The system's plain mutex: whoever has it must not lock it once more. Each operation is true when
/// the system's call returned 0.
class Mutex {
 public:
  Mutex();
  ~Mutex();
  Mutex(const Mutex&) = delete;
  Mutex& operator=(const Mutex&) = delete;

  bool Lock();
  bool TryLock();
  bool Unlock();

 private:
  pthread_mutex_t mutex_;
};

/// Holds a mutex for a scope. Failing to unlock ends the process.
class LockMutex {
 public:
  explicit LockMutex(Mutex& mutex);
  ~LockMutex();
  LockMutex(const LockMutex&) = delete;
  LockMutex& operator=(const LockMutex&) = delete;

 private:
  Mutex& mutex_;
};

namespace sdk {

/// The one lock there is. Whoever asks for an account, changes who the process is or calls the
/// platform about a share has it meanwhile. Made on first use.
Mutex& SDKMutex();

}  // namespace sdk
}  // namespace maruseeker
