// SPDX-License-Identifier: Apache-2.0
// The sync text: what two servers compare instead of their keys.
#include <cstring>

#include "aes/aes_key_derivation.h"
#include "aes/aes_utils_record.h"
#include "support/trace_scope.h"

namespace ldappw {
namespace {

constexpr TraceInfo kSyncVal =
    operation(kAesSync, 1, "genKeySyncVal", {"qelCtx", "digestCtx", "digest", "cryptoSeed", "keyData"});
constexpr uint32_t kSyncIterations = 3;

// The buffer that a record had; released last, since the seed may be the text in it.
struct FormerBuffer {
  SecBuffer buffer;
  ~FormerBuffer() { release(buffer); }
};

}  // namespace
}  // namespace ldappw

using namespace ldappw;

extern "C" {

// Documented in aes_keys.h.

int genKeySyncVal(void* qelCtx, void* digestCtx, void* digest, const char* cryptoSeed, AesKeyData* keyData) noexcept {
  TracedCall call{kSyncVal, qelCtx, digestCtx, digest, cryptoSeed, keyData};
  if (anyNull(qelCtx, digestCtx, digest, cryptoSeed, keyData)) return call.invalid();
  SecBuffer& sync = keyData->cryptoSync;
  const FormerBuffer former{sync};
  sync.length = static_cast<uint32_t>(std::strlen(cryptoSeed));
  sync.data = zeroedBytes<unsigned char>(size_t{sync.length} + 1);
  if (sync.data == nullptr) return call.fail(LDAPPW_NO_MEMORY, "calloc(cryptoSync) returned NULL.");
  const DerivationInput input{reinterpret_cast<const unsigned char*>(cryptoSeed), sync.length, keyData->cryptoSalt.data,
                              keyData->cryptoSalt.length, kSyncIterations};
  if (const int rc = deriveWhole({qelCtx, digestCtx, digest}, input, sync.data, sync.length); rc != 0) {
    return call.fail(rc, "morva_pbkdf2() failed.");
  }
  char* text = binaryBlobToBase64(sync.data, static_cast<int>(sync.length));
  if (text == nullptr) return call.fail(LDAPPW_OPERATIONS_ERROR, "binaryBlobToBase64() returned NULL.");
  release(sync);
  sync = {reinterpret_cast<unsigned char*>(text), static_cast<uint32_t>(std::strlen(text))};
  return call.leave(LDAPPW_SUCCESS);
}

}  // extern "C"
