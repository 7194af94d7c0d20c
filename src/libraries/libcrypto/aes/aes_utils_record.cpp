// SPDX-License-Identifier: Apache-2.0
// The key data record: made, copied, compared and released.
#include "aes/aes_utils_record.h"

#include <cstddef>
#include <cstring>

#include "support/trace_scope.h"

static_assert(offsetof(AesKeyData, cryptoSync) == 0 && offsetof(AesKeyData, cryptoSalt) == sizeof(SecBuffer) &&
                  offsetof(AesKeyData, aesKeys) == 2 * sizeof(SecBuffer) && sizeof(SecBuffer) == 2 * sizeof(void*) &&
                  sizeof(AesKeyData) == 5 * sizeof(SecBuffer),
              "servers reach into this record");

namespace ldappw {
namespace {

constexpr TraceInfo kInit = operation(kAesUtils, 1, "initAesKeyData", {"keyData"});
constexpr TraceInfo kCopy = operation(kAesUtils, 2, "copyAesKeyData", {"keyDataOrig", "keyDataCopy"});
constexpr TraceInfo kFree = operation(kAesUtils, 3, "freeAesKeyData", {"keyData"});
constexpr TraceInfo kCheck =
    operation(kAesUtils, 5, "checkKeyStashFile", {"keyData", "cryptoSync", "cryptoSalt", "isMatch"});

constexpr uint32_t kKeyLengths[3] = {16, 24, 32};
constexpr uint32_t kSaltLength = 12;

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

// The copy states the key's own length, so its buffer never has less. A longer original is copied whole, and nobody
// knows of the rest later: it is for callers that reach into the buffer.
bool copyKey(SecBuffer& copy, const SecBuffer& original, uint32_t keyLength) noexcept {
  copy.length = keyLength;
  if (!allocate(copy, original.length > keyLength ? original.length : keyLength)) return false;
  std::memcpy(copy.data, original.data, original.length);
  return true;
}

bool isComplete(const AesKeyData& record) noexcept {
  return !anyNull(record.cryptoSync.data, record.cryptoSalt.data, record.aesKeys[0].data, record.aesKeys[1].data,
                  record.aesKeys[2].data);
}

// Whether a text is the one in the buffer; the time depends on the lengths alone.
bool sameText(const char* text, const SecBuffer& buffer) noexcept {
  if (buffer.data == nullptr) return false;
  const char* other = reinterpret_cast<const char*>(buffer.data);
  const size_t length = std::strlen(text);
  return length == std::strlen(other) && equalBytes(text, other, length);
}

}  // namespace
}  // namespace ldappw

using namespace ldappw;

extern "C" {

// Documented in aes_keys.h.

int initAesKeyData(AesKeyData** keyData) noexcept {
  TracedCall call{kInit, keyData};
  if (keyData == nullptr) return call.invalid();
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
  TracedCall call{kCopy, keyDataOrig, keyDataCopy};
  if (anyNull(keyDataOrig, keyDataCopy) || !isComplete(*keyDataOrig)) return call.invalid();
  *keyDataCopy = zeroedBytes<AesKeyData>(sizeof(AesKeyData));
  RecordGuard record(keyDataCopy);
  if (*keyDataCopy == nullptr) return call.fail(LDAPPW_NO_MEMORY, "calloc(keyDataCopy) returned NULL.");
  AesKeyData& copy = **keyDataCopy;
  // One message for both texts: log readers find the salt named for the sync text too.
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
  TracedCall call{kFree, keyData};
  if (keyData != nullptr) {
    for (SecBuffer& key : keyData->aesKeys) release(key);
    release(keyData->cryptoSync);
    release(keyData->cryptoSalt);
    std::free(keyData);
  }
  return call.leave(LDAPPW_SUCCESS);
}

int checkKeyStashFile(int type, const AesKeyData* keyData, const char* cryptoSync, const char* cryptoSalt,
                      int* isMatch) noexcept {
  TracedCall call{kCheck, keyData, cryptoSync, cryptoSalt, isMatch};
  if (anyNull(keyData, cryptoSync, cryptoSalt, isMatch)) return call.invalid();
  *isMatch = 0;
  if (type != 0 && type != 1) return call.leave(LDAPPW_OPERATIONS_ERROR);
  const bool sync = sameText(cryptoSync, keyData->cryptoSync);
  const bool salt = type == 0 || sameText(cryptoSalt, keyData->cryptoSalt);
  *isMatch = sync && salt ? 1 : 0;
  return call.leave(LDAPPW_SUCCESS);
}

}  // extern "C"
