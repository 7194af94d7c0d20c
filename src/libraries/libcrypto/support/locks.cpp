// SPDX-License-Identifier: Apache-2.0
// The locks and what a fork does with them.
#include "support/locks.h"

#include <pthread.h>

namespace ldappw {
namespace {

pthread_mutex_t creationMutex = PTHREAD_MUTEX_INITIALIZER;
// Who finds it locked spins before it sleeps: it is held for less time than going to sleep takes.
pthread_mutex_t cryptMutex = PTHREAD_ADAPTIVE_MUTEX_INITIALIZER_NP;
thread_local bool isCreating = false;  // this thread holds creationMutex

void beforeFork() noexcept {
  if (!isCreating) pthread_mutex_lock(&creationMutex);
  pthread_mutex_lock(&cryptMutex);
}

void afterFork() noexcept {
  pthread_mutex_unlock(&cryptMutex);
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

CryptLock::CryptLock() noexcept {
  pthread_mutex_lock(&cryptMutex);
}

CryptLock::~CryptLock() {
  pthread_mutex_unlock(&cryptMutex);
}

}  // namespace ldappw
