// SPDX-License-Identifier: Apache-2.0
// The states of contexts and how they are wiped; rooms and how threads get them.
#include "objects.h"

#include <openssl/core_names.h>
#include <openssl/crypto.h>
#include <openssl/evp.h>
#include <openssl/params.h>

#include <algorithm>
#include <iterator>
#include <new>

namespace qel {
namespace {

// Numbers that are free, the one that came last on top. What stands on top also counts its changes, so that a thread
// notices a number that went and came back while it looked below.
class FreeNumbers {
 public:
  void push(size_t number) noexcept {
    std::uint64_t top = top_.load(std::memory_order_relaxed);
    do below_[number].store(static_cast<std::uint32_t>(top), std::memory_order_relaxed);
    while (!replace(top, static_cast<std::uint32_t>(number + 1)));
  }
  bool pop(size_t& number) noexcept {
    std::uint64_t top = top_.load(std::memory_order_acquire);
    do {
      if (static_cast<std::uint32_t>(top) == 0) return false;
      number = static_cast<std::uint32_t>(top) - 1;
    } while (!replace(top, below_[number].load(std::memory_order_relaxed)));
    return true;
  }

 private:
  bool replace(std::uint64_t& top, std::uint32_t value) noexcept {
    const std::uint64_t next = ((top >> 32) + 1) << 32 | value;
    return top_.compare_exchange_weak(top, next, std::memory_order_acq_rel, std::memory_order_acquire);
  }

  std::atomic<std::uint64_t> top_{0};
  std::atomic<std::uint32_t> below_[kPlaces] = {};
};

FreeNumbers freeRooms, freePlaces[2];  // rooms that threads have left; places that any thread may take, by type
std::atomic<size_t> roomCount{0};

}  // namespace

// The functions that make a state are alike for both types, and so are those that release one.
bool Work::take(const Algorithm& wanted) noexcept {
  if (algorithm == &wanted) return true;
  release();
  const ErrorMark mark;
  algorithm = &wanted;
  state = function<OSSL_FUNC_digest_newctx_fn>(OSSL_FUNC_DIGEST_NEWCTX)(providerContext);
  if (state == nullptr) algorithm = nullptr;
  return state != nullptr && (padding || setPadding(false));
}

bool Work::takeOver() noexcept {
  Room* room = ownRoom();
  if (room == nullptr) return false;
  user.store(pthread_self(), std::memory_order_relaxed);
  ++room->outside;
  return true;
}

void Work::release() noexcept {
  if (state == nullptr) return;
  const int id = algorithm->type == kDigest ? OSSL_FUNC_DIGEST_FREECTX : OSSL_FUNC_CIPHER_FREECTX;
  function<OSSL_FUNC_digest_freectx_fn>(id)(state);
  state = nullptr;
  algorithm = nullptr;
  isStarted = false;
}

// Of a state, padding is on at first.
bool Work::setPadding(bool on) noexcept {
  unsigned value = on ? 1 : 0;
  padding = on;
  if (state == nullptr) return true;
  const OSSL_PARAM settings[] = {OSSL_PARAM_construct_uint(OSSL_CIPHER_PARAM_PADDING, &value), OSSL_PARAM_END};
  auto* set = function<OSSL_FUNC_cipher_set_ctx_params_fn>(OSSL_FUNC_CIPHER_SET_CTX_PARAMS);
  return set != nullptr && set(state, settings) == 1;
}

void Work::wipe() noexcept {
  if (state != nullptr && (!padding || (phase != Phase::kFresh && !overwrite()))) release();
  phase = Phase::kFresh;
  padding = true;
  keyLength = 0;
  held = 0;
}

void Work::end() noexcept {
  wipe();
  retire();
  if (isShared) freePlaces[type()].push(place());
}

// With padding on, the last block of a ciphertext is held back, and so lies where all held blocks did.
bool Work::overwrite() noexcept {
  static constexpr unsigned char kZeros[EVP_MAX_KEY_LENGTH] = {};
  if (!algorithm->isOverwritten) return false;
  if (algorithm->type == kDigest) {
    isStarted = function<OSSL_FUNC_digest_init_fn>(OSSL_FUNC_DIGEST_INIT)(state, nullptr) == 1;
    return isStarted;
  }
  auto* start = function<OSSL_FUNC_cipher_decrypt_init_fn>(OSSL_FUNC_CIPHER_DECRYPT_INIT);
  auto* update = function<OSSL_FUNC_cipher_update_fn>(OSSL_FUNC_CIPHER_UPDATE);
  unsigned char none[EVP_MAX_BLOCK_LENGTH];
  size_t written = 0;
  return start(state, kZeros, algorithm->keyLength, kZeros, algorithm->ivLength, nullptr) == 1 &&
         update(state, none, &written, sizeof none, kZeros, algorithm->blockSize) == 1;
}

namespace {

void endThread(void* value) noexcept {
  auto* room = static_cast<Room*>(value);
  room->freeWorks(true);
  for (Work& work : room->works) {
    if (work.isIdle()) work.release();
  }
  room->failureOwner = 0;
  freeRooms.push(room->number());
}

// Reads as never set when there are no keys left: then no thread has a room.
const pthread_key_t roomKey = [] {
  pthread_key_t key;
  return pthread_key_create(&key, endThread) == 0 ? key : static_cast<pthread_key_t>(-1);
}();

// Null when memory or the places have run out.
Room* addRoom() noexcept {
  const ErrorMark mark;
  void* memory = roomCount.load() < std::size(rooms) ? OPENSSL_zalloc(sizeof(Room)) : nullptr;
  if (memory == nullptr) return nullptr;
  const size_t number = roomCount.fetch_add(1);
  if (number >= std::size(rooms)) return OPENSSL_free(memory), nullptr;
  Room* room = new (memory) Room;
  for (size_t i = 0; i < std::size(room->works); ++i) {
    room->works[i].next = firstHandle(kWorkKind + i / Room::kWorks, number * Room::kWorks + i % Room::kWorks);
  }
  rooms[number].store(room, std::memory_order_release);
  return room;
}

bool shareRoom() noexcept {
  Room* room = addRoom();
  if (room == nullptr) return false;
  for (Work& work : room->works) {
    work.isShared = true;
    freePlaces[work.type()].push(work.place());
  }
  return true;
}

void freeWorksIn(Room& room, bool all) noexcept {
  for (Work& work : room.works) {
    const bool isOwn = !work.isIdle() && work.user.load(std::memory_order_relaxed) == pthread_self();
    if (!isOwn || (!all && findContext(work.owner.load(std::memory_order_relaxed)) != nullptr)) continue;
    work.end();
  }
}

}  // namespace

Work* Room::idle(Type type) noexcept {
  for (Work* each = works + type * kWorks; each != works + (type + 1) * kWorks; ++each) {
    if (each->isIdle()) return each;
  }
  return nullptr;
}

// Looking through all rooms takes the longer the more there are, and is done the less often.
Work* Room::takeShared(Type type) noexcept {
  freeWorksIn(*this, false);
  if (Work* work = idle(type)) return work;
  if (++outside > roomCount.load(std::memory_order_relaxed)) freeWorks(false);
  size_t place = 0;
  while (!freePlaces[type].pop(place)) {
    if (!shareRoom()) return nullptr;
  }
  return &rooms[place / kWorks].load(std::memory_order_acquire)->works[type * kWorks + place % kWorks];
}

Room* ownRoom() noexcept {
  auto* room = static_cast<Room*>(pthread_getspecific(roomKey));
  if (room != nullptr) return room;
  size_t number = 0;
  room = freeRooms.pop(number) ? rooms[number].load(std::memory_order_acquire) : addRoom();
  if (room == nullptr || pthread_setspecific(roomKey, room) == 0) return room;
  freeRooms.push(room->number());
  return nullptr;
}

void Room::freeWorks(bool all) noexcept {
  freeWorksIn(*this, all);
  if (outside == 0) return;
  for (size_t number = 0; number < std::min(roomCount.load(), std::size(rooms)); ++number) {
    Room* room = rooms[number].load(std::memory_order_acquire);
    if (room != nullptr) freeWorksIn(*room, all);
  }
  outside = all ? 0 : 1;
}

}  // namespace qel
