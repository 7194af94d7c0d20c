// SPDX-License-Identifier: Apache-2.0
// The ciphers under the masked encoding, and its random draws.
#pragma once

#include <cstddef>

#include "crypt/crypto_des.h"

namespace ldappw::masking {

// The values of encryptionType.
enum Selector : unsigned { kSimpleCrypt = 1, kDesReducedReading = 7, kDes = 11 };

constexpr size_t kCipherBlock = 8;
constexpr unsigned char kClearIndex = 0xff;  // the key index of data that were left clear

bool isSelector(unsigned selector) noexcept;

// Fills the buffer with non-zero bytes drawn from a generator seeded with the time.
void setBackground(unsigned char* buffer, size_t n) noexcept;

// The ciphers of one record. Its two parts are as a rule under one key, whose schedule is then built once. Data are
// whole cipher blocks, selectors valid ones.
class RecordCipher {
 public:
  // Enciphers n bytes in place under a key that it draws, and stores the key's index.
  void encryptData(unsigned char* data, size_t n, unsigned selector, unsigned char& keyIndex) noexcept;

  // Deciphers n bytes in place.
  void decryptData(unsigned char* data, size_t n, unsigned selector, unsigned char keyIndex) noexcept;

 private:
  using ScheduleBuilder = void (*)(uint32_t*, const unsigned char*, int);
  void applyDes(unsigned char* data, size_t n, unsigned char keyIndex, ScheduleBuilder builder, int decrypt) noexcept;

  ScheduleBuilder builder_ = nullptr;  // of the schedule that is there
  unsigned char keyIndex_ = 0;
  DesSchedule schedule_;
};

}  // namespace ldappw::masking
