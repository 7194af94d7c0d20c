// SPDX-License-Identifier: Apache-2.0
// The sync text: what two servers compare instead of their keys.
#include <cstring>

#include "aes_keys.h"
#include "owners.h"
#include "trace_scope.h"

namespace ldappw {
namespace {

constexpr TraceInfo kSyncVal{"genKeySyncVal", operationScope(moduleId(kAesSync, 1)), LineClass::error};
constexpr uint32_t kSyncIterations = 3;

}  // namespace
}  // namespace ldappw

using namespace ldappw;

extern "C" {

// Documented in aes_keys.h.

int genKeySyncVal(void* qelCtx, void* digestCtx, void* digest, const char* cryptoSeed, AesKeyData* keyData) noexcept {
  TracedCall call{kSyncVal, "qelCtx",     qelCtx,     "digestCtx", digestCtx, "digest",
                  digest,   "cryptoSeed", cryptoSeed, "keyData",   keyData};
  if (qelCtx == nullptr || digestCtx == nullptr || digest == nullptr || cryptoSeed == nullptr || keyData == nullptr) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "Invalid parameter.");
  }
  SecBuffer& sync = keyData->cryptoSync;
  wipeAndFree(sync.data);
  sync.length = static_cast<uint32_t>(std::strlen(cryptoSeed));
  sync.data = zeroedBytes<unsigned char>(size_t{sync.length} + 1);
  if (sync.data == nullptr) return call.fail(LDAPPW_NO_MEMORY, "calloc(cryptoSync) returned NULL.");
  const int rc =
      morva_pbkdf2(qelCtx, digestCtx, digest, reinterpret_cast<const unsigned char*>(cryptoSeed), sync.length,
                   keyData->cryptoSalt.data, keyData->cryptoSalt.length, kSyncIterations, sync.data, sync.length);
  if (rc != 0) return call.fail(rc, "morva_pbkdf2() failed.");
  char* text = binaryBlobToBase64(sync.data, static_cast<int>(sync.length));
  if (text == nullptr) return call.fail(LDAPPW_OPERATIONS_ERROR, "binaryBlobToBase64() returned NULL.");
  wipeAndFree(sync.data);
  sync = {reinterpret_cast<unsigned char*>(text), static_cast<uint32_t>(std::strlen(text))};
  return call.leave(LDAPPW_SUCCESS);
}

}  // extern "C"
