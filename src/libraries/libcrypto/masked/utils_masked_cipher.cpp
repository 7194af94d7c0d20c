// SPDX-License-Identifier: Apache-2.0
// The ciphers under the masked encoding: DES with a key put together from the key table, and simpleCrypt.
#include "masked/utils_masked_cipher.h"

#include <cstdlib>
#include <cstring>
#include <ctime>

#include "crypt/crypto_simple.h"
#include "encoding_utils.h"
#include "masked/utils_masked_bits.h"
#include "masked/utils_masked_tables.h"

namespace ldappw::masking {
namespace {

unsigned timeSeed() noexcept {
  return static_cast<unsigned>(std::time(nullptr));
}

constexpr int kReachableKeys = 77;
constexpr unsigned char kSimpleCryptIndexMask = 0xe7;

// Brings any index that a byte can hold into the table; what lies beyond either end is reflected.
constexpr int folded(int index) {
  if (index < 0) index = -index - 1;
  return index >= kReachableKeys ? 2 * kReachableKeys - 1 - index : index;
}

struct KeyTable {
  unsigned char keys[kReachableKeys][kCipherBlock];
};

// A key takes each of its bytes from another entry of the key table.
constexpr KeyTable madeKeys() {
  constexpr int kStrides[kCipherBlock] = {-13, 7, 23, -1, -13, -17, 5, 5};
  KeyTable table{};
  for (int key = 0; key < kReachableKeys; ++key) {
    int index = key;
    for (size_t i = 0; i < kCipherBlock; ++i) {
      index = folded(index);
      table.keys[key][i] = deskeys[index][kCipherBlock - 1 - i];
      index += kStrides[i];
    }
  }
  return table;
}

constexpr KeyTable kMadeKeys = madeKeys();

}  // namespace

bool isSelector(unsigned selector) noexcept {
  return selector == kSimpleCrypt || selector == kDesReducedReading || selector == kDes;
}

void setBackground(unsigned char* buffer, size_t n) noexcept {
  unsigned seed = timeSeed();
  for (size_t filled = 0; filled < n;) {
    const int drawn = rand_r(&seed);
    unsigned char bytes[sizeof drawn];
    std::memcpy(bytes, &drawn, sizeof drawn);
    if (bytes[0] != 0 && bytes[1] != 0 && bytes[2] != 0 && bytes[3] != 0 && n - filled >= sizeof bytes) {
      std::memcpy(buffer + filled, bytes, sizeof bytes);
      filled += sizeof bytes;
      continue;
    }
    for (size_t i = 0; i < sizeof bytes && filled < n; ++i) {
      if (bytes[i] != 0) buffer[filled++] = bytes[i];
    }
  }
}

void RecordCipher::encryptData(unsigned char* data, size_t n, unsigned selector, unsigned char& keyIndex) noexcept {
  if (selector == kSimpleCrypt) {
    keyIndex = expandOnBitPattern(0, keyIndex, kSimpleCryptIndexMask);
    simpleCryptInPlace(data, n);
    return;
  }
  unsigned seed = timeSeed();
  const auto index = static_cast<unsigned char>(rand_r(&seed) % kReachableKeys);
  applyDes(data, n, index, deskey, 0);
  keyIndex = index;
}

void RecordCipher::decryptData(unsigned char* data, size_t n, unsigned selector, unsigned char keyIndex) noexcept {
  if (keyIndex == kClearIndex) return;
  if (selector == kSimpleCrypt) {
    simpleCryptInPlace(data, n);
  } else {
    applyDes(data, n, keyIndex, selector == kDesReducedReading ? deskey40 : deskey56, 1);
  }
}

void RecordCipher::applyDes(unsigned char* data, size_t n, unsigned char keyIndex, ScheduleBuilder builder,
                            int decrypt) noexcept {
  if (builder != builder_ || keyIndex != keyIndex_) {
    builder(schedule_.words, kMadeKeys.keys[folded(static_cast<signed char>(keyIndex))], decrypt);
    builder_ = builder;
    keyIndex_ = keyIndex;
  }
  desBlocks(schedule_.words, data, n / kCipherBlock);
}

}  // namespace ldappw::masking
