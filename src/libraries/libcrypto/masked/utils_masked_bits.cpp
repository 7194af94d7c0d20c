// SPDX-License-Identifier: Apache-2.0
// The bit work of the masked encoding, and what must hold of its tables.
#include "masked/utils_masked_bits.h"

#include <array>

#include "masked/utils_masked_tables.h"

namespace ldappw::masking {
namespace {

constexpr unsigned bitCount(unsigned byte) {
  unsigned count = 0;
  for (; byte != 0; byte &= byte - 1) ++count;
  return count;
}

// Checks mask count, bits per mask and the zero terminator of a pattern table.
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

// What a mask makes of each value, and of each half of a byte that it is applied to.
struct Pattern {
  unsigned char mask;
  unsigned char expanded[16];
  unsigned char collapsedLow[16];
  unsigned char collapsedHigh[16];
};

constexpr Pattern patternOf(unsigned char mask) {
  Pattern pattern{mask, {}, {}, {}};
  for (unsigned i = 0; i < 16; ++i) {
    pattern.expanded[i] = expandOnBitPattern(i, 0, mask);
    pattern.collapsedLow[i] = static_cast<unsigned char>(collapseOnBitPattern(i, mask));
    pattern.collapsedHigh[i] = static_cast<unsigned char>(collapseOnBitPattern(i << 4U, mask));
  }
  return pattern;
}

template <size_t kSize>
constexpr std::array<Pattern, kSize - 1> patternsOf(const unsigned char (&masks)[kSize]) {
  std::array<Pattern, kSize - 1> patterns{};
  for (size_t i = 0; i < kSize - 1; ++i) patterns[i] = patternOf(masks[i]);
  return patterns;
}

constexpr auto kPatterns1 = patternsOf(scatterArray1);
constexpr auto kPatterns2 = patternsOf(scatterArray2);
constexpr auto kPatterns4 = patternsOf(scatterArray4);

// The patterns of a width, taken one after another, round and round.
template <unsigned kWidth>
class Patterns {
 public:
  explicit Patterns(Cursor cursor) noexcept : next_(all().data() + cursor) {}

  const Pattern& next() noexcept {
    const Pattern& pattern = *next_++;
    if (next_ == all().data() + all().size()) next_ = all().data();
    return pattern;
  }
  Cursor cursor() const noexcept { return static_cast<Cursor>(next_ - all().data()); }

 private:
  static constexpr const auto& all() {
    static_assert(kWidth == 1 || kWidth == 2 || kWidth == 4);
    if constexpr (kWidth == 1) {
      return kPatterns1;
    } else if constexpr (kWidth == 2) {
      return kPatterns2;
    } else {
      return kPatterns4;
    }
  }
  const Pattern* next_;
};

template <unsigned kWidth>
Cursor scatter(const unsigned char* data, size_t n, unsigned char* out, Cursor cursor) noexcept {
  Patterns<kWidth> patterns(cursor);
  for (const unsigned char* end = data + n; data != end; ++data) {
#pragma GCC unroll 8
    for (unsigned at = 0; at < 8; at += kWidth, ++out) {
      const Pattern& pattern = patterns.next();
      const unsigned value = static_cast<unsigned>(*data >> at) & ((1U << kWidth) - 1);
      *out = static_cast<unsigned char>((*out & ~pattern.mask) | pattern.expanded[value]);
    }
  }
  return patterns.cursor();
}

template <unsigned kWidth>
Cursor gather(const unsigned char* in, unsigned char* data, size_t n, Cursor cursor) noexcept {
  Patterns<kWidth> patterns(cursor);
  for (const unsigned char* end = data + n; data != end; ++data) {
    unsigned byte = 0;
#pragma GCC unroll 8
    for (unsigned at = 0; at < 8; at += kWidth, ++in) {
      const Pattern& pattern = patterns.next();
      byte |= static_cast<unsigned>(pattern.collapsedLow[*in & 15U] | pattern.collapsedHigh[*in >> 4U]) << at;
    }
    *data = static_cast<unsigned char>(byte);
  }
  return patterns.cursor();
}

}  // namespace

Cursor bitScatter(const unsigned char* data, size_t n, unsigned char* out, unsigned width, Cursor cursor) noexcept {
  return (width == 1 ? scatter<1> : width == 2 ? scatter<2> : scatter<4>)(data, n, out, cursor);
}

Cursor bitGather(const unsigned char* in, unsigned char* data, size_t n, unsigned width, Cursor cursor) noexcept {
  return (width == 1 ? gather<1> : width == 2 ? gather<2> : gather<4>)(in, data, n, cursor);
}

}  // namespace ldappw::masking
