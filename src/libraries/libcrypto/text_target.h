// SPDX-License-Identifier: Apache-2.0
// Where the base64 text of an operation goes, and the digest and AES operations as the password module calls them: with
// such a target, and with counted texts, which need no terminator and so no copy.
#pragma once

#include "aes_keys.h"
#include "base64.h"
#include "owners.h"

namespace ldappw {

// The length of a text that may be null.
inline size_t lengthOf(const char* text) noexcept {
  return text == nullptr ? 0 : std::strlen(text);
}

// A new text in a caller's slot, or characters behind a tag that is written already, without a terminator.
class TextTarget {
 public:
  explicit TextTarget(char** slot) noexcept : slot_(slot) {}
  explicit TextTarget(char* payload) noexcept : payload_(payload) {}
  TextTarget(const TextTarget&) = delete;
  TextTarget& operator=(const TextTarget&) = delete;

  char** slot() const noexcept { return slot_; }

  // From here on a failure leaves the caller's slot null.
  void claim() noexcept {
    if (payload_ == nullptr) guard_.arm();
  }

  // False when there is no memory for the text, or the alphabet is not whole.
  bool write(const unsigned char* data, size_t bytes) noexcept {
    return payload_ == nullptr ? writeSlot(data, bytes) : writePayload(data, bytes);
  }

  // The characters that were written behind the tag.
  size_t length() const noexcept { return length_; }

 private:
  bool writeSlot(const unsigned char* data, size_t bytes) noexcept {
    char* text = binaryBlobToBase64(data, static_cast<int>(bytes));
    if (text != nullptr) guard_.keep(text);
    return text != nullptr;
  }
  bool writePayload(const unsigned char* data, size_t bytes) noexcept {
    if (!isWholeAlphabet(pBase64)) return false;
    length_ = encodeBytes(data, bytes, pBase64, payload_);
    return true;
  }

  char* payload_ = nullptr;
  char** slot_ = &payload_;  // what the trace shows when there is no caller's slot
  OutGuard<char> guard_{slot_, false};
  size_t length_ = 0;
};

// saltedHashEncrypt, saltedHashVerify, unsaltedHashEncrypt and aesEncryptBuffer. Counted texts hold no NUL.
int saltedHashTo(TextTarget& target, const char* clear, size_t clearBytes, const char* digestName) noexcept;
int saltedHashCheck(const char* clear, size_t clearBytes, const char* stored, size_t storedBytes,
                    const char* digestName) noexcept;
int unsaltedHashTo(TextTarget& target, const char* digestName, const char* clear, size_t clearBytes) noexcept;
int aesEncryptTo(TextTarget& target, const char* clear, const char* cipherName, const SecBuffer* key,
                 const SecBuffer* iv, int clearLength) noexcept;

}  // namespace ldappw
