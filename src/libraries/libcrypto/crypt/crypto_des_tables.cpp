// SPDX-License-Identifier: Apache-2.0
// The tables of DES. The published ones stand as in FIPS 46-3; the others are computed from them by the compiler.
#include "crypt/crypto_des_tables.h"

namespace ldappw {

constexpr uint8_t pc1[56] = {57, 49, 41, 33, 25, 17, 9,  1,  58, 50, 42, 34, 26, 18, 10, 2,  59, 51, 43,
                             35, 27, 19, 11, 3,  60, 52, 44, 36, 63, 55, 47, 39, 31, 23, 15, 7,  62, 54,
                             46, 38, 30, 22, 14, 6,  61, 53, 45, 37, 29, 21, 13, 5,  28, 20, 12, 4};

constexpr uint8_t pc2[48] = {14, 17, 11, 24, 1,  5,  3,  28, 15, 6,  21, 10, 23, 19, 12, 4,
                             26, 8,  16, 7,  27, 20, 13, 2,  41, 52, 31, 37, 47, 55, 30, 40,
                             51, 45, 33, 48, 44, 49, 39, 56, 34, 53, 46, 42, 50, 36, 29, 32};

constexpr uint8_t totrot[16] = {1, 2, 4, 6, 8, 10, 12, 14, 15, 17, 19, 21, 23, 25, 27, 28};

constexpr uint8_t bytebit[8] = {128, 64, 32, 16, 8, 4, 2, 1};

constexpr uint8_t kExpansion[48] = {32, 1,  2,  3,  4,  5,  4,  5,  6,  7,  8,  9,  8,  9,  10, 11,
                                    12, 13, 12, 13, 14, 15, 16, 17, 16, 17, 18, 19, 20, 21, 20, 21,
                                    22, 23, 24, 25, 24, 25, 26, 27, 28, 29, 28, 29, 30, 31, 32, 1};

namespace {

constexpr uint8_t kPermutation[32] = {16, 7, 20, 21, 29, 12, 28, 17, 1,  15, 23, 26, 5,  18, 31, 10,
                                      2,  8, 24, 14, 32, 27, 3,  9,  19, 13, 30, 6,  22, 11, 4,  25};

// The S-boxes by row (bits 1 and 6 of the input) and column (bits 2 to 5).
constexpr uint8_t kSubstitution[8][64] = {
    {14, 4,  13, 1, 2,  15, 11, 8, 3, 10, 6, 12, 5,  9,  0,  7,  0,  15, 7,  4,  14, 2,
     13, 1,  10, 6, 12, 11, 9,  5, 3, 8,  4, 1,  14, 8,  13, 6,  2,  11, 15, 12, 9,  7,
     3,  10, 5,  0, 15, 12, 8,  2, 4, 9,  1, 7,  5,  11, 3,  14, 10, 0,  6,  13},
    {15, 1,  8, 14, 6,  11, 3,  4, 9, 7, 2,  13, 12, 0, 5, 10, 3,  13, 4,  7, 15, 2,  8, 14, 12, 0, 1, 10, 6, 9, 11, 5,
     0,  14, 7, 11, 10, 4,  13, 1, 5, 8, 12, 6,  9,  3, 2, 15, 13, 8,  10, 1, 3,  15, 4, 2,  11, 6, 7, 12, 0, 5, 14, 9},
    {10, 0,  9,  14, 6, 3,  15, 5,  1,  13, 12, 7, 11, 4,  2,  8,  13, 7, 0,  9, 3, 4,
     6,  10, 2,  8,  5, 14, 12, 11, 15, 1,  13, 6, 4,  9,  8,  15, 3,  0, 11, 1, 2, 12,
     5,  10, 14, 7,  1, 10, 13, 0,  6,  9,  8,  7, 4,  15, 14, 3,  11, 5, 2,  12},
    {7, 13, 14, 3, 0, 6,  9, 10, 1,  2, 8,  5, 11, 12, 4,  15, 13, 8,  11, 5, 6, 15,
     0, 3,  4,  7, 2, 12, 1, 10, 14, 9, 10, 6, 9,  0,  12, 11, 7,  13, 15, 1, 3, 14,
     5, 2,  8,  4, 3, 15, 0, 6,  10, 1, 13, 8, 9,  4,  5,  11, 12, 7,  2,  14},
    {2,  12, 4, 1,  7,  10, 11, 6, 8, 5,  3, 15, 13, 0,  14, 9,  14, 11, 2,  12, 4,  7,
     13, 1,  5, 0,  15, 10, 3,  9, 8, 6,  4, 2,  1,  11, 10, 13, 7,  8,  15, 9,  12, 5,
     6,  3,  0, 14, 11, 8,  12, 7, 1, 14, 2, 13, 6,  15, 0,  9,  10, 4,  5,  3},
    {12, 1,  10, 15, 9,  2,  6, 8,  0, 13, 3,  4,  14, 7,  5, 11, 10, 15, 4, 2, 7, 12,
     9,  5,  6,  1,  13, 14, 0, 11, 3, 8,  9,  14, 15, 5,  2, 8,  12, 3,  7, 0, 4, 10,
     1,  13, 11, 6,  4,  3,  2, 12, 9, 5,  15, 10, 11, 14, 1, 7,  6,  0,  8, 13},
    {4, 11, 2,  14, 15, 0, 8, 13, 3,  12, 9, 7, 5, 10, 6, 1, 13, 0,  11, 7, 4, 9, 1,  10, 14, 3, 5, 12, 2,  15, 8, 6,
     1, 4,  11, 13, 12, 3, 7, 14, 10, 15, 6, 8, 0, 5,  9, 2, 6,  11, 13, 8, 1, 4, 10, 7,  9,  5, 0, 15, 14, 2,  3, 12},
    {13, 2, 8, 4, 6,  15, 11, 1, 10, 9,  3,  14, 5, 0, 12, 7, 1, 15, 13, 8, 10, 3, 7,  4,  12, 5, 6, 11, 0, 14, 9, 2, 7,
     11, 4, 1, 9, 12, 14, 2,  0, 6,  10, 13, 15, 3, 5, 8,  2, 1, 14, 7,  4, 10, 8, 13, 15, 12, 9, 0, 3,  5, 6,  11}};

constexpr uint32_t permuted(uint32_t bits) {
  uint32_t result = 0;
  for (unsigned i = 0; i < 32; ++i) result |= ((bits >> (32U - kPermutation[i])) & 1U) << (31U - i);
  return result;
}

// The output of an S-box behind the P permutation.
constexpr uint32_t substitutedWord(unsigned box, unsigned input) {
  const unsigned row = ((input >> 4U) & 2U) | (input & 1U);
  const unsigned column = (input >> 1U) & 15U;
  return permuted(uint32_t{kSubstitution[box][row * 16 + column]} << (28U - 4U * box));
}

constexpr uint32_t spboxWord(unsigned box, unsigned input) {
  const uint32_t word = substitutedWord(box, input);
  return (word << 1U) | (word >> 31U);
}

// Where the n-th of the 24 bits that come from one half of the key lies in its word.
constexpr unsigned roundBit(unsigned n) {
  return kGroupShifts[n / 6] + 5U - n % 6;
}

// The key bit, from 0, that PC-1, the rotation of a round and PC-2 bring to the n-th place of a half's 24.
constexpr unsigned keyBit(unsigned half, unsigned round, unsigned n) {
  const unsigned rotated = pc2[24 * half + n] - 1U - 28 * half;
  return pc1[28 * half + (rotated + totrot[round]) % 28] - 1U;
}

constexpr KeyParts keyParts() {
  KeyParts parts{};
  for (unsigned i = 0; i < 2 * 16 * 24; ++i) {
    const unsigned half = i / (16 * 24);
    const unsigned round = i / 24 % 16;
    const unsigned bit = keyBit(half, round, i % 24);
    auto& rows = half == 0 ? parts.c[bit / 8] : parts.d[bit / 8];
    const unsigned place = (half == 0 ? 3U : 6U) - bit % 8;  // among the four bits that choose a row
    for (unsigned bits = 0; bits < 16; ++bits) rows[bits][round] |= ((bits >> place) & 1U) << roundBit(i % 24);
  }
  return parts;
}

constexpr WordPair expandedPair(unsigned byte, unsigned input) {
  constexpr unsigned kGroups[4] = {3, 1, 2, 0};  // by byte, as kGroupShifts has them
  const uint32_t half = substitutedWord(kGroups[byte % 4] + byte / 4 * 4, input);
  WordPair pair{};
  for (unsigned n = 0; n < 48; ++n) pair[n / 24] |= ((half >> (32U - kExpansion[n])) & 1U) << roundBit(n % 24);
  return pair;
}

template <typename Word, size_t kColumns>
constexpr DesTable<Word, kColumns> filled(Word (*entry)(unsigned row, unsigned column)) {
  DesTable<Word, kColumns> table{};
  for (unsigned row = 0; row < table.size(); ++row) {
    for (unsigned column = 0; column < kColumns; ++column) table[row][column] = entry(row, column);
  }
  return table;
}

}  // namespace

constexpr DesTable<uint32_t, 64> Spbox = filled<uint32_t, 64>(spboxWord);
constexpr ExpandedBoxes kExpandedBoxes = filled<WordPair, 64>(expandedPair);
constexpr KeyParts kKeyParts = keyParts();

}  // namespace ldappw
