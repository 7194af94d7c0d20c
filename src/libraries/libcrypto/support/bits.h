// SPDX-License-Identifier: Apache-2.0
// Rotations and big-endian words.
#pragma once

#include <cstdint>

namespace ldappw {

constexpr uint32_t rotateLeft(uint32_t word, unsigned bits) {
  return (word << bits) | (word >> (32U - bits));
}
constexpr uint32_t rotateRight(uint32_t word, unsigned bits) {
  return (word >> bits) | (word << (32U - bits));
}

inline uint32_t loadBigEndian(const unsigned char* bytes) noexcept {
  return uint32_t{bytes[0]} << 24U | uint32_t{bytes[1]} << 16U | uint32_t{bytes[2]} << 8U | uint32_t{bytes[3]};
}

inline void storeBigEndian(unsigned char* bytes, uint32_t word) noexcept {
  for (unsigned i = 0; i < 4; ++i) bytes[i] = static_cast<unsigned char>(word >> (24U - 8U * i));
}

}  // namespace ldappw
