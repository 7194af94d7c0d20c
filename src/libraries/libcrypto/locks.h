// SPDX-License-Identifier: Apache-2.0
// The library's two locks. A fork takes both, so that the child, which has none of the other threads, finds what they
// guard complete and the locks free. Whoever holds cryptMutex takes no other lock.
#pragma once

#include <pthread.h>

namespace ldappw {

// Serialises the creation of the provider context. Recursive: a trace sink may itself format a password.
extern pthread_mutex_t creationMutex;

// Serialises the Unix crypt on the process-wide state.
extern pthread_mutex_t cryptMutex;

// Holds a lock for as long as a scope lasts. Over pthreads, whose mutexes need no constructor to run.
class MutexLock {
 public:
  explicit MutexLock(pthread_mutex_t& mutex) noexcept : mutex_(mutex) { pthread_mutex_lock(&mutex_); }
  ~MutexLock() { pthread_mutex_unlock(&mutex_); }
  MutexLock(const MutexLock&) = delete;
  MutexLock& operator=(const MutexLock&) = delete;

 private:
  pthread_mutex_t& mutex_;
};

}  // namespace ldappw
