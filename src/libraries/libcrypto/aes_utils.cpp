// SPDX-License-Identifier: Apache-2.0
// The key data record, and the process-wide key state that password formatting reads.
#include <cstddef>
#include <cstring>

#include "aes_internal.h"
#include "owners.h"
#include "trace_scope.h"

static_assert(offsetof(AesKeyData, cryptoSync) == 0 && offsetof(AesKeyData, cryptoSalt) == sizeof(SecBuffer) &&
                  offsetof(AesKeyData, aesKeys) == 2 * sizeof(SecBuffer) && sizeof(SecBuffer) == 2 * sizeof(void*) &&
                  sizeof(AesKeyData) == 5 * sizeof(SecBuffer),
              "servers reach into this record");

namespace ldappw {
namespace {

constexpr TraceInfo operation(const char* name, unsigned function) {
  return {name, operationScope(moduleId(kAesUtils, function)), LineClass::error};
}
constexpr TraceInfo accessor(const char* name, unsigned function) {
  return {name, smallScope(moduleId(kAesUtils, function)), LineClass::error};
}

constexpr TraceInfo kInit = operation("initAesKeyData", 1);
constexpr TraceInfo kCopy = operation("copyAesKeyData", 2);
constexpr TraceInfo kFree = operation("freeAesKeyData", 3);
constexpr TraceInfo kSet = operation("setAESKeyData", 4);
constexpr TraceInfo kCheck = operation("checkKeyStashFile", 5);
constexpr TraceInfo kSetCfg = accessor("setCfgKeyDataGlobal", 6);
constexpr TraceInfo kSetDir = accessor("setDirKeyDataGlobal", 7);
constexpr TraceInfo kGetCfg = accessor("getCfgKeyDataGlobal", 8);
constexpr TraceInfo kGetDir = accessor("getDirKeyDataGlobal", 9);
constexpr TraceInfo kSetCfgSync = accessor("setCfgCryptoSyncGlobal", 10);
constexpr TraceInfo kSetCipherName = accessor("setCipherNameGlobal", 11);

constexpr uint32_t kKeyLengths[3] = {16, 24, 32};
constexpr uint32_t kSaltLength = 12;

void release(SecBuffer& buffer) noexcept {
  wipeAndFree(buffer.data);
}

bool allocate(SecBuffer& buffer, size_t bytes) noexcept {
  buffer.data = zeroedBytes<unsigned char>(bytes);
  return buffer.data != nullptr;
}

bool copyText(SecBuffer& copy, const SecBuffer& original) noexcept {
  copy.length = original.length;
  if (!allocate(copy, size_t{original.length} + 1)) return false;
  std::memcpy(copy.data, original.data, size_t{original.length} + 1);
  return true;
}

// The copy's length is the key's own, so its buffer never has less.
bool copyKey(SecBuffer& copy, const SecBuffer& original, uint32_t keyLength) noexcept {
  copy.length = keyLength;
  if (!allocate(copy, original.length > keyLength ? original.length : keyLength)) return false;
  std::memcpy(copy.data, original.data, original.length);
  return true;
}

bool isComplete(const AesKeyData& record) noexcept {
  return record.cryptoSync.data != nullptr && record.cryptoSalt.data != nullptr && record.aesKeys[0].data != nullptr &&
         record.aesKeys[1].data != nullptr && record.aesKeys[2].data != nullptr;
}

// Whether a text is the one in the buffer; the time depends on the lengths alone.
bool sameText(const char* text, const SecBuffer& buffer) noexcept {
  if (buffer.data == nullptr) return false;
  const char* other = reinterpret_cast<const char*>(buffer.data);
  const size_t length = std::strlen(text);
  return length == std::strlen(other) && equalBytes(text, other, length);
}

int loadRecord(const char* keyStashFile, AesKeyData** keyData) noexcept {
  if (const int rc = initAesKeyData(keyData); rc != LDAPPW_SUCCESS) return rc;
  RecordGuard record(keyData);
  if (const int rc = readKeyStashFile(keyStashFile, *keyData); rc != LDAPPW_SUCCESS) return rc;
  record.keep();
  return setCipherNameGlobal();
}

int setGlobal(const TraceInfo& info, const char* keyStashFile, AesKeyData*& global) noexcept {
  TracedCall call{info, "keyStashFile", keyStashFile};
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
  TracedCall call{kSetCfgSync, "cryptoSync", cryptoSync};
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

int initAesKeyData(AesKeyData** keyData) noexcept {
  TracedCall call{kInit, "keyData", keyData};
  if (keyData == nullptr) return call.fail(LDAPPW_OPERATIONS_ERROR, "Invalid parameter.");
  *keyData = zeroedBytes<AesKeyData>(sizeof(AesKeyData));
  RecordGuard record(keyData);
  if (*keyData == nullptr) return call.fail(LDAPPW_NO_MEMORY, "calloc(keyData) returned NULL.");
  AesKeyData& data = **keyData;
  data.cryptoSalt.length = kSaltLength;
  if (!allocate(data.cryptoSalt, kSaltLength + 1)) {
    return call.fail(LDAPPW_NO_MEMORY, "calloc(cryptoSalt) returned NULL.");
  }
  for (unsigned i = 0; i < 3; ++i) {
    data.aesKeys[i].length = kKeyLengths[i];
    if (!allocate(data.aesKeys[i], kKeyLengths[i])) {
      return call.fail(LDAPPW_NO_MEMORY, "calloc(aesKeys) returned NULL.");
    }
  }
  record.keep();
  return call.leave(LDAPPW_SUCCESS);
}

int copyAesKeyData(const AesKeyData* keyDataOrig, AesKeyData** keyDataCopy) noexcept {
  TracedCall call{kCopy, "keyDataOrig", keyDataOrig, "keyDataCopy", keyDataCopy};
  if (keyDataOrig == nullptr || keyDataCopy == nullptr || !isComplete(*keyDataOrig)) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "Invalid parameter.");
  }
  *keyDataCopy = zeroedBytes<AesKeyData>(sizeof(AesKeyData));
  RecordGuard record(keyDataCopy);
  if (*keyDataCopy == nullptr) return call.fail(LDAPPW_NO_MEMORY, "calloc(keyDataCopy) returned NULL.");
  AesKeyData& copy = **keyDataCopy;
  // The message names the salt for the sync text too: meant.
  if (!copyText(copy.cryptoSalt, keyDataOrig->cryptoSalt) || !copyText(copy.cryptoSync, keyDataOrig->cryptoSync)) {
    return call.fail(LDAPPW_NO_MEMORY, "calloc(cryptoSalt) returned NULL.");
  }
  for (unsigned i = 0; i < 3; ++i) {
    if (!copyKey(copy.aesKeys[i], keyDataOrig->aesKeys[i], kKeyLengths[i])) {
      return call.fail(LDAPPW_NO_MEMORY, "calloc(aesKeys) returned NULL.");
    }
  }
  record.keep();
  return call.leave(LDAPPW_SUCCESS);
}

int freeAesKeyData(AesKeyData* keyData) noexcept {
  TracedCall call{kFree, "keyData", keyData};
  if (keyData != nullptr) {
    for (SecBuffer& key : keyData->aesKeys) release(key);
    release(keyData->cryptoSync);
    release(keyData->cryptoSalt);
    std::free(keyData);
  }
  return call.leave(LDAPPW_SUCCESS);
}

int setAESKeyData(const char* keyStashFile, AesKeyData** keyData) noexcept {
  TracedCall call{kSet, "keyStashFile", keyStashFile, "keyData", keyData};
  if (keyData == nullptr) return call.fail(LDAPPW_OPERATIONS_ERROR, "Invalid parameter.");
  return call.leave(loadRecord(keyStashFile, keyData));
}

int checkKeyStashFile(int type, const AesKeyData* keyData, const char* cryptoSync, const char* cryptoSalt,
                      int* isMatch) noexcept {
  TracedCall call{kCheck, "keyData", keyData, "cryptoSync", cryptoSync, "cryptoSalt", cryptoSalt, "isMatch", isMatch};
  if (keyData == nullptr || cryptoSync == nullptr || cryptoSalt == nullptr || isMatch == nullptr) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "Invalid parameter.");
  }
  *isMatch = 0;
  if (type != 0 && type != 1) return call.leave(LDAPPW_OPERATIONS_ERROR);
  const bool sync = sameText(cryptoSync, keyData->cryptoSync);
  const bool salt = type == 0 || sameText(cryptoSalt, keyData->cryptoSalt);
  *isMatch = sync && salt ? 1 : 0;
  return call.leave(LDAPPW_SUCCESS);
}

}  // extern "C"
