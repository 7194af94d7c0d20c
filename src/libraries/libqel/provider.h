// SPDX-License-Identifier: Apache-2.0
// What stands behind the handles, the pools that hold it, and the start of every entry: a Call checks the handles and
// records the failure.
#ifndef QEL_PROVIDER_H
#define QEL_PROVIDER_H

#include <atomic>
#include <cstdint>
#include <memory>
#include <mutex>

#include "handle_pool.h"
#include "name_table.h"
#include "openssl_owner.h"
#include "qel.h"
#include "status.h"

namespace qel {

// Every init and wipe of an OpenSSL context counts the uses of its algorithm, in a number that all threads share. So
// that threads do not spend their time on passing that number around, each algorithm is there several times, from
// separate library contexts, and the thread that makes a context decides which one it uses. The first is always there.
constexpr unsigned kReplicaCount = 8;

template <typename T>
class Replicas {
 public:
  Replicas() noexcept = default;
  Replicas(const Replicas&) = delete;
  Replicas& operator=(const Replicas&) = delete;
  ~Replicas() { reset(); }

  T* get(unsigned replica) const noexcept { return items_[replica].load(std::memory_order_acquire); }

  // Fills an empty place. One caller at a time.
  void set(unsigned replica, Owned<T> item) noexcept {
    items_[replica].store(item.release(), std::memory_order_release);
  }

  void reset() noexcept {
    for (auto& item : items_) Owned<T>{item.exchange(nullptr, std::memory_order_acq_rel)}.reset();
  }

 private:
  std::atomic<T*> items_[kReplicaCount] = {};
};

struct Digest {
  static constexpr const char* kForeign = "not a digest of this provider context";

  Replicas<EVP_MD> replicas;
  int size = 0;
  int blockSize = 0;
};

struct Cipher {
  static constexpr const char* kForeign = "not a cipher of this provider context";

  Replicas<EVP_CIPHER> replicas;
  int blockSize = 0;
  int keyLength = 0;
  int ivLength = 0;
};

enum class Phase { kFresh, kRunning, kStopped };

// The OpenSSL context stays with the object from use to use; a wiped one holds no key, no data and no algorithm.
struct DigestContext {
  static constexpr const char* kForeign = "not a live digest context of this provider context";

  bool prepare() noexcept;
  void wipe() noexcept;

  Owned<EVP_MD_CTX> openssl;
  unsigned replica = 0;  // of the algorithms
  Phase phase = Phase::kFresh;
};

struct CipherContext {
  static constexpr const char* kForeign = "not a live cipher context of this provider context";

  bool prepare() noexcept;
  void wipe() noexcept;

  Owned<EVP_CIPHER_CTX> openssl;
  unsigned replica = 0;       // of the algorithms
  std::uintptr_t cipher = 0;  // handle of the last init's cipher, or 0
  Phase phase = Phase::kFresh;
  bool encrypts = false;
  bool padding = true;
  int keyLength = 0;  // what the caller stated, or 0
};

using DigestPool = HandlePool<Digest, 1>;
using CipherPool = HandlePool<Cipher, 2>;
using DigestContextPool = HandlePool<DigestContext, 3>;
using CipherContextPool = HandlePool<CipherContext, 4>;

constexpr std::size_t kPathBytes = 4096;

// An OpenSSL library context with the default provider loaded.
struct Library {
  bool open() noexcept;

  Owned<OSSL_LIB_CTX> context;
  Owned<OSSL_PROVIDER> defaultProvider;
};

// Each provider context has OpenSSL library contexts of its own, so that neither the host's configuration nor its
// property queries decide what a name means here, and QEL_Cleanup takes everything away. They serve algorithms only:
// generators of a library context leave state in every thread that drew from it, which must not outlive it.
struct ProviderContext {
  Library libraries[kReplicaCount];  // the first is open from the start, the others when a thread needs them
  NameTable<DigestPool::Slot> digestNames;
  NameTable<CipherPool::Slot> cipherNames;
  std::atomic<bool> strict{true};
  std::mutex mutex;  // additions to the tables, replicas, libraries, and the path
  char path[kPathBytes] = "";
};

struct ProviderObject {
  std::unique_ptr<ProviderContext> context;
};

using ProviderPool = HandlePool<ProviderObject, 5>;

extern ProviderPool providers;
extern DigestPool digests;
extern CipherPool ciphers;
extern DigestContextPool digestContexts;
extern CipherContextPool cipherContexts;

// Empties a provider context that has been retired, with all that it owns, and gives its slot back.
void releaseProvider(ProviderPool::Slot& slot, std::uintptr_t handle) noexcept;

inline std::uintptr_t valueOf(const void* handle) noexcept {
  return reinterpret_cast<std::uintptr_t>(handle);
}

template <typename Handle>
Handle* handleOf(std::uintptr_t value) noexcept {
  return reinterpret_cast<Handle*>(value);
}

// The failures of a Call. They take its parts one by one, so that a call that succeeds stays in registers. An invalid
// provider context is the failure, whatever is wrong with the handle of an object.
[[gnu::cold]] int failCall(std::uintptr_t context, QelStatus* status, QelReason reason, const char* text) noexcept;
[[gnu::cold]] int failCallHandle(std::uintptr_t context, QelStatus* status, std::uintptr_t handle,
                                 const char* text) noexcept;

class Call {
 public:
  explicit Call(const QEL_CTX* ctx, QelStatus* status = nullptr) noexcept : handle_{valueOf(ctx)}, status_{status} {}

  std::uintptr_t handle() const noexcept { return handle_; }

  // The slot of the provider context; null after a failure, which is recorded.
  ProviderPool::Slot* open() const noexcept {
    ProviderPool::Slot* slot = providers.find(handle_);
    if (slot == nullptr) failHandle(handle_, kForeignContext);
    return slot;
  }

  // The slot of an object of this provider context; null after a failure, which is recorded. Objects never outlive
  // their provider context, so that one that names it as its owner also proves it live.
  template <typename T, unsigned Kind>
  auto* find(const HandlePool<T, Kind>& pool, const void* handle) const noexcept {
    auto* slot = pool.find(valueOf(handle));
    if (slot != nullptr && slot->owner.load(std::memory_order_relaxed) == handle_) return slot;
    failHandle(valueOf(handle), T::kForeign);
    return decltype(slot){nullptr};
  }

  int succeed() const noexcept {
    clearStatus(status_);
    return 1;
  }

  // Record a failure and return 0, the second one with OpenSSL's reason.
  [[gnu::cold]] int fail(QelReason reason, const char* text) const noexcept {
    return failCall(handle_, status_, reason, text);
  }
  [[gnu::cold]] int failOpenssl(QelReason reason, const char* text) const noexcept {
    recordFailure(handle_, status_, reason, Source::kOpenssl, text);
    return 0;
  }
  [[gnu::cold]] int failNull(const char* text) const noexcept { return fail(QEL_REASON_NULL_ARGUMENT, text); }

  static constexpr const char* kForeignContext = "not a live provider context";

 private:
  [[gnu::cold]] int failHandle(std::uintptr_t handle, const char* text) const noexcept {
    return failCallHandle(handle_, status_, handle, text);
  }

  std::uintptr_t handle_;
  QelStatus* status_;
};

// A new object of the call's provider context; 0 when memory has run out.
template <typename T, unsigned Kind>
std::uintptr_t makeObject(const Call& call, HandlePool<T, Kind>& pool) noexcept {
  if (call.open() == nullptr) return 0;
  Lane* lane = currentLane();
  auto* slot = pool.take(lane);
  if (slot != nullptr && slot->value.prepare()) {
    slot->value.replica = lane == nullptr ? 0 : lane->number % kReplicaCount;
    return pool.publish(*slot, call.handle());
  }
  if (slot != nullptr) pool.give(*slot, lane);
  call.fail(QEL_REASON_OUT_OF_MEMORY, "no memory for a context");
  return 0;
}

template <typename T, unsigned Kind>
int releaseObject(const Call& call, HandlePool<T, Kind>& pool, const void* handle) noexcept {
  auto* slot = call.find(pool, handle);
  if (slot == nullptr) return 0;
  pool.retireOwn(*slot);
  slot->value.wipe();
  pool.give(*slot, currentLane());
  return 1;
}

template <typename T, unsigned Kind>
int wipeObject(const Call& call, HandlePool<T, Kind>& pool, const void* handle) noexcept {
  auto* slot = call.find(pool, handle);
  if (slot == nullptr) return 0;
  slot->value.wipe();
  return 1;
}

}  // namespace qel

#endif
