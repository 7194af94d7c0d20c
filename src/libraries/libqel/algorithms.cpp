// SPDX-License-Identifier: Apache-2.0
// Finding algorithms by name and telling their sizes. A name that was found before costs one look into the table of the
// provider context. Other names go to OpenSSL; only those it knows enter the table, so that unknown ones never fill it.
#include "algorithms.h"

#include <openssl/err.h>

#include <utility>

namespace qel {
namespace {

// What differs between digests and ciphers.
struct DigestKind {
  using Pool = DigestPool;

  static Pool& pool() noexcept { return digests; }
  static NameTable<Pool::Slot>& names(ProviderContext& provider) noexcept { return provider.digestNames; }
  static Owned<EVP_MD> fetch(OSSL_LIB_CTX* library, const char* name) noexcept {
    return Owned<EVP_MD>{EVP_MD_fetch(library, name, nullptr)};
  }
  static const char* nameOf(const EVP_MD* digest) noexcept { return EVP_MD_get0_name(digest); }
  static void measure(Digest& digest) noexcept {
    digest.size = EVP_MD_get_size(digest.replicas.get(0));
    digest.blockSize = EVP_MD_get_block_size(digest.replicas.get(0));
  }
};

struct CipherKind {
  using Pool = CipherPool;

  static Pool& pool() noexcept { return ciphers; }
  static NameTable<Pool::Slot>& names(ProviderContext& provider) noexcept { return provider.cipherNames; }
  static Owned<EVP_CIPHER> fetch(OSSL_LIB_CTX* library, const char* name) noexcept {
    return Owned<EVP_CIPHER>{EVP_CIPHER_fetch(library, name, nullptr)};
  }
  static const char* nameOf(const EVP_CIPHER* cipher) noexcept { return EVP_CIPHER_get0_name(cipher); }
  static void measure(Cipher& cipher) noexcept {
    cipher.blockSize = EVP_CIPHER_get_block_size(cipher.replicas.get(0));
    cipher.keyLength = EVP_CIPHER_get_key_length(cipher.replicas.get(0));
    cipher.ivLength = EVP_CIPHER_get_iv_length(cipher.replicas.get(0));
  }
};

template <typename Kind>
using SlotOf = typename Kind::Pool::Slot;

template <typename Kind, typename Algorithm>
SlotOf<Kind>* makeSlot(Algorithm algorithm, std::uintptr_t owner) noexcept {
  SlotOf<Kind>* slot = Kind::pool().take(currentLane());
  if (slot == nullptr) return nullptr;
  slot->value.replicas.set(0, std::move(algorithm));
  Kind::measure(slot->value);
  Kind::pool().publish(*slot, owner);
  return slot;
}

template <typename Kind>
void dropSlot(SlotOf<Kind>& slot) noexcept {
  Kind::pool().retireOwn(slot);
  slot.value.replicas.reset();
  Kind::pool().give(slot, currentLane());
}

// Under the context's mutex. OpenSSL gives the same object for every name of an algorithm, so that another name of one
// that is here already finds it, and is served even when the table takes no more names.
template <typename Kind>
SlotOf<Kind>* fetchSlot(const Call& call, ProviderContext& provider, const FoldedName& name) noexcept {
  auto algorithm = Kind::fetch(provider.libraries[0].context.get(), name.text());
  if (algorithm == nullptr) {
    call.failOpenssl(QEL_REASON_UNKNOWN_ALGORITHM, "no algorithm has this name");
    return nullptr;
  }
  auto& names = Kind::names(provider);
  const auto isSame = [&algorithm](const SlotOf<Kind>& slot) { return slot.value.replicas.get(0) == algorithm.get(); };
  SlotOf<Kind>* slot = names.findIf(isSame);
  if (slot != nullptr) {
    names.add(name, slot);
    return slot;
  }
  slot = makeSlot<Kind>(std::move(algorithm), call.handle());
  if (slot != nullptr && names.add(name, slot)) return slot;
  if (slot != nullptr) dropSlot<Kind>(*slot);
  call.fail(QEL_REASON_OUT_OF_MEMORY, "no memory for an algorithm");
  return nullptr;
}

template <typename Kind>
[[gnu::cold]] SlotOf<Kind>* findName(const Call& call, ProviderContext& provider, const char* name) noexcept {
  if (name == nullptr) {
    call.failNull("the algorithm name is null");
    return nullptr;
  }
  const FoldedName folded{name};
  if (folded.empty()) {
    call.fail(QEL_REASON_UNKNOWN_ALGORITHM, "the algorithm name is empty or too long");
    return nullptr;
  }
  auto& names = Kind::names(provider);
  SlotOf<Kind>* slot = names.find(folded, laneNumber());
  if (slot != nullptr) return slot;
  std::lock_guard<std::mutex> lock{provider.mutex};
  slot = names.find(folded, laneNumber());
  return slot != nullptr ? slot : fetchSlot<Kind>(call, provider, folded);
}

template <typename Kind>
SlotOf<Kind>* findSlot(const Call& call, const char* name) noexcept {
  const ProviderPool::Slot* owner = call.open();
  if (owner == nullptr) return nullptr;
  ProviderContext& provider = *owner->value.context;
  SlotOf<Kind>* slot = Kind::names(provider).findRecent(name, laneNumber());
  return slot != nullptr ? slot : findName<Kind>(call, provider, name);
}

template <typename Kind>
auto* fetchReplica(const Call& call, SlotOf<Kind>& slot, unsigned replica) noexcept {
  auto& replicas = slot.value.replicas;
  ProviderContext& provider = *providers.find(call.handle())->value.context;
  std::lock_guard<std::mutex> lock{provider.mutex};
  Library& library = provider.libraries[replica];
  if (replicas.get(replica) == nullptr && (library.context != nullptr || library.open())) {
    replicas.set(replica, Kind::fetch(library.context.get(), Kind::nameOf(replicas.get(0))));
  }
  if (replicas.get(replica) != nullptr) return replicas.get(replica);
  ERR_clear_error();
  return replicas.get(0);
}

int digestNumber(const QEL_CTX* ctx, const QEL_DIGEST* handle, int Digest::*number) noexcept {
  const auto* slot = Call{ctx}.find(digests, handle);
  return slot == nullptr ? 0 : slot->value.*number;
}

int cipherNumber(const QEL_CTX* ctx, const QEL_CIPHER* handle, int Cipher::*number) noexcept {
  const auto* slot = Call{ctx}.find(ciphers, handle);
  return slot == nullptr ? 0 : slot->value.*number;
}

}  // namespace

DigestPool::Slot* findDigest(const Call& call, const char* name) noexcept {
  return findSlot<DigestKind>(call, name);
}

CipherPool::Slot* findCipher(const Call& call, const char* name) noexcept {
  return findSlot<CipherKind>(call, name);
}

EVP_MD* addReplica(const Call& call, DigestPool::Slot& slot, unsigned replica) noexcept {
  return fetchReplica<DigestKind>(call, slot, replica);
}

EVP_CIPHER* addReplica(const Call& call, CipherPool::Slot& slot, unsigned replica) noexcept {
  return fetchReplica<CipherKind>(call, slot, replica);
}

}  // namespace qel

extern "C" {

const QEL_CIPHER* QEL_EVP_get_cipherbyname(QEL_CTX* ctx, const char* name) noexcept {
  const auto* slot = qel::findCipher(qel::Call{ctx}, name);
  return slot == nullptr ? nullptr : qel::handleOf<const QEL_CIPHER>(slot->handle);
}

const QEL_DIGEST* QEL_EVP_get_digestbyname(QEL_CTX* ctx, const char* name) noexcept {
  const auto* slot = qel::findDigest(qel::Call{ctx}, name);
  return slot == nullptr ? nullptr : qel::handleOf<const QEL_DIGEST>(slot->handle);
}

int QEL_EVP_MD_block_size(QEL_CTX* ctx, const QEL_DIGEST* digest) noexcept {
  return qel::digestNumber(ctx, digest, &qel::Digest::blockSize);
}

int QEL_EVP_MD_size(QEL_CTX* ctx, const QEL_DIGEST* digest) noexcept {
  return qel::digestNumber(ctx, digest, &qel::Digest::size);
}

int QEL_EVP_CIPHER_block_size(QEL_CTX* ctx, const QEL_CIPHER* cipher) noexcept {
  return qel::cipherNumber(ctx, cipher, &qel::Cipher::blockSize);
}

int QEL_EVP_CIPHER_key_length(QEL_CTX* ctx, const QEL_CIPHER* cipher) noexcept {
  return qel::cipherNumber(ctx, cipher, &qel::Cipher::keyLength);
}

int QEL_EVP_CIPHER_iv_length(QEL_CTX* ctx, const QEL_CIPHER* cipher) noexcept {
  return qel::cipherNumber(ctx, cipher, &qel::Cipher::ivLength);
}

}  // extern "C"
