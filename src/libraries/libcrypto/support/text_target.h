// SPDX-License-Identifier: Apache-2.0
// Output target for base64, and variants of the digest and AES operations that write to one and take counted texts,
// which need no NUL and so no copy.
#pragma once

#include "aes_keys.h"
#include "support/owners.h"
#include "support/utils_base64.h"

namespace ldappw {

// The length of a text that may be null.
inline size_t lengthOf(const char* text) noexcept {
  return text == nullptr ? 0 : std::strlen(text);
}

// A new text in a caller's slot, or characters without a terminator behind a tag that is written already.
struct TextTarget {
  char** slot;
  char* payload;
  size_t room;        // for the characters behind the tag
  size_t length = 0;  // of those

  const void* address() const noexcept { return slot != nullptr ? static_cast<const void*>(slot) : payload; }
};

inline TextTarget toSlot(char** slot) noexcept {
  return {slot, nullptr, 0};
}
inline TextTarget behindTag(char* payload, size_t room) noexcept {
  return {nullptr, payload, room};
}

// Writes bytes as base64. False when there is no memory or no room for the text, as where a provider has made more than
// there should be, or the alphabet is not whole.
inline bool writeBase64(TextTarget& target, const unsigned char* data, size_t bytes) noexcept {
  if (target.slot != nullptr) {
    char* text = binaryBlobToBase64(data, static_cast<int>(bytes));
    if (text != nullptr) *target.slot = text;
    return text != nullptr;
  }
  if (encodedLength(bytes) > target.room || !isWholeAlphabet(pBase64)) return false;
  encodeBytes(data, bytes, pBase64, target.payload);
  target.length = encodedLength(bytes);
  return true;
}

// saltedHashEncrypt, saltedHashVerify, unsaltedHashEncrypt and aesEncryptBuffer. Counted texts hold no NUL.
int saltedHashTo(TextTarget& target, const char* clear, size_t clearBytes, const char* digestName) noexcept;
int saltedHashCheck(const char* clear, size_t clearBytes, const char* stored, size_t storedBytes,
                    const char* digestName) noexcept;
int unsaltedHashTo(TextTarget& target, const char* digestName, const char* clear, size_t clearBytes) noexcept;
int aesEncryptTo(TextTarget& target, const char* clear, const char* cipherName, const SecBuffer* key,
                 const SecBuffer* iv, int clearLength) noexcept;

}  // namespace ldappw
