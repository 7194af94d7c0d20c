// SPDX-License-Identifier: Apache-2.0
// Loading stash files, into the process-wide key state or into a record that the caller keeps.
#include "aes/aes_utils_record.h"
#include "support/trace_scope.h"

namespace ldappw {
namespace {

constexpr TraceInfo kSet = operation(kAesUtils, 4, "setAESKeyData", {"keyStashFile", "keyData"});
constexpr TraceInfo kSetCfg = accessor(kAesUtils, 6, "setCfgKeyDataGlobal", {"keyStashFile"});
constexpr TraceInfo kSetDir = accessor(kAesUtils, 7, "setDirKeyDataGlobal", {"keyStashFile"});

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

int setCfgKeyDataGlobal(const char* keyStashFile) noexcept {
  return setGlobal(kSetCfg, keyStashFile, g_CfgKeyData);
}

int setDirKeyDataGlobal(const char* keyStashFile) noexcept {
  return setGlobal(kSetDir, keyStashFile, g_DirKeyData);
}

int setAESKeyData(const char* keyStashFile, AesKeyData** keyData) noexcept {
  TracedCall call{kSet, keyStashFile, keyData};
  if (keyData == nullptr) return call.invalid();
  return call.leave(loadRecord(keyStashFile, keyData));
}

}  // extern "C"
