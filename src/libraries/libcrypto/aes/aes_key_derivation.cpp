// SPDX-License-Identifier: Apache-2.0
// Key derivation in the shape of PBKDF2 (RFC 2898, section 5.2), with a plain digest as its pseudo-random function.
#include "aes/aes_key_derivation.h"

#include <cstring>

#include "aes_keys.h"
#include "support/owners.h"
#include "support/trace_scope.h"

namespace ldappw {
namespace {

constexpr TraceInfo kPbkdf2 =
    operation(kAesKey, 1, "morva_pbkdf2", {"qelCtx", "digestCtx", "digest", "seed", "salt", "derivedKey"});
constexpr TraceInfo kBlock =
    operation(kAesKey, 2, "morva_pkcs5_F", {"qelCtx", "digestCtx", "digest", "seed", "salt", "outBuff"});
constexpr TraceInfo kInitialPrf =
    operation(kAesKey, 3, "morva_pkcs5_initial_prf", {"qelCtx", "digestCtx", "digest", "buffer", "outBuff", "outLen"});

constexpr unsigned kBlockBytes = 20;           // of a derivation block, whatever the digest
constexpr size_t kLargestDigest = 64;          // a longer digest than SHA-1 must not run past the work buffer
constexpr uint64_t kLongestKey = 85899345900;  // (2^32 - 1) blocks

using WorkBuffer = SecretArray<kLargestDigest>;
constexpr size_t kNothingInline = 1;

// Each step of a round runs whatever became of the one before; isWhole becomes false when one has failed.
int morva_pkcs5_initial_prf(const Digest& digest, const unsigned char* buffer, uint32_t length, uint32_t blockIndex,
                            unsigned char* outBuff, unsigned* outLen, bool& isWhole) noexcept {
  TracedCall call{kInitialPrf, digest.qelCtx, digest.context, digest.algorithm, buffer, outBuff, outLen};
  if (!digest.isComplete() || anyNull(buffer, outBuff)) return call.invalid();
  const unsigned char index[4] = {static_cast<unsigned char>(blockIndex >> 24U),
                                  static_cast<unsigned char>(blockIndex >> 16U),
                                  static_cast<unsigned char>(blockIndex >> 8U), static_cast<unsigned char>(blockIndex)};
  *outLen = 0;
  isWhole &= digest.init() == 1;
  isWhole &= digest.update(buffer, length) == 1;
  isWhole &= digest.update(index, sizeof index) == 1;
  isWhole &= digest.final(outBuff, outLen) == 1;
  return call.leave(LDAPPW_SUCCESS);
}

// Runs thousands of times a key, so it opens no scope.
int morva_pkcs5_subsequent_prf(const Digest& digest, const unsigned char* in, uint32_t inLen, unsigned char* outBuff,
                               unsigned* outLen, bool& isWhole) noexcept {
  if (!digest.isComplete() || anyNull(in, outBuff)) {
    globalLine(LineClass::error, "Error - morva_pkcs5_subsequent_prf: Invalid parameter. rc = %d\n",
               static_cast<int>(LDAPPW_OPERATIONS_ERROR));
    return LDAPPW_OPERATIONS_ERROR;
  }
  isWhole &= digest.init() == 1;
  isWhole &= digest.update(in, inLen) == 1;
  isWhole &= digest.final(outBuff, outLen) == 1;
  return LDAPPW_SUCCESS;
}

void addBlock(unsigned char* to, const unsigned char* block) noexcept {
  for (unsigned i = 0; i < kBlockBytes; ++i) to[i] = static_cast<unsigned char>(to[i] ^ block[i]);
}

int morva_pkcs5_F(const Digest& digest, const DerivationInput& input, uint32_t blockIndex, unsigned char* outBuff,
                  bool& isWhole) noexcept {
  TracedCall call{kBlock, digest.qelCtx, digest.context, digest.algorithm, input.seed, input.salt, outBuff};
  if (!digest.isComplete() || anyNull(input.seed, input.salt, outBuff)) return call.invalid();
  const auto saltLength = static_cast<uint32_t>(input.saltLength);
  const uint64_t wholeLength = uint64_t{saltLength} + input.seedLength;
  if (wholeLength >= UINT32_MAX) return call.fail(LDAPPW_NO_MEMORY, "calloc() failed.");
  SecretBytes<kNothingInline> whole(static_cast<size_t>(wholeLength) + 1);
  if (!whole) return call.fail(LDAPPW_NO_MEMORY, "calloc() failed.");
  std::memcpy(whole.get(), input.salt, saltLength);
  std::memcpy(whole.get() + saltLength, input.seed, input.seedLength);

  WorkBuffer u;
  unsigned written = 0;
  const auto length = static_cast<uint32_t>(wholeLength);
  if (const int rc = morva_pkcs5_initial_prf(digest, whole.get(), length, blockIndex, u.data(), &written, isWhole);
      rc != 0) {
    return call.fail(rc, "morva_pkcs5_initial_prf() failed.");
  }
  std::memset(outBuff, 0, kBlockBytes);
  for (uint32_t counter = 1; counter < input.iterations; ++counter) {
    addBlock(outBuff, u.data());
    if (const int rc = morva_pkcs5_subsequent_prf(digest, u.data(), kBlockBytes, u.data(), &written, isWhole);
        rc != 0) {
      return call.fail(rc, "morva_pkcs5_subsequent_prf() failed.");
    }
  }
  addBlock(outBuff, u.data());
  return call.leave(LDAPPW_SUCCESS);
}

// A failed step of the provider counts only where the key must be whole.
int derive(const Digest& digest, const DerivationInput& input, unsigned char* derivedKey, uint64_t derivedKeyLen,
           bool mustBeWhole) noexcept {
  TracedCall call{kPbkdf2, digest.qelCtx, digest.context, digest.algorithm, input.seed, input.salt, derivedKey};
  if (!digest.isComplete() || anyNull(input.seed, input.salt, derivedKey)) return call.invalid();
  if (anyNull(pQEL_EVP_DigestInit, pQEL_EVP_DigestUpdate, pQEL_EVP_DigestFinal)) return call.invalid();  // not loaded
  if (derivedKeyLen > kLongestKey) return call.fail(LDAPPW_OPERATIONS_ERROR, "derivedKeyLen too long.");
  bool isWhole = true;
  const uint64_t wholeBlocks = derivedKeyLen / kBlockBytes;
  const auto rest = static_cast<size_t>(derivedKeyLen % kBlockBytes);
  for (uint64_t i = 0; i < wholeBlocks; ++i, derivedKey += kBlockBytes) {
    if (const int rc = morva_pkcs5_F(digest, input, static_cast<uint32_t>(i + 1), derivedKey, isWhole); rc != 0) {
      return call.fail(rc, "morva_pkcs5_F() failed.");
    }
  }
  if (rest != 0) {
    SecretArray<kBlockBytes> last;
    const auto index = static_cast<uint32_t>(wholeBlocks + 1);
    if (const int rc = morva_pkcs5_F(digest, input, index, last.data(), isWhole); rc != 0) {
      return call.fail(rc, "morva_pkcs5_F() failed.");
    }
    std::memcpy(derivedKey, last.data(), rest);
  }
  return call.leave(mustBeWhole && !isWhole ? LDAPPW_OPERATIONS_ERROR : LDAPPW_SUCCESS);
}

}  // namespace

int deriveWhole(const Digest& digest, const DerivationInput& input, unsigned char* derivedKey,
                uint64_t derivedKeyLen) noexcept {
  return derive(digest, input, derivedKey, derivedKeyLen, true);
}

}  // namespace ldappw

using namespace ldappw;

extern "C" {

// Documented in aes_keys.h.

int morva_pbkdf2(void* qelCtx, void* digestCtx, void* digest, const unsigned char* seed, uint32_t seedLen,
                 const unsigned char* salt, uint64_t saltLen, uint32_t iterations, unsigned char* derivedKey,
                 uint64_t derivedKeyLen) noexcept {
  return derive({qelCtx, digestCtx, digest}, {seed, seedLen, salt, saltLen, iterations}, derivedKey, derivedKeyLen,
                false);
}

}  // extern "C"
