// SPDX-License-Identifier: Apache-2.0
// What a fork waits for, and what waits for a fork.
#include "support/no_fork.h"

#include <pthread.h>

#include <ctime>

#include "support/cancellation.h"

namespace ldappw {
namespace {

constexpr int kMostWaits = 1000;  // of a millisecond

int busy = 0;             // sections under way
int forking = 0;          // forks under way
unsigned generation = 0;  // the number of forks from the first process to this one

template <typename T>
T now(T& number) noexcept {
  return __atomic_load_n(&number, __ATOMIC_SEQ_CST);
}

void add(int& number, int step) noexcept {
  __atomic_add_fetch(&number, step, __ATOMIC_SEQ_CST);
}

void waitShortly() noexcept {
  const NoCancellation uncancelled;
  const timespec millisecond{0, 1000000};
  nanosleep(&millisecond, nullptr);
}

void beforeFork() noexcept {
  add(forking, 1);
  for (int waits = 0; now(busy) > 0 && waits < kMostWaits; ++waits) waitShortly();
}

void afterForkInParent() noexcept {
  add(forking, -1);
}

// The child has one thread; a section that this one is in does not count any more.
void afterForkInChild() noexcept {
  forking = busy = 0;
  ++generation;
}

// The C library forgets the handlers when this library is unloaded.
[[gnu::constructor]] void watchForks() noexcept {
  pthread_atfork(beforeFork, afterForkInParent, afterForkInChild);
}

}  // namespace

NoFork::NoFork() noexcept : generation_(now(generation)) {
  add(busy, 1);
  for (int waits = 0; now(forking) > 0 && waits < kMostWaits; ++waits) {
    add(busy, -1);
    waitShortly();
    add(busy, 1);
  }
}

NoFork::~NoFork() {
  if (generation_ == now(generation)) add(busy, -1);
}

}  // namespace ldappw
