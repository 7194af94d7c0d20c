// SPDX-License-Identifier: Apache-2.0
// The bit work of the masked encoding, and what must hold of its tables.
#include "utils_masked_bits.h"

#include "utils_masked_tables.h"

namespace ldappw::masking {
namespace {

constexpr unsigned bitCount(unsigned byte) {
  unsigned count = 0;
  for (; byte != 0; byte &= byte - 1) ++count;
  return count;
}

// That a pattern table has so many masks of so many bits, and a zero after them.
template <size_t kSize>
constexpr bool holdsPatterns(const unsigned char (&table)[kSize], size_t masks, unsigned bits) {
  if (kSize != masks + 1 || table[masks] != 0) return false;
  for (size_t i = 0; i < masks; ++i) {
    if (bitCount(table[i]) != bits) return false;
  }
  return true;
}

constexpr bool isSymbol(char c) {
  return (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z') || (c >= '0' && c <= '9') || c == '+' || c == '/';
}

constexpr bool isPermutation(const char* alphabet) {
  for (size_t i = 0; i < 64; ++i) {
    if (!isSymbol(alphabet[i])) return false;
    for (size_t j = 0; j < i; ++j) {
      if (alphabet[i] == alphabet[j]) return false;
    }
  }
  return alphabet[64] == '\0';
}

template <size_t kSize>
constexpr bool holdsEncodings(const Encoding (&table)[kSize]) {
  if (kSize != 17 || table[kSize - 1].alphabet != nullptr) return false;
  for (size_t i = 0; i + 1 < kSize; ++i) {
    if (!isPermutation(table[i].alphabet) || table[i].identifier[0] == '\0' || table[i].identifier[1] != '\0') {
      return false;
    }
    for (size_t j = 0; j < i; ++j) {
      if (table[i].identifier[0] == table[j].identifier[0]) return false;
    }
  }
  return true;
}

static_assert(holdsEncodings(encodings), "sixteen alphabets with identifiers of their own");
static_assert(sizeof deskeys == 624, "78 keys of 8 bytes");
static_assert(holdsPatterns(scatterArray1, 12, 1));
static_assert(holdsPatterns(scatterArray2, 26, 2));
static_assert(holdsPatterns(scatterArray4, 39, 4));

const unsigned char* patterns(unsigned width) noexcept {
  return width == 1 ? scatterArray1 : width == 2 ? scatterArray2 : scatterArray4;
}

unsigned char nextMask(Cursor& cursor, const unsigned char* table) noexcept {
  const unsigned char mask = table[cursor++];
  if (table[cursor] == 0) cursor = 0;
  return mask;
}

}  // namespace

bool isWidth(unsigned width) noexcept {
  return width == 1 || width == 2 || width == 4;
}

unsigned char expandOnBitPattern(unsigned value, unsigned char byte, unsigned char mask, unsigned n) noexcept {
  unsigned result = byte;
  unsigned cleared = 0;
  for (unsigned bit = 0; bit < 8 && (n == 0 || cleared < n); ++bit) {
    if ((mask >> bit & 1U) == 0) continue;
    result &= ~(1U << bit);
    ++cleared;
  }
  for (unsigned bit = 8; bit-- > 0 && cleared > 0;) {
    if ((mask >> bit & 1U) != 0) result |= (value >> --cleared & 1U) << bit;
  }
  return static_cast<unsigned char>(result);
}

unsigned collapseOnBitPattern(unsigned char byte, unsigned char mask) noexcept {
  unsigned value = 0;
  unsigned place = 0;
  for (unsigned bit = 0; bit < 8; ++bit) {
    if ((mask >> bit & 1U) != 0) value |= (byte >> bit & 1U) << place++;
  }
  return value;
}

void bitScatter(unsigned char byte, unsigned char* out, Cursor& cursor, unsigned width) noexcept {
  const unsigned char* table = patterns(width);
  for (unsigned k = 0; k < 8 / width; ++k) {
    const unsigned bits = (byte >> (width * k)) & ((1U << width) - 1);
    out[k] = expandOnBitPattern(bits, out[k], nextMask(cursor, table), 0);
  }
}

unsigned char bitGather(const unsigned char* in, Cursor& cursor, unsigned width) noexcept {
  const unsigned char* table = patterns(width);
  unsigned byte = 0;
  for (unsigned k = 0; k < 8 / width; ++k) byte |= collapseOnBitPattern(in[k], nextMask(cursor, table)) << (width * k);
  return static_cast<unsigned char>(byte);
}

}  // namespace ldappw::masking
