// SPDX-License-Identifier: Apache-2.0
// A mutex held for as long as a scope lasts. Over pthreads, whose mutexes need no constructor to run.
#pragma once

#include <pthread.h>

namespace ldappw {

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
