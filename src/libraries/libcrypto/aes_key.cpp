// SPDX-License-Identifier: Apache-2.0
// Key derivation in the shape of PBKDF2, and the making of complete key data records.
#include <cstring>

#include "aes_internal.h"
#include "qel_utils.h"
#include "trace_scope.h"

namespace ldappw {
namespace {

constexpr TraceInfo operation(const char* name, unsigned function) {
  return {name, operationScope(moduleId(kAesKey, function)), LineClass::error};
}

constexpr TraceInfo kPbkdf2 = operation("morva_pbkdf2", 1);
constexpr TraceInfo kBlock = operation("morva_pkcs5_F", 2);
constexpr TraceInfo kInitialPrf = operation("morva_pkcs5_initial_prf", 3);
constexpr TraceInfo kKeyDataVal = operation("genKeyDataVal", 4);
constexpr TraceInfo kTmpKeyDataVal = operation("genTmpKeyDataVal", 5);
constexpr TraceInfo kGrowKeys = operation("growKeysFromSeed", 6);

constexpr unsigned kBlockBytes = 20;           // of a derivation block, whatever the digest
constexpr size_t kLargestDigest = 64;          // a longer digest than SHA-1 must not run past the work buffer
constexpr uint64_t kLongestKey = 85899345900;  // (2^32 - 1) blocks
constexpr uint32_t kKeyIterations = 10000;
constexpr unsigned kRandomSeedSize = 13;
constexpr char kDigestName[] = "SHA1";

// The pseudo-random function: a digest and its context.
struct Prf {
  void* qelCtx;
  void* digestCtx;
  void* digest;
  bool complete() const noexcept { return qelCtx != nullptr && digestCtx != nullptr && digest != nullptr; }
};

struct Bytes {
  const unsigned char* data;
  uint32_t length;
};

using WorkBuffer = SecretArray<kLargestDigest>;

// The results of the digest calls are not looked at, here and below: the derivation reports argument and memory
// failures alone.
int morva_pkcs5_initial_prf(const Prf& prf, const Bytes& input, uint32_t blockIndex, unsigned char* outBuff,
                            unsigned* outLen) noexcept {
  TracedCall call{kInitialPrf, "qelCtx",   prf.qelCtx, "digestCtx", prf.digestCtx, "digest", prf.digest,
                  "buffer",    input.data, "outBuff",  outBuff,     "outLen",      outLen};
  if (!prf.complete() || input.data == nullptr || outBuff == nullptr) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "Invalid parameter.");
  }
  const unsigned char index[4] = {static_cast<unsigned char>(blockIndex >> 24U),
                                  static_cast<unsigned char>(blockIndex >> 16U),
                                  static_cast<unsigned char>(blockIndex >> 8U), static_cast<unsigned char>(blockIndex)};
  *outLen = 0;
  pQEL_EVP_DigestInit(prf.qelCtx, prf.digestCtx, prf.digest);
  pQEL_EVP_DigestUpdate(prf.qelCtx, prf.digestCtx, input.data, input.length);
  pQEL_EVP_DigestUpdate(prf.qelCtx, prf.digestCtx, index, sizeof index);
  pQEL_EVP_DigestFinal(prf.qelCtx, prf.digestCtx, outBuff, outLen);
  return call.leave(LDAPPW_SUCCESS);
}

// Runs thousands of times a key, so it opens no scope.
int morva_pkcs5_subsequent_prf(const Prf& prf, const unsigned char* in, uint32_t inLen, unsigned char* outBuff,
                               unsigned* outLen) noexcept {
  if (!prf.complete() || in == nullptr || outBuff == nullptr) {
    globalLine(LineClass::error, "Error - morva_pkcs5_subsequent_prf: Invalid parameter. rc = %d\n",
               static_cast<int>(LDAPPW_OPERATIONS_ERROR));
    return LDAPPW_OPERATIONS_ERROR;
  }
  pQEL_EVP_DigestInit(prf.qelCtx, prf.digestCtx, prf.digest);
  pQEL_EVP_DigestUpdate(prf.qelCtx, prf.digestCtx, in, inLen);
  pQEL_EVP_DigestFinal(prf.qelCtx, prf.digestCtx, outBuff, outLen);
  return LDAPPW_SUCCESS;
}

void addBlock(unsigned char* to, const unsigned char* block) noexcept {
  for (unsigned i = 0; i < kBlockBytes; ++i) to[i] = static_cast<unsigned char>(to[i] ^ block[i]);
}

int morva_pkcs5_F(const Prf& prf, const Bytes& seed, const Bytes& salt, uint32_t iterations, uint32_t blockIndex,
                  unsigned char* outBuff) noexcept {
  TracedCall call{kBlock, "qelCtx",  prf.qelCtx, "digestCtx", prf.digestCtx, "digest", prf.digest,
                  "seed", seed.data, "salt",     salt.data,   "outBuff",     outBuff};
  if (!prf.complete() || seed.data == nullptr || salt.data == nullptr || outBuff == nullptr) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "Invalid parameter.");
  }
  const uint64_t inputBytes = uint64_t{salt.length} + seed.length;
  SecretOwner<unsigned char> input;
  if (inputBytes < UINT32_MAX) input.reset(zeroedBytes<unsigned char>(static_cast<size_t>(inputBytes) + 1));
  if (!input) return call.fail(LDAPPW_NO_MEMORY, "calloc() failed.");
  std::memcpy(input.get(), salt.data, salt.length);
  std::memcpy(input.get() + salt.length, seed.data, seed.length);

  WorkBuffer u;
  unsigned written = 0;
  const Bytes whole{input.get(), static_cast<uint32_t>(inputBytes)};
  if (const int rc = morva_pkcs5_initial_prf(prf, whole, blockIndex, u.data(), &written); rc != 0) {
    return call.fail(rc, "morva_pkcs5_initial_prf() failed.");
  }
  std::memset(outBuff, 0, kBlockBytes);
  for (uint32_t counter = 1; counter < iterations; ++counter) {
    addBlock(outBuff, u.data());
    if (const int rc = morva_pkcs5_subsequent_prf(prf, u.data(), kBlockBytes, u.data(), &written); rc != 0) {
      return call.fail(rc, "morva_pkcs5_subsequent_prf() failed.");
    }
  }
  addBlock(outBuff, u.data());
  return call.leave(LDAPPW_SUCCESS);
}

// The record's salt: a copy of the user's text, or random.
int setSalt(TracedCall& call, void* qelCtx, const char* userCryptoSalt, AesKeyData& keyData) noexcept {
  if (userCryptoSalt == nullptr) {
    const int rc = genKeySaltVal(qelCtx, &keyData);
    return rc == LDAPPW_SUCCESS ? rc : call.fail(rc, "genKeySaltVal() failed.");
  }
  char* copy = strdup(userCryptoSalt);
  if (copy == nullptr) return call.fail(LDAPPW_NO_MEMORY, "strdup() returned NULL.");
  wipeAndFree(keyData.cryptoSalt.data);
  keyData.cryptoSalt = {reinterpret_cast<unsigned char*>(copy), static_cast<uint32_t>(std::strlen(copy))};
  return LDAPPW_SUCCESS;
}

}  // namespace
}  // namespace ldappw

using namespace ldappw;

extern "C" {

// Documented in aes_keys.h.

int morva_pbkdf2(void* qelCtx, void* digestCtx, void* digest, const unsigned char* seed, uint32_t seedLen,
                 const unsigned char* salt, uint64_t saltLen, uint32_t iterations, unsigned char* derivedKey,
                 uint64_t derivedKeyLen) noexcept {
  TracedCall call{kPbkdf2, "qelCtx", qelCtx, "digestCtx", digestCtx,    "digest",  digest,
                  "seed",  seed,     "salt", salt,        "derivedKey", derivedKey};
  const Prf prf{qelCtx, digestCtx, digest};
  if (!prf.complete() || seed == nullptr || salt == nullptr || derivedKey == nullptr) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "Invalid parameter.");
  }
  if (derivedKeyLen > kLongestKey) return call.fail(LDAPPW_OPERATIONS_ERROR, "derivedKeyLen too long.");
  const Bytes seedBytes{seed, seedLen};
  const Bytes saltBytes{salt, static_cast<uint32_t>(saltLen)};
  const uint64_t wholeBlocks = derivedKeyLen / kBlockBytes;
  const auto rest = static_cast<size_t>(derivedKeyLen % kBlockBytes);
  for (uint64_t i = 0; i < wholeBlocks; ++i, derivedKey += kBlockBytes) {
    const auto index = static_cast<uint32_t>(i + 1);
    if (const int rc = morva_pkcs5_F(prf, seedBytes, saltBytes, iterations, index, derivedKey); rc != 0) {
      return call.fail(rc, "morva_pkcs5_F() failed.");
    }
  }
  if (rest != 0) {
    SecretArray<kBlockBytes> last;
    const auto index = static_cast<uint32_t>(wholeBlocks + 1);
    if (const int rc = morva_pkcs5_F(prf, seedBytes, saltBytes, iterations, index, last.data()); rc != 0) {
      return call.fail(rc, "morva_pkcs5_F() failed.");
    }
    std::memcpy(derivedKey, last.data(), rest);
  }
  return call.leave(LDAPPW_SUCCESS);
}

int growKeysFromSeed(void* qelCtx, void* digestCtx, void* digest, const char* cryptoSeed,
                     AesKeyData* keyData) noexcept {
  TracedCall call{kGrowKeys, "qelCtx",     qelCtx,     "digestCtx", digestCtx, "digest",
                  digest,    "cryptoSeed", cryptoSeed, "keyData",   keyData};
  if (qelCtx == nullptr || digestCtx == nullptr || digest == nullptr || cryptoSeed == nullptr || keyData == nullptr) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "Invalid parameter.");
  }
  const auto seedLength = static_cast<uint32_t>(std::strlen(cryptoSeed));
  for (const SecBuffer& key : keyData->aesKeys) {
    const int rc =
        morva_pbkdf2(qelCtx, digestCtx, digest, reinterpret_cast<const unsigned char*>(cryptoSeed), seedLength,
                     keyData->cryptoSalt.data, keyData->cryptoSalt.length, kKeyIterations, key.data, key.length);
    if (rc != 0) return call.fail(rc, "morva_pbkdf2() failed.");
  }
  return call.leave(LDAPPW_SUCCESS);
}

int genKeyDataVal(void* qelCtx, void* digestCtx, void* digest, const char* userCryptoSeed, const char* userCryptoSalt,
                  AesKeyData** keyData) noexcept {
  TracedCall call{kKeyDataVal,      "qelCtx",       qelCtx,           "digestCtx",    digestCtx, "digest", digest,
                  "userCryptoSeed", userCryptoSeed, "userCryptoSalt", userCryptoSalt, "keyData", keyData};
  if (qelCtx == nullptr || digestCtx == nullptr || digest == nullptr || keyData == nullptr) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "Invalid parameter.");
  }
  RecordGuard record(keyData);
  SecretOwner<char> randomSeed;
  if (userCryptoSeed == nullptr) {
    randomSeed.reset(zeroedBytes<char>(kRandomSeedSize));
    if (!randomSeed) return call.fail(LDAPPW_NO_MEMORY, "calloc() returned NULL.");
    auto* buffer = reinterpret_cast<unsigned char*>(randomSeed.get());
    if (const int rc = morva_rand_ascii(qelCtx, buffer, kRandomSeedSize); rc != 0) {
      return call.fail(rc, "morva_rand_ascii() failed.");
    }
  }
  const char* seed = userCryptoSeed != nullptr ? userCryptoSeed : randomSeed.get();
  if (const int rc = initAesKeyData(keyData); rc != 0) return call.fail(rc, "initAesKeyData() failed.");
  if (const int rc = setSalt(call, qelCtx, userCryptoSalt, **keyData); rc != 0) return rc;
  if (const int rc = genKeySyncVal(qelCtx, digestCtx, digest, seed, *keyData); rc != 0) {
    return call.fail(rc, "genKeySyncVal() failed.");
  }
  if (const int rc = growKeysFromSeed(qelCtx, digestCtx, digest, seed, *keyData); rc != 0) {
    return call.fail(rc, "growKeysFromSeed() failed.");
  }
  record.keep();
  return call.leave(LDAPPW_SUCCESS);
}

int genTmpKeyDataVal(const char* userCryptoSeed, const char* userCryptoSalt, AesKeyData** keyData) noexcept {
  TracedCall call{kTmpKeyDataVal, "userCryptoSeed", userCryptoSeed, "userCryptoSalt",
                  userCryptoSalt, "keyData",        keyData};
  if (userCryptoSeed == nullptr || userCryptoSalt == nullptr || keyData == nullptr) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "Invalid parameter.");
  }
  void* qelCtx = nullptr;
  RecordGuard record(keyData);
  if (const int rc = initQelCrypto(&qelCtx); rc != 0) return call.fail(rc, "initQelCrypto() failed.");
  DigestContext digest(qelCtx);
  if (const int rc = digest.init(kDigestName); rc != 0) return call.fail(rc, "initQelDigest() failed.");
  if (const int rc = genKeyDataVal(qelCtx, digest.get(), digest.algorithm(), userCryptoSeed, userCryptoSalt, keyData);
      rc != 0) {
    return call.fail(rc, "genKeyDataVal() failed.");
  }
  record.keep();
  return call.leave(LDAPPW_SUCCESS);
}

}  // extern "C"
