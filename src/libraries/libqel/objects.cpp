// SPDX-License-Identifier: Apache-2.0
// The states of contexts and how they are wiped; rooms and how threads get them.
#include "objects.h"

#include <openssl/core_names.h>
#include <openssl/crypto.h>
#include <openssl/evp.h>
#include <openssl/params.h>

#include <iterator>
#include <new>

namespace qel {

// The functions that make a state are alike for both types, and so are those that release one.
bool Work::take(const Algorithm& wanted) noexcept {
  if (algorithm == &wanted) return true;
  release();
  algorithm = &wanted;
  state = function<OSSL_FUNC_digest_newctx_fn>(OSSL_FUNC_DIGEST_NEWCTX)(providerContext);
  if (state == nullptr) algorithm = nullptr;
  return state != nullptr && (padding || setPadding(false));
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
  std::size_t written = 0;
  return start(state, kZeros, algorithm->keyLength, kZeros, algorithm->ivLength, nullptr) == 1 &&
         update(state, none, &written, sizeof none, kZeros, algorithm->blockSize) == 1;
}

namespace {

void endThread(void* value) noexcept {
  auto* room = static_cast<Room*>(value);
  freeOwn(true);
  for (Work& work : room->works) {
    if (work.isIdle()) work.release();
  }
  room->failureOwner = 0;
  room->leave();
}

// Reads as never set when there are no keys left: then no thread has a room.
const pthread_key_t roomKey = [] {
  pthread_key_t key;
  return pthread_key_create(&key, endThread) == 0 ? key : static_cast<pthread_key_t>(-1);
}();

// The room with this number, which is made when it is not there; null when memory has run out.
Room* roomAt(std::size_t number) noexcept {
  Room* room = rooms[number].load(std::memory_order_acquire);
  void* memory = room == nullptr ? OPENSSL_zalloc(sizeof(Room)) : nullptr;
  if (memory == nullptr) return room;
  Room* made = new (memory) Room;
  for (std::size_t i = 0; i < std::size(made->works); ++i) {
    made->works[i].next = firstHandle(kWorkKind + i / Room::kWorks, number * Room::kWorks + i % Room::kWorks);
  }
  if (rooms[number].compare_exchange_strong(room, made, std::memory_order_acq_rel)) return made;
  OPENSSL_free(made);
  return room;
}

}  // namespace

Work* Room::idle(Type type) noexcept {
  for (Work* each = works + type * kWorks; each != works + (type + 1) * kWorks; ++each) {
    if (each->isIdle()) return each;
  }
  return nullptr;
}

Room* takeRoom(Type type) noexcept {
  freeOwn(false);
  for (std::size_t number = 0; number < std::size(rooms); ++number) {
    Room* room = roomAt(number);
    if (room == nullptr) return nullptr;
    if (room->isTaken.exchange(true, std::memory_order_acq_rel)) continue;
    if (room->idle(type) != nullptr) return room;
    room->leave();
  }
  return nullptr;
}

Room* ownRoom() noexcept {
  auto* room = static_cast<Room*>(pthread_getspecific(roomKey));
  if (room != nullptr || (room = takeRoom(kDigest)) == nullptr || pthread_setspecific(roomKey, room) == 0) return room;
  room->leave();
  return nullptr;
}

void freeOwn(bool all) noexcept {
  for (const std::atomic<Room*>& each : rooms) {
    Room* room = each.load(std::memory_order_acquire);
    if (room == nullptr) return;
    for (Work& work : room->works) {
      const bool isOwn = !work.isIdle() && work.user.load(std::memory_order_relaxed) == pthread_self();
      if (!isOwn || (!all && findContext(work.owner.load(std::memory_order_relaxed)) != nullptr)) continue;
      work.wipe();
      work.retire();
    }
  }
}

}  // namespace qel
