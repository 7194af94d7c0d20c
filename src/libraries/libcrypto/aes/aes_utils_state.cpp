// SPDX-License-Identifier: Apache-2.0
// The process-wide key state that password formatting reads.
#include "aes_keys.h"

#include <cstring>

#include "support/owners.h"
#include "support/trace_scope.h"

namespace ldappw {
namespace {

constexpr TraceInfo kGetCfg = accessor(kAesUtils, 8, "getCfgKeyDataGlobal");
constexpr TraceInfo kGetDir = accessor(kAesUtils, 9, "getDirKeyDataGlobal");
constexpr TraceInfo kSetCfgSync = accessor(kAesUtils, 10, "setCfgCryptoSyncGlobal", {"cryptoSync"});
constexpr TraceInfo kSetCipherName = accessor(kAesUtils, 11, "setCipherNameGlobal");

}  // namespace
}  // namespace ldappw

using namespace ldappw;

extern "C" {

// Documented in aes_keys.h.

AesKeyData* g_CfgKeyData = nullptr;
AesKeyData* g_DirKeyData = nullptr;
char* g_CfgCryptoSync = nullptr;
const char* g_CipherName[3] = {nullptr, nullptr, nullptr};

AesKeyData* getCfgKeyDataGlobal(void) noexcept {
  const TracedCall call{kGetCfg};
  return g_CfgKeyData;
}

AesKeyData* getDirKeyDataGlobal(void) noexcept {
  const TracedCall call{kGetDir};
  return g_DirKeyData;
}

int setCfgCryptoSyncGlobal(const char* cryptoSync) noexcept {
  TracedCall call{kSetCfgSync, cryptoSync};
  if (cryptoSync == nullptr) return call.leave(LDAPPW_OPERATIONS_ERROR);
  if (g_CfgCryptoSync == nullptr) g_CfgCryptoSync = newText(cryptoSync);
  return call.leave(g_CfgCryptoSync != nullptr ? LDAPPW_SUCCESS : LDAPPW_NO_MEMORY);
}

int setCipherNameGlobal(void) noexcept {
  TracedCall call{kSetCipherName};
  if (g_CipherName[0] == nullptr) {
    g_CipherName[0] = "AES-128-ECB";
    g_CipherName[1] = "AES-192-ECB";
    g_CipherName[2] = "AES-256-ECB";
  }
  return call.leave(LDAPPW_SUCCESS);
}

}  // extern "C"
