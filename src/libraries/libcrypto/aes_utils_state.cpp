// SPDX-License-Identifier: Apache-2.0
// The process-wide key state that password formatting reads, loaded from stash files, and the loading of a record for a
// caller that keeps its own.
#include <cstring>

#include "aes_utils_record.h"
#include "trace_scope.h"

namespace ldappw {
namespace {

constexpr TraceInfo kSet = operation(kAesUtils, 4, "setAESKeyData", {"keyStashFile", "keyData"});
constexpr TraceInfo kSetCfg = accessor(kAesUtils, 6, "setCfgKeyDataGlobal", {"keyStashFile"});
constexpr TraceInfo kSetDir = accessor(kAesUtils, 7, "setDirKeyDataGlobal", {"keyStashFile"});
constexpr TraceInfo kGetCfg = accessor(kAesUtils, 8, "getCfgKeyDataGlobal");
constexpr TraceInfo kGetDir = accessor(kAesUtils, 9, "getDirKeyDataGlobal");
constexpr TraceInfo kSetCfgSync = accessor(kAesUtils, 10, "setCfgCryptoSyncGlobal", {"cryptoSync"});
constexpr TraceInfo kSetCipherName = accessor(kAesUtils, 11, "setCipherNameGlobal");

int loadRecord(const char* keyStashFile, AesKeyData** keyData) noexcept {
  if (const int rc = initAesKeyData(keyData); rc != LDAPPW_SUCCESS) return rc;
  RecordGuard record(keyData);
  if (const int rc = readKeyStashFile(keyStashFile, *keyData); rc != LDAPPW_SUCCESS) return rc;
  record.keep();
  return setCipherNameGlobal();
}

int setGlobal(const TraceInfo& info, const char* keyStashFile, AesKeyData*& global) noexcept {
  TracedCall call{info, keyStashFile};
  if (global != nullptr) return call.leave(LDAPPW_SUCCESS);
  AesKeyData* keyData = nullptr;
  const int rc = loadRecord(keyStashFile, &keyData);
  if (rc == LDAPPW_SUCCESS) global = keyData;
  return call.leave(rc);
}

}  // namespace
}  // namespace ldappw

using namespace ldappw;

extern "C" {

// Documented in aes_keys.h.

AesKeyData* g_CfgKeyData = nullptr;
AesKeyData* g_DirKeyData = nullptr;
char* g_CfgCryptoSync = nullptr;
const char* g_CipherName[3] = {nullptr, nullptr, nullptr};

int setCfgKeyDataGlobal(const char* keyStashFile) noexcept {
  return setGlobal(kSetCfg, keyStashFile, g_CfgKeyData);
}

int setDirKeyDataGlobal(const char* keyStashFile) noexcept {
  return setGlobal(kSetDir, keyStashFile, g_DirKeyData);
}

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
  if (g_CfgCryptoSync == nullptr) g_CfgCryptoSync = strdup(cryptoSync);
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

int setAESKeyData(const char* keyStashFile, AesKeyData** keyData) noexcept {
  TracedCall call{kSet, keyStashFile, keyData};
  if (keyData == nullptr) return call.invalid();
  return call.leave(loadRecord(keyStashFile, keyData));
}

}  // extern "C"
