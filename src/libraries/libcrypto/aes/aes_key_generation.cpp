// SPDX-License-Identifier: Apache-2.0
// Complete key data records from a seed and a salt.
#include <cstring>

#include "aes/aes_key_derivation.h"
#include "aes/aes_utils_record.h"
#include "support/trace_scope.h"

namespace ldappw {
namespace {

constexpr TraceInfo kKeyDataVal = operation(
    kAesKey, 4, "genKeyDataVal", {"qelCtx", "digestCtx", "digest", "userCryptoSeed", "userCryptoSalt", "keyData"});
constexpr TraceInfo kTmpKeyDataVal =
    operation(kAesKey, 5, "genTmpKeyDataVal", {"userCryptoSeed", "userCryptoSalt", "keyData"});
constexpr TraceInfo kGrowKeys =
    operation(kAesKey, 6, "growKeysFromSeed", {"qelCtx", "digestCtx", "digest", "cryptoSeed", "keyData"});

constexpr uint32_t kKeyIterations = 10000;
constexpr unsigned kRandomSeedSize = 13;
constexpr char kDigestName[] = "SHA1";

// The record's salt: a copy of the user's text, or random.
int setSalt(TracedCall& call, void* qelCtx, const char* userCryptoSalt, AesKeyData& keyData) noexcept {
  if (userCryptoSalt == nullptr) {
    const int rc = genKeySaltVal(qelCtx, &keyData);
    return rc == LDAPPW_SUCCESS ? rc : call.fail(rc, "genKeySaltVal() failed.");
  }
  char* copy = newText(userCryptoSalt);
  if (copy == nullptr) return call.fail(LDAPPW_NO_MEMORY, "strdup() returned NULL.");
  release(keyData.cryptoSalt);
  keyData.cryptoSalt = {reinterpret_cast<unsigned char*>(copy), static_cast<uint32_t>(std::strlen(copy))};
  return LDAPPW_SUCCESS;
}

}  // namespace
}  // namespace ldappw

using namespace ldappw;

extern "C" {

// Documented in aes_keys.h.

int growKeysFromSeed(void* qelCtx, void* digestCtx, void* digest, const char* cryptoSeed,
                     AesKeyData* keyData) noexcept {
  TracedCall call{kGrowKeys, qelCtx, digestCtx, digest, cryptoSeed, keyData};
  if (anyNull(qelCtx, digestCtx, digest, cryptoSeed, keyData)) return call.invalid();
  const DerivationInput input{reinterpret_cast<const unsigned char*>(cryptoSeed),
                              static_cast<uint32_t>(std::strlen(cryptoSeed)), keyData->cryptoSalt.data,
                              keyData->cryptoSalt.length, kKeyIterations};
  for (const SecBuffer& key : keyData->aesKeys) {
    if (const int rc = deriveWhole({qelCtx, digestCtx, digest}, input, key.data, key.length); rc != 0) {
      return call.fail(rc, "morva_pbkdf2() failed.");
    }
  }
  return call.leave(LDAPPW_SUCCESS);
}

int genKeyDataVal(void* qelCtx, void* digestCtx, void* digest, const char* userCryptoSeed, const char* userCryptoSalt,
                  AesKeyData** keyData) noexcept {
  TracedCall call{kKeyDataVal, qelCtx, digestCtx, digest, userCryptoSeed, userCryptoSalt, keyData};
  if (anyNull(qelCtx, digestCtx, digest, keyData)) return call.invalid();
  RecordGuard record(keyData);
  SecretText randomSeed;
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
  TracedCall call{kTmpKeyDataVal, userCryptoSeed, userCryptoSalt, keyData};
  if (anyNull(userCryptoSeed, userCryptoSalt, keyData)) return call.invalid();
  void* qelCtx = nullptr;
  RecordGuard record(keyData);
  if (const int rc = initQelCrypto(&qelCtx); rc != 0) return call.fail(rc, "initQelCrypto() failed.");
  DigestOwner digest(qelCtx);
  if (const int rc = digest.open(kDigestName); rc != 0) return call.fail(rc, "initQelDigest() failed.");
  if (const int rc = genKeyDataVal(qelCtx, digest.context, digest.algorithm, userCryptoSeed, userCryptoSalt, keyData);
      rc != 0) {
    return call.fail(rc, "genKeyDataVal() failed.");
  }
  record.keep();
  return call.leave(LDAPPW_SUCCESS);
}

}  // extern "C"
