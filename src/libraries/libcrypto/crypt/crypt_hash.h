// SPDX-License-Identifier: Apache-2.0
// The hash of the Unix crypt, apart from the record in which the interface shows how it came about.
#pragma once

#include <cstdint>

#include "crypt/crypto_des.h"

namespace ldappw {

// The first two characters of a salt, and the six bits that each stands for, the lowest for the first bit of a group.
struct CryptSalt {
  explicit CryptSalt(const char* salt) noexcept;
  char characters[2];
  unsigned bits[2];
};

// Writes the salt's characters and the hash as text, without a terminator.
constexpr unsigned kCryptCharacters = 13;
void writeCryptText(const CryptSalt& salt, uint64_t hash, char* text) noexcept;

// A key and a salt, made ready. The key is wiped when it goes.
class CryptInput {
 public:
  // The first 8 characters of the key count.
  CryptInput(const char* key, const char* salt) noexcept;

  // DES, 25 times over a block of zeros, with the expansion that the salt perturbs.
  uint64_t hash() const noexcept;

  const RoundKeys& roundKeys() const noexcept { return keys_; }
  const CryptSalt& salt() const noexcept { return salt_; }

 private:
  RoundKeys keys_;
  CryptSalt salt_;
  uint32_t saltMask_;
  alignas(64) ExpandedBoxes boxes_;
};

}  // namespace ldappw
