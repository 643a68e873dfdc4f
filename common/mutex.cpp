#include "common/mutex.h"

#include <exception>

namespace maruseeker {

Mutex::Mutex() {
  pthread_mutex_init(&mutex_, nullptr);
}
Mutex::~Mutex() {
  pthread_mutex_destroy(&mutex_);
}

bool Mutex::Lock() {
  return pthread_mutex_lock(&mutex_) == 0;
}
bool Mutex::TryLock() {
  return pthread_mutex_trylock(&mutex_) == 0;
}
bool Mutex::Unlock() {
  return pthread_mutex_unlock(&mutex_) == 0;
}

LockMutex::LockMutex(Mutex& mutex) : mutex_(mutex) {
  mutex_.Lock();
}

LockMutex::~LockMutex() {
  if (!mutex_.Unlock()) std::terminate();
}

namespace sdk {

Mutex& SDKMutex() {
  static Mutex mutex;
  return mutex;
}

}  // namespace sdk
}  // namespace maruseeker
