// SPDX-License-Identifier: Apache-2.0
// Cipher and digest contexts as the operations use them: the provider's steps as methods, and owners that release.
#pragma once

#include "crypto_provider.h"
#include "support/cancellation.h"

namespace ldappw {

// Calls an entry of the provider. One that is missing, as all are before the provider is loaded, fails as the provider
// would: with 0 or null.
template <typename Result, typename... Parameters, typename... Arguments>
Result callEntry(Result (*entry)(Parameters...), Arguments... arguments) noexcept {
  return __builtin_expect(entry != nullptr, 1) ? entry(arguments...) : Result{};
}

// A generator may open devices and files to seed itself.
inline int randomBytes(void* qelCtx, unsigned char* buffer, int count) noexcept {
  const NoCancellation uncancelled;
  return callEntry(pQEL_RAND_bytes, qelCtx, buffer, count);
}

// A digest under way: the handles that a caller gave or an owner made, and the provider's steps on them. Steps return
// what the provider returned.
struct Digest {
  void* qelCtx = nullptr;
  void* context = nullptr;
  void* algorithm = nullptr;

  bool isComplete() const noexcept { return qelCtx != nullptr && context != nullptr && algorithm != nullptr; }
  // 0 when the provider states none: no value is made for such a digest, against which every password would verify.
  size_t size() const noexcept {
    const int bytes = callEntry(pQEL_EVP_MD_size, qelCtx, algorithm);
    return bytes > 0 ? static_cast<size_t>(bytes) : 0;
  }
  int init() const noexcept { return callEntry(pQEL_EVP_DigestInit, qelCtx, context, algorithm); }
  int update(const void* data, uint32_t bytes) const noexcept {
    return callEntry(pQEL_EVP_DigestUpdate, qelCtx, context, data, bytes);
  }
  int final(unsigned char* out, unsigned* outLength) const noexcept {
    return callEntry(pQEL_EVP_DigestFinal, qelCtx, context, out, outLength);
  }
};

// A cipher under way, in either direction.
struct Cipher {
  void* qelCtx = nullptr;
  void* context = nullptr;
  void* algorithm = nullptr;

  int blockSize() const noexcept { return callEntry(pQEL_EVP_CIPHER_block_size, qelCtx, algorithm); }
  int vectorLength() const noexcept { return callEntry(pQEL_EVP_CIPHER_iv_length, qelCtx, algorithm); }
  int setPadding(int padding) const noexcept {
    return callEntry(pQEL_EVP_CIPHER_CTX_set_padding, qelCtx, context, padding);
  }
};

using InitContext = int (*)(void* qelCtx, void** context, const char* name, void** algorithm);
using FreeContext = int (*)(void* qelCtx, void* context);

// A cipher or digest context of the process-wide provider context, released when it goes.
template <typename Steps, InitContext kInit, FreeContext kFree>
class ContextOwner : public Steps {
 public:
  explicit ContextOwner(void* providerContext) noexcept { this->qelCtx = providerContext; }
  ~ContextOwner() {
    if (this->context != nullptr) kFree(this->qelCtx, this->context);
  }
  ContextOwner(const ContextOwner&) = delete;
  ContextOwner& operator=(const ContextOwner&) = delete;

  int open(const char* name) noexcept { return kInit(this->qelCtx, &this->context, name, &this->algorithm); }
};

using CipherOwner = ContextOwner<Cipher, initQelCipher, freeQelCipher>;
using DigestOwner = ContextOwner<Digest, initQelDigest, freeQelDigest>;

}  // namespace ldappw
