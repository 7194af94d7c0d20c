// SPDX-License-Identifier: Apache-2.0
// Wiping, and comparisons whose time depends on lengths alone.
#pragma once

#include <cstddef>
#include <cstdint>
#include <cstring>

namespace ldappw {

// Clears a secret; the optimiser may not remove it. As explicit_bzero does, but here the compiler sees the size.
inline void wipe(void* data, size_t bytes) noexcept {
  if (bytes != 0) std::memset(data, 0, bytes);
  __asm__ volatile("" : : "r"(data) : "memory");
}

// The sign of the first differing pair of bytes (unsigned), or 0. The last byte is looked at first and each earlier
// difference replaces what later ones gave, so that the time does not tell where the first difference is.
inline int compareBytes(const void* left, const void* right, size_t bytes) noexcept {
  const auto* a = static_cast<const unsigned char*>(left);
  const auto* b = static_cast<const unsigned char*>(right);
  int first = 0;
  for (size_t i = bytes; i-- > 0;) {
    const int difference = int{a[i]} - int{b[i]};
    const int keep = ((difference | -difference) >> 31);  // all ones where the bytes differ
    first = (first & ~keep) | (difference & keep);
  }
  return (first > 0) - (first < 0);
}

// Equality alone, a word at a time; no ordering.
inline bool equalBytes(const void* left, const void* right, size_t bytes) noexcept {
  const auto* a = static_cast<const unsigned char*>(left);
  const auto* b = static_cast<const unsigned char*>(right);
  uint32_t differences = 0;
  size_t i = 0;
  for (; i + sizeof(uint32_t) <= bytes; i += sizeof(uint32_t)) {  // the width in which digests are written
    uint32_t wordA = 0;
    uint32_t wordB = 0;
    std::memcpy(&wordA, a + i, sizeof wordA);
    std::memcpy(&wordB, b + i, sizeof wordB);
    differences |= wordA ^ wordB;
  }
  for (; i < bytes; ++i) differences |= static_cast<unsigned>(a[i] ^ b[i]);
  return differences == 0;
}

}  // namespace ldappw
