// SPDX-License-Identifier: Apache-2.0
// DES (FIPS 46-3) on two 32-bit halves: the permutations, whole blocks and round keys. Between the two permutations the
// halves are kept rotated left by one bit, which puts each round's six-bit inputs side by side.
#pragma once

#include <cstddef>
#include <cstdint>

#include "crypt/crypto_des_tables.h"
#include "support/bits.h"
#include "support/wipe.h"

namespace ldappw {

// A key schedule, wiped when it goes.
struct DesSchedule {
  uint32_t words[32];
  ~DesSchedule() { wipe(words, sizeof words); }
};

// The round keys in the halves that the key schedule has (crypto_des_tables.h), wiped when they go.
struct RoundKeys {
  RoundWords c;
  RoundWords d;
  ~RoundKeys() { wipe(this, sizeof *this); }
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

// Derives the round keys of an 8-byte key.
void deriveRoundKeys(RoundKeys& keys, const unsigned char* key) noexcept;

// Enciphers or deciphers, as the schedule was built, so many blocks in place, each for itself.
void desBlocks(const uint32_t* schedule, unsigned char* blocks, size_t count) noexcept;

}  // namespace ldappw
