// SPDX-License-Identifier: Apache-2.0
// The tables of DES: the published ones of FIPS 46-3 and those derived from them at compile time.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>

namespace ldappw {

template <typename Word, size_t kColumns>
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

// The round keys lie in two halves: groups 1 to 4 come from the half C of the key, groups 5 to 8 from D. A word holds
// one group a byte, from the top 1, 3, 2, 4 (5, 7, 6, 8), so that its 16-bit halves go into the words of a schedule as
// they are, and groups that are four apart have the same place in both.
constexpr unsigned kGroupShifts[4] = {24, 8, 16, 0};
using RoundWords = std::array<uint32_t, 16>;

// What four bits of a key byte add to the words of all rounds: its bits 1 to 4 to those of C, 4 to 7 to those of D.
struct KeyParts {
  alignas(64) RoundWords c[8][16];
  alignas(64) RoundWords d[8][16];
};
extern const KeyParts kKeyParts;

// The S-box, the P permutation and the expansion in one: all 48 inputs of the next round, as a pair of words in which
// they lie as round keys do. By the byte of the input, the lowest of C's word first and then those of D's.
using WordPair = std::array<uint32_t, 2>;
using ExpandedBoxes = DesTable<WordPair, 64>;
extern const ExpandedBoxes kExpandedBoxes;

}  // namespace ldappw
