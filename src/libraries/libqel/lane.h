// SPDX-License-Identifier: Apache-2.0
// The lane of a thread: what a thread keeps for itself, so that its usual steps need neither a lock nor an atomic
// exchange. A lane passes on to a later thread when its own exits, with the idle objects that are in it.
#ifndef QEL_LANE_H
#define QEL_LANE_H

#include <pthread.h>

#include <cstddef>
#include <cstdint>

#include "qel.h"

namespace qel {

constexpr std::size_t kCacheLine = 64;
constexpr unsigned kHandleKinds = 8;

// Idle objects of one kind, in the slots of their pool.
struct Spares {
  static constexpr unsigned kRoom = 4;

  void* slots[kRoom];
  unsigned count;
};

struct FailureRecord {
  std::uintptr_t context;  // handle, 0 in an unused record
  QelStatus status;
};

struct alignas(kCacheLine) Lane {
  static constexpr unsigned kRecords = 8;

  unsigned number = 0;  // lanes are numbered in turn, so that few busy threads are spread evenly
  Spares spares[kHandleKinds] = {};
  FailureRecord records[kRecords] = {};
  unsigned oldestRecord = 0;
  Lane* nextIdle = nullptr;
  Lane* nextMade = nullptr;
};

extern pthread_key_t laneKey;

[[gnu::cold]] Lane* enterLane() noexcept;

// The calling thread's lane, or null when there is no memory for one: everything works without, only slower, and
// failures are not remembered.
inline Lane* currentLane() noexcept {
  Lane* lane = static_cast<Lane*>(pthread_getspecific(laneKey));
  return lane != nullptr ? lane : enterLane();
}

inline unsigned laneNumber() noexcept {
  const Lane* lane = currentLane();
  return lane == nullptr ? 0 : lane->number;
}

// The first comes before any use of a lane; after the second no thread may use one.
void openLanes() noexcept;
void closeLanes() noexcept;

}  // namespace qel

#endif
