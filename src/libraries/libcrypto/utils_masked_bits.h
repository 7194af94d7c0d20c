// SPDX-License-Identifier: Apache-2.0
// The bit work of the masked encoding: placing values on the set bits of a mask, and scattering bytes over others.
#pragma once

#include <cstddef>

namespace ldappw::masking {

// Where in a pattern table the next mask is.
using Cursor = unsigned;

// Whether bytes can be scattered at this width: 1, 2 or 4 bits to an output byte.
bool isWidth(unsigned width) noexcept;

// The byte with its lowest n set mask bits cleared (all for n = 0) and as many bits of value written to the set mask
// bits, from the highest mask bit downward.
unsigned char expandOnBitPattern(unsigned value, unsigned char byte, unsigned char mask, unsigned n) noexcept;

// The byte's bits at the set mask positions, the lowest first.
unsigned collapseOnBitPattern(unsigned char byte, unsigned char mask) noexcept;

// Scatters a byte over the next 8 / width output bytes, whose other bits stay.
void bitScatter(unsigned char byte, unsigned char* out, Cursor& cursor, unsigned width) noexcept;

// Undoes bitScatter.
unsigned char bitGather(const unsigned char* in, Cursor& cursor, unsigned width) noexcept;

}  // namespace ldappw::masking
