// SPDX-License-Identifier: Apache-2.0
// Handing lanes to threads. A thread-specific key tells when a thread exits; unlike a thread-local object with a
// destructor it can be given up, so that threads that live on never keep the library from being unloaded.
#include "lane.h"

#include <mutex>
#include <new>

namespace qel {

namespace {

// Reads as never set, where a key that is given back could be somebody else's by now.
constexpr pthread_key_t kNoKey = static_cast<pthread_key_t>(-1);

std::mutex mutex;  // guards what follows
Lane* idle = nullptr;
Lane* made = nullptr;
unsigned madeCount = 0;

Lane* takeLane() noexcept {
  if (idle != nullptr) {
    Lane* lane = idle;
    idle = lane->nextIdle;
    return lane;
  }
  Lane* lane = new (std::nothrow) Lane;
  if (lane == nullptr) return nullptr;
  lane->number = madeCount++;
  lane->nextMade = made;
  made = lane;
  return lane;
}

void leaveLane(void* value) noexcept {
  Lane* lane = static_cast<Lane*>(value);
  for (FailureRecord& record : lane->records) record = {};
  std::lock_guard<std::mutex> lock{mutex};
  lane->nextIdle = idle;
  idle = lane;
}

}  // namespace

pthread_key_t laneKey = kNoKey;

Lane* enterLane() noexcept {
  std::lock_guard<std::mutex> lock{mutex};
  Lane* lane = laneKey == kNoKey ? nullptr : takeLane();
  if (lane == nullptr || pthread_setspecific(laneKey, lane) == 0) return lane;
  lane->nextIdle = idle;
  idle = lane;
  return nullptr;
}

void openLanes() noexcept {
  pthread_key_t key;
  if (pthread_key_create(&key, leaveLane) == 0) laneKey = key;
}

void closeLanes() noexcept {
  if (laneKey != kNoKey) pthread_key_delete(laneKey);
  laneKey = kNoKey;
  while (made != nullptr) {
    Lane* lane = made;
    made = lane->nextMade;
    delete lane;
  }
  idle = nullptr;
}

}  // namespace qel
