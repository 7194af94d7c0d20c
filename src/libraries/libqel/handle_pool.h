// SPDX-License-Identifier: Apache-2.0
// Handles and the objects behind them. A handle is a coded number (kind, place, generation), so that checking one never
// reads memory through it: the place leads to a slot of this pool, and the slot must hold that very handle. A retired
// handle stays invalid, because the next use of its slot has another generation. Objects are kept for reuse.
#ifndef QEL_HANDLE_POOL_H
#define QEL_HANDLE_POOL_H

#include <atomic>
#include <climits>
#include <cstddef>
#include <cstdint>
#include <mutex>
#include <new>

#include "lane.h"

namespace qel {

// T is made when its slot is and destroyed by releaseMemory. Kind is 1 to 7 and differs between pools.
template <typename T, unsigned Kind>
class HandlePool {
 public:
  struct alignas(kCacheLine) Slot {
    std::atomic<std::uintptr_t> handle{0};  // 0 while no handle leads here
    std::atomic<std::uintptr_t> owner{0};   // handle of the provider context, 0 for such a context itself
    std::uintptr_t place = 0;
    std::uintptr_t generation = 0;
    Slot* next = nullptr;
    T value;
  };

  // A slot without a handle, for the caller alone; null when memory or handles have run out.
  Slot* take(Lane* lane) noexcept {
    if (lane == nullptr || lane->spares[Kind].count == 0) return takeShared();
    Spares& spares = lane->spares[Kind];
    return static_cast<Slot*>(spares.slots[--spares.count]);
  }

  std::uintptr_t publish(Slot& slot, std::uintptr_t owner) noexcept {
    const std::uintptr_t handle = encode(slot);
    slot.owner.store(owner, std::memory_order_relaxed);
    slot.handle.store(handle, std::memory_order_release);
    return handle;
  }

  // The slot of a live handle, or null for any other value.
  Slot* find(std::uintptr_t handle) const noexcept {
    const std::size_t place = (handle >> kKindBits) & (kMaxSlots - 1);
    Chunk* chunk = directory_[place / kChunkSlots].load(std::memory_order_acquire);
    if (chunk == nullptr || handle == 0) return nullptr;
    Slot& slot = chunk->slots[place % kChunkSlots];
    return slot.handle.load(std::memory_order_acquire) == handle ? &slot : nullptr;
  }

  // Ends the handle's life: true for exactly one caller, who then owns the slot as after take.
  bool retire(Slot& slot, std::uintptr_t handle) noexcept {
    if (!slot.handle.compare_exchange_strong(handle, 0, std::memory_order_acq_rel)) return false;
    ++slot.generation;
    return true;
  }

  // The same without the guard against two threads at once, for objects that belong to one thread at a time.
  void retireOwn(Slot& slot) noexcept {
    slot.handle.store(0, std::memory_order_release);
    ++slot.generation;
  }

  void give(Slot& slot, Lane* lane) noexcept {
    if (lane == nullptr || lane->spares[Kind].count == Spares::kRoom) {
      giveShared(slot);
      return;
    }
    Spares& spares = lane->spares[Kind];
    spares.slots[spares.count++] = &slot;
  }

  // Retires the live handles of an owner; release(slot, handle) empties each object and gives its slot back.
  template <typename Release>
  void retireOwned(std::uintptr_t owner, Release release) noexcept {
    for (auto& entry : directory_) {
      Chunk* chunk = entry.load(std::memory_order_acquire);
      if (chunk == nullptr) return;
      for (Slot& slot : chunk->slots) {
        const std::uintptr_t handle = slot.handle.load(std::memory_order_acquire);
        if (handle == 0 || slot.owner.load(std::memory_order_relaxed) != owner || !retire(slot, handle)) continue;
        release(slot, handle);
      }
    }
  }

  // Destroys everything, whatever is live. No other thread may be inside, and lanes must not be used any more.
  void releaseMemory() noexcept {
    for (auto& entry : directory_) delete entry.exchange(nullptr, std::memory_order_acq_rel);
    free_ = nullptr;
    chunkCount_ = 0;
  }

 private:
  static constexpr unsigned kKindBits = 3;
  static constexpr unsigned kPlaceBits = 17;
  static constexpr unsigned kPointerBits = sizeof(std::uintptr_t) * CHAR_BIT;
  static constexpr std::size_t kMaxSlots = std::size_t{1} << kPlaceBits;
  static constexpr std::size_t kChunkSlots = 32;
  static constexpr std::size_t kMaxChunks = kMaxSlots / kChunkSlots;
  static_assert(Kind > 0 && Kind < kHandleKinds && kHandleKinds == 1U << kKindBits,
                "a kind marks every handle, so that none is aligned or null");

  struct Chunk {
    Slot slots[kChunkSlots];
  };

  static std::uintptr_t encode(const Slot& slot) noexcept {
    // With 64-bit pointers the top bit puts handles where no address of a process is.
    constexpr std::uintptr_t kTop = kPointerBits > 32 ? std::uintptr_t{1} << (kPointerBits - 1) : 0;
    return kTop | (slot.generation << (kPlaceBits + kKindBits)) | (slot.place << kKindBits) | Kind;
  }

  // Starts differ all over the range, so that a number near to a live handle is no handle either.
  static std::uintptr_t firstGeneration(std::size_t place) noexcept {
    constexpr std::uint64_t kGolden = 0x9E3779B97F4A7C15U;
    return static_cast<std::uintptr_t>((place * kHandleKinds + Kind) * kGolden >> 32);
  }

  [[gnu::cold]] Slot* takeShared() noexcept {
    std::lock_guard<std::mutex> lock{mutex_};
    if (free_ == nullptr && !grow()) return nullptr;
    Slot* slot = free_;
    free_ = slot->next;
    return slot;
  }

  [[gnu::cold]] void giveShared(Slot& slot) noexcept {
    std::lock_guard<std::mutex> lock{mutex_};
    slot.next = free_;
    free_ = &slot;
  }

  bool grow() noexcept {
    if (chunkCount_ == kMaxChunks) return false;
    Chunk* chunk = new (std::nothrow) Chunk;
    if (chunk == nullptr) return false;
    std::size_t place = chunkCount_ * kChunkSlots;
    for (Slot& slot : chunk->slots) {
      slot.generation = firstGeneration(place);
      slot.place = place++;
      slot.next = free_;
      free_ = &slot;
    }
    directory_[chunkCount_++].store(chunk, std::memory_order_release);
    return true;
  }

  std::atomic<Chunk*> directory_[kMaxChunks] = {};
  std::mutex mutex_;  // guards what follows
  Slot* free_ = nullptr;
  std::size_t chunkCount_ = 0;
};

}  // namespace qel

#endif
