// SPDX-License-Identifier: Apache-2.0
// The pools, their life from loading to unloading, and the failures of a Call.
#include "provider.h"

#include <openssl/err.h>

namespace qel {

ProviderPool providers;
DigestPool digests;
CipherPool ciphers;
DigestContextPool digestContexts;
CipherContextPool cipherContexts;

namespace {

// OpenSSL tears itself down at exit, or when the host tells it to; its objects must not be touched after that.
bool opensslRuns() noexcept {
  if (OPENSSL_init_crypto(0, nullptr) == 1) return true;
  ERR_clear_error();
  return false;
}

// Retires what the provider context owns in a pool, and empties it as well while OpenSSL runs.
template <typename Pool, typename Empty>
void releaseOwned(Pool& pool, std::uintptr_t owner, bool runs, Empty empty) noexcept {
  pool.retireOwned(owner, [&](typename Pool::Slot& slot, std::uintptr_t) {
    if (!runs) return;  // what OpenSSL made is lost with it, and so is the slot
    empty(slot.value);
    pool.give(slot, currentLane());
  });
}

void releaseEverything() noexcept {
  providers.retireOwned(0, releaseProvider);
  digestContexts.releaseMemory();
  cipherContexts.releaseMemory();
  digests.releaseMemory();
  ciphers.releaseMemory();
  providers.releaseMemory();
}

// Starting OpenSSL here makes it register its exit handler before this object's destructor is registered. Exit runs
// them the other way round, so that what is still live at exit is released while OpenSSL works.
class Lifetime {
 public:
  Lifetime() noexcept {
    OPENSSL_init_crypto(0, nullptr);
    openLanes();
  }
  Lifetime(const Lifetime&) = delete;
  Lifetime& operator=(const Lifetime&) = delete;
  ~Lifetime() {
    if (opensslRuns()) releaseEverything();
    closeLanes();
  }
};

const Lifetime lifetime;

}  // namespace

bool Library::open() noexcept {
  context.reset(OSSL_LIB_CTX_new());
  if (context == nullptr) return false;
  defaultProvider.reset(OSSL_PROVIDER_load(context.get(), "default"));
  if (defaultProvider == nullptr) context.reset();
  return context != nullptr;
}

void releaseProvider(ProviderPool::Slot& slot, std::uintptr_t handle) noexcept {
  const bool runs = opensslRuns();
  releaseOwned(digestContexts, handle, runs, [](DigestContext& context) { context.wipe(); });
  releaseOwned(cipherContexts, handle, runs, [](CipherContext& context) { context.wipe(); });
  releaseOwned(digests, handle, runs, [](Digest& digest) { digest.replicas.reset(); });
  releaseOwned(ciphers, handle, runs, [](Cipher& cipher) { cipher.replicas.reset(); });
  if (!runs) return;
  slot.value.context.reset();
  providers.give(slot, currentLane());
}

int failCall(std::uintptr_t context, QelStatus* status, QelReason reason, const char* text) noexcept {
  const bool live = providers.find(context) != nullptr;
  recordFailure(live ? context : 0, status, reason, Source::kProvider, text);
  return 0;
}

int failCallHandle(std::uintptr_t context, QelStatus* status, std::uintptr_t handle, const char* text) noexcept {
  if (context == 0 || handle == 0) return failCall(context, status, QEL_REASON_NULL_ARGUMENT, "a handle is null");
  const bool live = providers.find(context) != nullptr;
  return failCall(context, status, QEL_REASON_FOREIGN_HANDLE, live ? text : Call::kForeignContext);
}

}  // namespace qel
