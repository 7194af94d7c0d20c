// SPDX-License-Identifier: Apache-2.0
// The bit work of the masked encoding: placing values on the set bits of a mask, and scattering bytes over others.
#pragma once

#include <cstddef>

namespace ldappw::masking {

// Where in a pattern table the next mask is.
using Cursor = unsigned;

// Whether bytes can be scattered at this width: 1, 2 or 4 bits to an output byte.
constexpr bool isWidth(unsigned width) {
  return width == 1 || width == 2 || width == 4;
}

// The byte with the bits of value on the set mask bits, the lowest on the lowest.
constexpr unsigned char expandOnBitPattern(unsigned value, unsigned byte, unsigned mask) {
  byte &= ~mask;
  for (; mask != 0; mask &= mask - 1, value >>= 1U) byte |= (0U - (value & 1U)) & mask & (0U - mask);
  return static_cast<unsigned char>(byte);
}

// The byte's bits at the set mask positions, the lowest first.
constexpr unsigned collapseOnBitPattern(unsigned byte, unsigned mask) {
  unsigned value = 0;
  for (unsigned bit = 1; mask != 0; mask &= mask - 1, bit <<= 1U) {
    if ((byte & mask & (0U - mask)) != 0) value |= bit;
  }
  return value;
}

// Scatters bytes, each over the next 8 / width output bytes, whose other bits stay. Returns where the next mask is.
Cursor bitScatter(const unsigned char* data, size_t n, unsigned char* out, unsigned width, Cursor cursor = 0) noexcept;

// Undoes bitScatter.
Cursor bitGather(const unsigned char* in, unsigned char* data, size_t n, unsigned width, Cursor cursor = 0) noexcept;

}  // namespace ldappw::masking
