// SPDX-License-Identifier: Apache-2.0
// The ciphers under the masked encoding: DES with a key put together from the key table, and simpleCrypt.
#include "utils_masked_cipher.h"

#include <cstdlib>
#include <cstring>
#include <ctime>

#include "crypto_des.h"
#include "crypto_simple.h"
#include "encoding_utils.h"
#include "utils_masked_bits.h"
#include "utils_masked_tables.h"
#include "wipe.h"

namespace ldappw::masking {
namespace {

constexpr int kReachableKeys = 77;
constexpr unsigned char kSimpleCryptIndexMask = 0xe7;

unsigned timeSeed() noexcept {
  return static_cast<unsigned>(std::time(nullptr));
}

// Brings any index that a byte can hold into the table; what lies beyond either end is reflected.
int folded(int index) noexcept {
  if (index < 0) index = -index - 1;
  return index >= kReachableKeys ? 2 * kReachableKeys - 1 - index : index;
}

// A key takes each of its bytes from another entry of the table.
void makeKey(unsigned char keyIndex, unsigned char (&key)[kCipherBlock]) noexcept {
  static constexpr int kStrides[kCipherBlock] = {-13, 7, 23, -1, -13, -17, 5, 5};
  int index = static_cast<signed char>(keyIndex);
  for (size_t i = 0; i < kCipherBlock; ++i) {
    index = folded(index);
    key[i] = deskeys[index][kCipherBlock - 1 - i];
    index += kStrides[i];
  }
}

using ScheduleBuilder = void (*)(uint32_t*, const unsigned char*, int);

void applyDes(unsigned char* data, size_t n, unsigned char keyIndex, ScheduleBuilder build, int decrypt) noexcept {
  unsigned char key[kCipherBlock];
  makeKey(keyIndex, key);
  DesSchedule schedule;
  build(schedule.words, key, decrypt);
  wipe(key, sizeof key);
  for (size_t i = 0; i < n; i += kCipherBlock) des(schedule.words, data + i);
}

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
    for (size_t i = 0; i < sizeof bytes && filled < n; ++i) {
      if (bytes[i] != 0) buffer[filled++] = bytes[i];
    }
  }
}

void encryptData(unsigned char* data, size_t n, unsigned selector, unsigned char& keyIndex) noexcept {
  if (selector == kSimpleCrypt) {
    keyIndex = expandOnBitPattern(0, keyIndex, kSimpleCryptIndexMask, 0);
    simpleCryptInPlace(data, n);
    return;
  }
  unsigned seed = timeSeed();
  const auto index = static_cast<unsigned char>(rand_r(&seed) % kReachableKeys);
  applyDes(data, n, index, deskey, 0);
  keyIndex = index;
}

void decryptData(unsigned char* data, size_t n, unsigned selector, unsigned char keyIndex) noexcept {
  if (keyIndex == kClearIndex) return;
  if (selector == kSimpleCrypt) {
    simpleCryptInPlace(data, n);
  } else {
    applyDes(data, n, keyIndex, selector == kDesReducedReading ? deskey40 : deskey56, 1);
  }
}

}  // namespace ldappw::masking
