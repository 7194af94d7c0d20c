// SPDX-License-Identifier: Apache-2.0
// The locks and what a fork does with them.
#include "locks.h"

namespace ldappw {
namespace {

constexpr pthread_mutex_t kRecursive = PTHREAD_RECURSIVE_MUTEX_INITIALIZER_NP;
constexpr pthread_mutex_t kPlain = PTHREAD_MUTEX_INITIALIZER;

void beforeFork() noexcept {
  pthread_mutex_lock(&creationMutex);
  pthread_mutex_lock(&cryptMutex);
}

void afterForkInParent() noexcept {
  pthread_mutex_unlock(&cryptMutex);
  pthread_mutex_unlock(&creationMutex);
}

// The child's thread has another number than the parent's, which holds the recursive lock: it cannot unlock that one.
void afterForkInChild() noexcept {
  cryptMutex = kPlain;
  creationMutex = kRecursive;
}

// The C library forgets the handlers when this library is unloaded.
[[gnu::constructor]] void watchForks() noexcept {
  pthread_atfork(beforeFork, afterForkInParent, afterForkInChild);
}

}  // namespace

pthread_mutex_t creationMutex = kRecursive;
pthread_mutex_t cryptMutex = kPlain;

}  // namespace ldappw
