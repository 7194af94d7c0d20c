// SPDX-License-Identifier: Apache-2.0
// The locks and what a fork does with them.
#include "support/locks.h"

#include <pthread.h>

namespace ldappw {
namespace {

pthread_mutex_t creationMutex = PTHREAD_MUTEX_INITIALIZER;
thread_local bool isCreating = false;  // this thread holds creationMutex

void beforeFork() noexcept {
  if (!isCreating) pthread_mutex_lock(&creationMutex);
}

void afterFork() noexcept {
  if (!isCreating) pthread_mutex_unlock(&creationMutex);
}

// The C library forgets the handlers when this library is unloaded.
[[gnu::constructor]] void watchForks() noexcept {
  pthread_atfork(beforeFork, afterFork, afterFork);
}

}  // namespace

CreationLock::CreationLock() noexcept : passed_(isCreating) {
  if (passed_) return;
  pthread_mutex_lock(&creationMutex);
  isCreating = true;
}

CreationLock::~CreationLock() {
  if (passed_) return;
  isCreating = false;
  pthread_mutex_unlock(&creationMutex);
}

}  // namespace ldappw
