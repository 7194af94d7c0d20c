// SPDX-License-Identifier: Apache-2.0
// Turning reversible values back into clear text.
#include "passwords/rdbm_pwd_reverse.h"

#include <cstring>

#include "passwords/rdbm_pwd.h"
#include "support/owners.h"

namespace ldappw {
namespace {

constexpr TraceInfo kUnformatPassword = passwordOperation("unformat_password", kUnformatPasswordId);

constexpr size_t kMaskedCharacters = 164;
constexpr size_t kLongestUnmasked = 170;
constexpr int kReversibleBit = 0x80;

int unmaskValue(const char* value, char** clear, int* clearLength) noexcept {
  const char* payload = value[0] == '>' ? value : value + kSchemes[kMaskedRow].tagBytes;
  const int rc = unmaskPayload(payload, strnlen(payload, kMaskedCharacters), clear);
  if (rc == 0 && *clear != nullptr && std::strlen(*clear) <= kLongestUnmasked) {
    if (clearLength != nullptr) *clearLength = static_cast<int>(std::strlen(*clear));
    return 1;
  }
  _morva_utils_decode_buffer_free(clear);
  return 0;
}

int decryptValue(const Scheme& scheme, const char* value, char** clear, AesKeyData* keyData,
                 int* clearLength) noexcept {
  if (keyData == nullptr) return 0;
  const int rc = aesDecryptBuffer(value + scheme.tagBytes, clear, g_CipherName[scheme.keyIndex],
                                  &keyData->aesKeys[scheme.keyIndex], &keyData->cryptoSalt, clearLength);
  return rc == 0 ? 1 : 0;
}

}  // namespace

int unmaskPayload(const char* payload, size_t length, char** clear) noexcept {
  SecretArray<kMaskedCharacters + 1> copy;  // the decoder writes to its text
  std::memcpy(copy.text(), payload, length < kMaskedCharacters ? length : kMaskedCharacters);
  return _morva_utils_decode_buffer(copy.text(), clear);
}

}  // namespace ldappw

using namespace ldappw;

extern "C" {

// Documented in password_schemes.h.

int unformat_password(const char* value, char** clear, AesKeyData* keyData, int* clearLength) noexcept {
  TracedCall call{kUnformatPassword};
  if (anyNull(value, clear)) return call.leave(0);
  const Scheme& scheme = schemeOf(value, std::strlen(value));
  if (scheme.code == FORMAT_QVEIL) return call.leave(unmaskValue(value, clear, clearLength));
  if (scheme.keyIndex != kNoKey) return call.leave(decryptValue(scheme, value, clear, keyData, clearLength));
  return call.failText(0, "Format:UNIMPLEMENTED pwd encoding %d\n", scheme.code);
}

int morva_decodePW(char** clear, const char* value, AesKeyData* keyData) noexcept {
  if (clear == nullptr) return LDAPPW_OPERATIONS_ERROR;
  *clear = nullptr;
  if (value == nullptr) return LDAPPW_OPERATIONS_ERROR;
  const size_t length = std::strlen(value);
  char* result = nullptr;
  int rc = LDAPPW_SUCCESS;
  if ((schemeOf(value, length).code & kReversibleBit) != 0) {
    if (unformat_password(value, &result, keyData, nullptr) == 0) rc = LDAPPW_OTHER;
  } else {
    TextCopy copy(value, length);  // the decoder writes to its text
    if (copy) _morva_utils_decode_buffer(copy.get(), &result);
  }
  *clear = result;
  return rc == LDAPPW_SUCCESS && result == nullptr ? LDAPPW_NO_MEMORY : rc;
}

}  // extern "C"
