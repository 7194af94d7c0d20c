// SPDX-License-Identifier: Apache-2.0
// The ciphers under the masked encoding, and its random draws.
#pragma once

#include <cstddef>

namespace ldappw::masking {

// The values of encryptionType.
enum Selector : unsigned { kSimpleCrypt = 1, kDesReducedReading = 7, kDes = 11 };

constexpr size_t kCipherBlock = 8;
constexpr unsigned char kClearIndex = 0xff;  // the key index that of data that were left clear

bool isSelector(unsigned selector) noexcept;

// Fills the buffer with non-zero bytes drawn from a generator seeded with the time.
void setBackground(unsigned char* buffer, size_t n) noexcept;

// Enciphers n bytes, a multiple of the cipher block, in place, and stores the index of the key in keyIndex. The
// selector is a valid one.
void encryptData(unsigned char* data, size_t n, unsigned selector, unsigned char& keyIndex) noexcept;

// Deciphers n bytes, a multiple of the cipher block, in place.
void decryptData(unsigned char* data, size_t n, unsigned selector, unsigned char keyIndex) noexcept;

}  // namespace ldappw::masking
