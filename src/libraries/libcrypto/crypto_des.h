// SPDX-License-Identifier: Apache-2.0
// The DES kernel (FIPS 46-3): permutations, rounds and the key schedule, on two 32-bit halves. Between the two
// permutations the halves are kept rotated left by one bit, which puts each round's six-bit inputs side by side.
#pragma once

#include <cstdint>

#include "bits.h"
#include "crypto_des_tables.h"
#include "wipe.h"

namespace ldappw {

// A key schedule, wiped when it goes.
struct DesSchedule {
  uint32_t words[32];
  ~DesSchedule() { wipe(words, sizeof words); }
};

struct Halves {
  uint32_t left;
  uint32_t right;
};

// Exchanges the masked bits of low with those shift places up in high.
inline void swapBits(uint32_t& high, uint32_t& low, unsigned shift, uint32_t mask) noexcept {
  const uint32_t difference = ((high >> shift) ^ low) & mask;
  low ^= difference;
  high ^= difference << shift;
}

inline void initialPermutation(Halves& block) noexcept {
  swapBits(block.left, block.right, 4, 0x0f0f0f0f);
  swapBits(block.left, block.right, 16, 0x0000ffff);
  swapBits(block.right, block.left, 2, 0x33333333);
  swapBits(block.right, block.left, 8, 0x00ff00ff);
  block.right = rotateLeft(block.right, 1);
  swapBits(block.left, block.right, 0, 0xaaaaaaaa);
  block.left = rotateLeft(block.left, 1);
}

// Takes the halves as the last round left them; the exchange of halves that ends DES is part of it.
inline void finalPermutation(Halves& block) noexcept {
  block.right = rotateRight(block.right, 1);
  swapBits(block.left, block.right, 0, 0xaaaaaaaa);
  block.left = rotateRight(block.left, 1);
  swapBits(block.left, block.right, 8, 0x00ff00ff);
  swapBits(block.left, block.right, 2, 0x33333333);
  swapBits(block.right, block.left, 16, 0x0000ffff);
  swapBits(block.right, block.left, 4, 0x0f0f0f0f);
  const uint32_t left = block.left;
  block.left = block.right;
  block.right = left;
}

// The eight substitutions of one round; the inputs lie a byte each, as in a RoundKey.
inline uint32_t substituted(uint32_t odd, uint32_t even) noexcept {
  return (Spbox[0][(odd >> 24U) & 63U] ^ Spbox[2][(odd >> 16U) & 63U]) ^
         (Spbox[4][(odd >> 8U) & 63U] ^ Spbox[6][odd & 63U]) ^
         (Spbox[1][(even >> 24U) & 63U] ^ Spbox[3][(even >> 16U) & 63U]) ^
         (Spbox[5][(even >> 8U) & 63U] ^ Spbox[7][even & 63U]);
}

inline void desRounds(Halves& block, const uint32_t* schedule) noexcept {
  for (const uint32_t* end = schedule + 32; schedule != end; schedule += 4) {
    block.left ^= substituted(rotateRight(block.right, 4) ^ schedule[0], block.right ^ schedule[1]);
    block.right ^= substituted(rotateRight(block.left, 4) ^ schedule[2], block.left ^ schedule[3]);
  }
}

// The schedule of an 8-byte key for enciphering, as 16 pairs of words.
inline void buildSchedule(uint32_t* schedule, const unsigned char* key) noexcept {
  uint64_t halves = 0;
  for (unsigned i = 0; i < 8; ++i) halves |= kPc1Chunks[i][key[i] >> 1U];
  const uint64_t c = halves >> 28U;
  const uint64_t d = halves & 0xfffffffU;
  for (unsigned round = 0; round < 16; ++round) {
    const unsigned by = totrot[round];
    const auto cNow = static_cast<uint32_t>(((c << by) | (c >> (28U - by))) & 0xfffffffU);
    const auto dNow = static_cast<uint32_t>(((d << by) | (d >> (28U - by))) & 0xfffffffU);
    RoundKey roundKey{0, 0};
    for (unsigned chunk = 0; chunk < 4; ++chunk) {
      const unsigned shift = 21U - 7U * chunk;
      const RoundKey& fromC = kPc2Chunks[chunk][(cNow >> shift) & 127U];
      const RoundKey& fromD = kPc2Chunks[chunk + 4][(dNow >> shift) & 127U];
      roundKey.odd |= fromC.odd | fromD.odd;
      roundKey.even |= fromC.even | fromD.even;
    }
    schedule[2 * round] = roundKey.odd;
    schedule[2 * round + 1] = roundKey.even;
  }
}

}  // namespace ldappw
