// SPDX-License-Identifier: Apache-2.0
// DES on single blocks, its key schedules, and the repeating-key XOR of the masked encoding.
#include "crypt/crypto_simple.h"

#include <climits>
#include <cstring>
#include <utility>

#include "crypt/crypto_des.h"
#include "encoding_utils.h"
#include "support/owners.h"

namespace ldappw {
namespace {

constexpr unsigned kScheduleWords = 32;
// Where the key text is entered; masked values are read from there (SimpleCrypt suite).
constexpr size_t kSimpleCryptStart = 4;

void scaleForByteOffsets(uint32_t* schedule) noexcept {
  if (Asmversion == 0) return;
  for (unsigned i = 0; i < kScheduleWords; ++i) schedule[i] *= 4;
}

void reverseRounds(uint32_t* schedule) noexcept {
  for (unsigned first = 0, last = 15; first < last; ++first, --last) {
    std::swap(schedule[2 * first], schedule[2 * last]);
    std::swap(schedule[2 * first + 1], schedule[2 * last + 1]);
  }
}

void fullSchedule(uint32_t* schedule, const unsigned char* key, bool decrypt) noexcept {
  RoundKeys keys;
  deriveRoundKeys(keys, key);
  for (unsigned round = 0; round < 16; ++round) {
    schedule[2 * round] = (keys.c[round] & 0xffff0000U) | keys.d[round] >> 16U;
    schedule[2 * round + 1] = keys.c[round] << 16U | (keys.d[round] & 0xffffU);
  }
  if (decrypt) reverseRounds(schedule);
  scaleForByteOffsets(schedule);
}

// The reduced key's departures from FIPS 46-3: 40 selected bits, of which the last 12 form a short second half that
// wraps into the first, and 32 bits of each round key. Bits that are never filled count as 0.
constexpr unsigned kReducedKeyBits = 40;
constexpr unsigned kReducedRoundKeyBits = 32;
constexpr unsigned kHalfBits = 28;

struct RoundKey {
  uint32_t odd;
  uint32_t even;
};

RoundKey reducedRoundKey(const uint8_t (&selected)[56], unsigned rotation) noexcept {
  SecretArray<56> rotated;
  for (unsigned j = 0; j < kReducedKeyBits; ++j) {
    const unsigned limit = j < kHalfBits ? kHalfBits : kReducedKeyBits;
    const unsigned from = j + rotation;
    rotated.data()[j] = selected[from >= limit ? from - kHalfBits : from];
  }
  RoundKey key{0, 0};
  for (unsigned n = 0; n < kReducedRoundKeyBits; ++n) {
    if (rotated.data()[pc2[n] - 1U] == 0) continue;
    const unsigned group = n / 6;
    const uint32_t bit = uint32_t{bytebit[n % 6]} >> 2U << ((3U - group / 2) * 8U);
    (group % 2 == 0 ? key.odd : key.even) |= bit;
  }
  return key;
}

}  // namespace

void simpleCryptInPlace(unsigned char* data, size_t n) noexcept {
  size_t at = kSimpleCryptStart;
  for (size_t i = 0; i < n; ++i) {
    if (pEncrypt[at] == '\0') at = 0;
    data[i] = static_cast<unsigned char>(data[i] ^ static_cast<unsigned char>(pEncrypt[at++]));
  }
}

}  // namespace ldappw

using namespace ldappw;

extern "C" {

// Documented in encoding_utils.h.

int Asmversion = 0;
const char* pEncrypt = "ujzde8gxd6ncf10epf91dhodzdoc9is0j8ht9lgmx&9edn581u33xtplpf";

void des(const uint32_t* schedule, unsigned char* block) noexcept {
  if (schedule == nullptr || block == nullptr) return;
  desBlocks(schedule, block, 1);
}

void deskey(uint32_t* schedule, const unsigned char* key, int decrypt) noexcept {
  if (schedule != nullptr && key != nullptr) fullSchedule(schedule, key, decrypt != 0);
}

void deskey56(uint32_t* schedule, const unsigned char* key, int decrypt) noexcept {
  deskey(schedule, key, decrypt);
}

void deskey40(uint32_t* schedule, const unsigned char* key, int decrypt) noexcept {
  if (schedule == nullptr || key == nullptr) return;
  uint8_t selected[56] = {};
  for (unsigned j = 0; j < kReducedKeyBits; ++j) {
    const unsigned bit = pc1[j] - 1U;
    selected[j] = (key[bit >> 3U] & bytebit[bit & 7U]) != 0 ? 1 : 0;
  }
  for (unsigned round = 0; round < 16; ++round) {
    const RoundKey roundKey = reducedRoundKey(selected, totrot[round]);
    schedule[2 * round] = roundKey.odd;
    schedule[2 * round + 1] = roundKey.even;
  }
  wipe(selected, sizeof selected);
  if (decrypt != 0) reverseRounds(schedule);
  scaleForByteOffsets(schedule);
}

void des3key(uint32_t* schedules, const unsigned char* key, int decrypt) noexcept {
  if (schedules == nullptr || key == nullptr) return;
  for (unsigned i = 0; i < 3; ++i) {
    const bool middle = i == 1;
    const unsigned position = decrypt != 0 ? 2 - i : i;
    fullSchedule(schedules + kScheduleWords * position, key + 8 * i, (decrypt != 0) != middle);
  }
}

char* simpleCrypt(const char* data, int length) noexcept {
  if (length < 0) length = 0;
  if (length == INT_MAX || (data == nullptr && length > 0)) return nullptr;
  char* result = zeroedBytes<char>(static_cast<size_t>(length) + 1);
  if (result == nullptr || length == 0) return result;
  std::memcpy(result, data, static_cast<size_t>(length));
  simpleCryptInPlace(reinterpret_cast<unsigned char*>(result), static_cast<size_t>(length));
  return result;
}

}  // extern "C"
