// SPDX-License-Identifier: Apache-2.0
// The tables of DES: the published ones of FIPS 46-3 and those derived from them at compile time.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>

namespace ldappw {

template <class Word, size_t kColumns>
using DesTable = std::array<std::array<Word, kColumns>, 8>;

// Bit numbers count from 1, the most significant bit of the first byte.
extern const uint8_t pc1[56];
extern const uint8_t pc2[48];
extern const uint8_t totrot[16];  // cumulative left rotations of the key halves, by round
extern const uint8_t bytebit[8];  // masks of the bits 1 to 8 of a byte
extern const uint8_t kExpansion[48];

// Spbox[box][input]: the S-box and the P permutation in one, rotated left by one bit, the form in which the kernel
// keeps the halves of a block. The input's six bits are in the order of the expansion.
extern const DesTable<uint32_t, 64> Spbox;

// One round key: the groups 1, 3, 5, 7 and 2, 4, 6, 8, a group a byte, the first in the top byte.
struct RoundKey {
  uint32_t odd;
  uint32_t even;
};

// PC-1 over the upper seven bits of each key byte: the 28 bits of C, then the 28 bits of D.
extern const DesTable<uint64_t, 128> kPc1Chunks;

// PC-2 over the eight 7-bit chunks of C and D, the first chunk of C first.
extern const DesTable<RoundKey, 128> kPc2Chunks;

}  // namespace ldappw
