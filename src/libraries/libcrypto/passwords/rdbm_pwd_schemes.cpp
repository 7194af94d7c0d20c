// SPDX-License-Identifier: Apache-2.0
// Finding rows, the lengths of values, and the comparison of tags.
#include "passwords/rdbm_pwd_schemes.h"

#include <climits>
#include <cstdint>

namespace ldappw {

namespace {

constexpr int kCipherBlock = 16;

int paddedLength(int clearLength, size_t tagBytes) noexcept {
  const int64_t padded = (int64_t{clearLength} + kCipherBlock) / kCipherBlock * kCipherBlock;
  const int64_t length = (padded + 2) / 3 * 4 + static_cast<int64_t>(tagBytes);
  return length > INT_MAX || length < INT_MIN ? -1 : static_cast<int>(length);
}

constexpr int folded(char c) {
  return c >= 'A' && c <= 'Z' ? c - 'A' + 'a' : static_cast<unsigned char>(c);
}

}  // namespace

const Scheme* findScheme(int code) noexcept {
  for (const Scheme& scheme : kSchemes) {
    if (scheme.code == code) return &scheme;
  }
  return nullptr;
}

int valueLength(const Scheme& scheme, int clearLength) noexcept {
  if (scheme.fixedLength == kAsClear) return clearLength;
  if (scheme.fixedLength == kPadded) return paddedLength(clearLength, scheme.tagBytes);
  return scheme.fixedLength == kNeverMade ? -1 : scheme.fixedLength;
}

int compareTag(const char* left, const char* right, size_t bytes) noexcept {
  for (size_t i = 0; i < bytes; ++i) {
    if (const int difference = folded(left[i]) - folded(right[i]); difference != 0) return difference;
  }
  return 0;
}

}  // namespace ldappw
