// SPDX-License-Identifier: Apache-2.0
// Handles and what they lead to. A handle is a number: a kind, a place, and how often the place was used. The place
// leads to an entry of a table that is never released, and the entry must hold that very number. So no handle is read
// through, looking one up takes no lock, and a thread that is still inside when its objects go finds memory there.
#pragma once

#include <openssl/core_dispatch.h>
#include <openssl/err.h>
#include <openssl/types.h>
#include <pthread.h>

#include <atomic>
#include <cstddef>
#include <cstdint>

#include "qel.h"

namespace qel {

using Handle = std::uintptr_t;

enum Type : unsigned { kDigest, kCipher };

// Of a provider context, and with the type added of an algorithm and of a digest or cipher context. None is 0.
enum Kind : Handle { kContextKind = 1, kAlgorithmKind = 2, kWorkKind = 4 };

constexpr unsigned kKindBits = 3;
constexpr unsigned kIndexBits = 8;  // of an algorithm's number, at the low end of its provider context's place
constexpr Handle kPlaces = Handle{1} << 17;
constexpr Handle kNextUse = kPlaces << kKindBits;
constexpr int kFunctions = 16;  // more than an algorithm has

// With 64-bit pointers the top bit puts handles where no address of a process is.
constexpr Handle firstHandle(Handle kind, size_t place) noexcept {
  return (sizeof(Handle) > 4 ? Handle{1} << (sizeof(Handle) * 8 - 1) : 0) | (place << kKindBits) | kind;
}

struct Entry {
  bool isIdle() const noexcept { return handle.load(std::memory_order_acquire) == 0; }
  bool answersTo(Handle value) const noexcept { return value != 0 && handle.load(std::memory_order_acquire) == value; }
  void* publish() noexcept {
    handle.store(next, std::memory_order_release);
    return reinterpret_cast<void*>(next);
  }
  void retire() noexcept {
    next += kNextUse;
    handle.store(0, std::memory_order_release);
  }

  std::atomic<Handle> handle{0};  // 0 while no handle leads here
  Handle next = 0;                // what it will be after that
};

// A provider context.
struct Context : Entry {
  std::atomic<bool> isLenient{false};  // zeros: so the table takes no room in the file
  char values[2][4096] = {};           // by QelValueId
};

// An algorithm of OpenSSL's default provider. Its functions are called through the documented interface between
// libcrypto and its providers (provider-digest(7), provider-cipher(7)), without EVP in between. EVP counts the uses of
// an algorithm in a number that all threads share, and makes a state for every digest; here a state is kept and started
// again. A SHA-1 of a password takes half the time of EVP with a new context, a block of AES-256-ECB less than half,
// where EVP with kept contexts takes four fifths.
struct Algorithm {
  const char* names;  // separated by colons
  Type type;
  bool isOverwritten;  // the state, by another start
  size_t size, blockSize, keyLength, ivLength;
  size_t endSize;                   // the most that an end may write, and an update of a cipher beyond what it is given
  void (*functions[kFunctions])();  // by OpenSSL's number
};

// Read once, before there is a provider context, and there until the process ends.
inline Algorithm algorithms[2][255];  // by type; twice as many as there are
inline size_t algorithmCounts[2];
inline void* providerContext;  // for the making of states

// Takes what OpenSSL raises while it lives out of the thread's queue again, in which the host may have something. It
// costs a quarter of an AES value, and so stands where memory is asked for; the steps of a digest or cipher have
// checked before they call what OpenSSL would refuse.
struct ErrorMark {
  ErrorMark() noexcept { ERR_set_mark(); }
  ~ErrorMark() { ERR_pop_to_mark(); }
};

// Starts OpenSSL and reads the algorithms, unless that is done. One thread at a time; may be tried again.
bool startOpenssl() noexcept;

// By any of its names, in either case; null when there is none. The spellings in use are found at once.
const Algorithm* findAlgorithm(Type type, const char* name) noexcept;

enum class Phase { kFresh, kFailed, kEnded, kRunning };  // the first two need an init

// A digest or cipher context. wipe() removes its secrets: when it is cleaned up or freed, in QEL_Cleanup, and when its
// thread ends. The state is wiped by re-initialising it, a cipher with a zero key, vector and block, or is released,
// which the algorithms do with a wipe.
struct Work : Entry {
  bool take(const Algorithm& wanted) noexcept;  // a state; false when memory has run out
  [[gnu::cold]] bool takeOver() noexcept;       // by the calling thread; likewise
  bool setPadding(bool on) noexcept;
  bool overwrite() noexcept;
  void release() noexcept;
  void wipe() noexcept;
  void end() noexcept;  // with a wipe

  // Of a cipher. At the end of a text that is one, a padded decryption has a block left, and others have none.
  bool isPadded() const noexcept { return padding && algorithm->blockSize > 1; }
  bool isWhole() const noexcept { return held == algorithm->blockSize || (isPadded() ? encrypts : held == 0); }
  Type type() const noexcept { return static_cast<Type>(next % (Handle{1} << kKindBits) - kWorkKind); }
  size_t place() const noexcept { return (next >> kKindBits) % kPlaces; }

  template <typename Signature>
  Signature* function(int id) const noexcept {
    return reinterpret_cast<Signature*>(algorithm->functions[id]);
  }

  std::atomic<Handle> owner{0};    // the provider context
  std::atomic<pthread_t> user{0};  // the thread that made or started it last, with which it ends
  const Algorithm* algorithm = nullptr;
  void* state = nullptr;  // of the algorithm; both stay from use to use
  Phase phase = Phase::kFresh;
  bool encrypts = false;
  bool isStarted = false;  // a digest's state, by the wipe: the next digest has that start, a twentieth of its time
  bool padding = true;
  bool isShared = false;  // its place is any thread's to take
  int keyLength = 0;      // what the caller stated, or 0
  size_t held = 0;        // bytes that a cipher has taken and not given out
};

// What a thread has here: places for contexts, and its last failure. A room passes on to a later thread. Where a thread
// wants more places, it takes some of rooms that no thread has.
struct Room {
  static constexpr size_t kWorks = 8;

  Work* idle(Type type) noexcept;  // null when all are live
  [[gnu::cold]] Work* takeShared(Type type) noexcept;
  size_t number() const noexcept { return works[0].place() / kWorks; }

  // Frees the contexts of the calling thread, whose own room this is: those whose provider context is gone, or all.
  void freeWorks(bool all) noexcept;

  Work works[2 * kWorks];  // digest contexts, then cipher contexts
  size_t outside = 0;  // how often the thread has taken a place, or another one's context, since it last saw to them
  Handle failureOwner = 0;
  QelStatus failure = {};
};

inline Context contexts[kPlaces >> kIndexBits];
inline std::atomic<Room*> rooms[kPlaces / Room::kWorks];

// The calling thread's room; null when memory has run out.
Room* ownRoom() noexcept;

// What a live handle leads to; null for any other number.
inline Context* findContext(Handle handle) noexcept {
  Context& context = contexts[(handle >> kKindBits) % kPlaces >> kIndexBits];
  return context.answersTo(handle) ? &context : nullptr;
}

inline Work* findWork(Type type, Handle handle) noexcept {
  const size_t place = (handle >> kKindBits) % kPlaces;
  Room* room = rooms[place / Room::kWorks].load(std::memory_order_acquire);
  Work* work = room == nullptr ? nullptr : &room->works[type * Room::kWorks + place % Room::kWorks];
  return work != nullptr && work->answersTo(handle) ? work : nullptr;
}

}  // namespace qel
