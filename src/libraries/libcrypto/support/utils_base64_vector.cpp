// SPDX-License-Identifier: Apache-2.0
// The methods for splitting bytes into values, for joining values, and for the standard alphabet are those of Mula and
// Lemire, "Faster Base64 Encoding and Decoding Using AVX2 Instructions", ACM Transactions on the Web 12 (2018), in
// vectors of 16 bytes. Any other alphabet is looked up in its rows of sixteen. The last step of a text is taken back so
// far that it ends where the text ends: nothing outside is read, and what it does again comes out the same.
// Registers are not cleared: they hold nothing that the caller's buffers do not.
#include "support/utils_base64.h"

#include <immintrin.h>

#include <cstring>

#include "support/vector_kernel.h"

#define LDAPPW_VECTORS gnu::always_inline, gnu::target("sse4.1")

namespace ldappw {
namespace {

constexpr size_t kReadBytes = 16;
constexpr size_t kStepBytes = 12;
constexpr size_t kStepCharacters = 16;

[[LDAPPW_VECTORS]] inline __m128i load(const void* from) noexcept {
  return _mm_loadu_si128(static_cast<const __m128i*>(from));
}
[[LDAPPW_VECTORS]] inline void store(void* to, __m128i vector) noexcept {
  _mm_storeu_si128(static_cast<__m128i*>(to), vector);
}

// For each byte, one of two by a bit of it.
template <int bit>
[[LDAPPW_VECTORS]] inline __m128i chosen(__m128i bytes, __m128i ifClear, __m128i ifSet) noexcept {
  return _mm_blendv_epi8(ifClear, ifSet, _mm_slli_epi16(bytes, 7 - bit));
}

// ---- Encoding ----

// The symbols of the standard alphabet: each of its runs lies at a fixed distance from its values.
class StandardSymbols {
 public:
  explicit StandardSymbols(const char*) noexcept {}

  [[LDAPPW_VECTORS]] __m128i of(__m128i values) const noexcept {
    constexpr char kDigit = '0' - 52;
    const __m128i distances = _mm_setr_epi8('a' - 26, kDigit, kDigit, kDigit, kDigit, kDigit, kDigit, kDigit, kDigit,
                                            kDigit, kDigit, '+' - 62, '/' - 63, 'A', 0, 0);
    const __m128i pastLetters = _mm_subs_epu8(values, _mm_set1_epi8(51));
    const __m128i isUpper = _mm_and_si128(_mm_cmplt_epi8(values, _mm_set1_epi8(26)), _mm_set1_epi8(13));
    return _mm_add_epi8(values, _mm_shuffle_epi8(distances, _mm_or_si128(pastLetters, isUpper)));
  }
};

class AnySymbols {
 public:
  [[LDAPPW_VECTORS]] explicit AnySymbols(const char* alphabet) noexcept
      : rows_{load(alphabet), load(alphabet + 16), load(alphabet + 32), load(alphabet + 48)} {}

  [[LDAPPW_VECTORS]] __m128i of(__m128i values) const noexcept {
    const __m128i lower = chosen<4>(values, row(0, values), row(1, values));
    const __m128i upper = chosen<4>(values, row(2, values), row(3, values));
    return chosen<5>(values, lower, upper);
  }

 private:
  [[LDAPPW_VECTORS]] __m128i row(int number, __m128i values) const noexcept {
    return _mm_shuffle_epi8(rows_[number], values);
  }
  __m128i rows_[4];
};

// The four values of each group of three bytes, which order brings into the places 1 0 2 1.
[[LDAPPW_VECTORS]] inline __m128i valuesAt(const unsigned char* data, __m128i order) noexcept {
  const __m128i groups = _mm_shuffle_epi8(load(data), order);
  const __m128i firstAndThird = _mm_and_si128(groups, _mm_set1_epi32(0x0fc0fc00));
  const __m128i secondAndFourth = _mm_and_si128(groups, _mm_set1_epi32(0x003f03f0));
  return _mm_or_si128(_mm_mulhi_epu16(firstAndThird, _mm_set1_epi32(0x04000040)),
                      _mm_mullo_epi16(secondAndFourth, _mm_set1_epi32(0x01000010)));
}

template <typename Symbols>
[[LDAPPW_KERNEL, gnu::target("sse4.1")]] void encode(const unsigned char* data, size_t bytes, const char* alphabet,
                                                     char* out) noexcept {
  const Symbols symbols(alphabet);
  // The first step uses the first bytes of those that it reads, a later one the last.
  const __m128i first = _mm_setr_epi8(1, 0, 2, 1, 4, 3, 5, 4, 7, 6, 8, 7, 10, 9, 11, 10);
  const __m128i later = _mm_add_epi8(first, _mm_set1_epi8(kReadBytes - kStepBytes));
  char* const end = out + (bytes + 2) / 3 * 4;
  store(out, symbols.of(valuesAt(data, first)));
  size_t at = kStepBytes;
  for (; at + kStepBytes <= bytes; at += kStepBytes) {
    out += kStepCharacters;
    store(out, symbols.of(valuesAt(data + at - (kReadBytes - kStepBytes), later)));
  }
  if (at == bytes) return;
  const int pads = static_cast<int>((bytes + 2) / 3 * 3 - bytes);
  const __m128i shifted = _mm_add_epi8(later, _mm_set1_epi8(static_cast<char>(pads)));
  const __m128i last = _mm_or_si128(shifted, _mm_cmpgt_epi8(shifted, _mm_set1_epi8(kReadBytes - 1)));  // zeros behind
  store(end - kStepCharacters, symbols.of(valuesAt(data + bytes - kReadBytes, last)));
  if (pads >= 1) end[-1] = kPad;
  if (pads == 2) end[-2] = kPad;
}

// ---- Decoding ----

// The values of the standard alphabet. A character's upper half selects the set of lower halves that go with it, and
// the distance to its value; "/" has a distance of its own.
class StandardValues {
 public:
  [[LDAPPW_VECTORS]] bool find(__m128i characters, __m128i& values) const noexcept {
    // A bit for 2x, 3x, 4x and 6x, 5x and 7x, and one for all else; for lower halves, where they are foreign.
    const __m128i sets = _mm_setr_epi8(16, 16, 1, 2, 4, 8, 4, 8, 16, 16, 16, 16, 16, 16, 16, 16);
    const __m128i foreign = _mm_setr_epi8(21, 17, 17, 17, 17, 17, 17, 17, 17, 17, 19, 26, 27, 27, 27, 26);
    const __m128i distances =
        _mm_setr_epi8(0, 63 - '/', 62 - '+', 52 - '0', -'A', -'A', 26 - 'a', 26 - 'a', 0, 0, 0, 0, 0, 0, 0, 0);
    const __m128i half = _mm_set1_epi8(15);
    const __m128i lower = _mm_and_si128(characters, half);
    const __m128i upper = _mm_and_si128(_mm_srli_epi16(characters, 4), half);
    const __m128i faults = _mm_and_si128(_mm_shuffle_epi8(sets, upper), _mm_shuffle_epi8(foreign, lower));
    const __m128i isSlash = _mm_cmpeq_epi8(characters, _mm_set1_epi8('/'));
    values = _mm_add_epi8(characters, _mm_shuffle_epi8(distances, _mm_add_epi8(upper, isSlash)));
    return _mm_movemask_epi8(_mm_cmpgt_epi8(faults, _mm_setzero_si128())) == 0;
  }
};

// The values of any alphabet of 64 printable characters without "=". The first of several places counts.
class AnyValues {
 public:
  [[LDAPPW_VECTORS]] explicit AnyValues(const char* alphabet) noexcept {
    alignas(16) unsigned char values[kRows * 16];
    std::memset(values, kForeign, sizeof values);
    for (size_t i = kSymbols; i-- > 0;)
      values[static_cast<unsigned char>(alphabet[i]) - kBlank] = static_cast<unsigned char>(i);
    for (int i = 0; i < kRows; ++i) rows_[i] = load(values + 16 * i);
  }

  [[LDAPPW_VECTORS]] static bool fits(const char* alphabet) noexcept {
    __m128i odd = _mm_setzero_si128();
    for (size_t i = 0; i < kSymbols; i += 16) {
      const __m128i part = load(alphabet + i);
      odd = _mm_or_si128(odd, _mm_cmplt_epi8(part, _mm_set1_epi8(kBlank)));  // those from 0x80 on are negative
      odd = _mm_or_si128(odd, _mm_cmpeq_epi8(part, _mm_set1_epi8(kPad)));
    }
    return _mm_movemask_epi8(odd) == 0;
  }

  [[LDAPPW_VECTORS]] bool find(__m128i characters, __m128i& values) const noexcept {
    const __m128i lower = _mm_and_si128(characters, _mm_set1_epi8(15));
    const __m128i from20 = chosen<4>(characters, row(0, lower), row(1, lower));
    const __m128i from40 = chosen<4>(characters, row(2, lower), row(3, lower));
    const __m128i from60 = chosen<4>(characters, row(4, lower), row(5, lower));
    values = chosen<6>(characters, from20, chosen<5>(characters, from40, from60));
    const __m128i outside = _mm_cmplt_epi8(characters, _mm_set1_epi8(kBlank));
    return _mm_movemask_epi8(_mm_or_si128(values, outside)) == 0;
  }

 private:
  static constexpr int kRows = 6;
  static constexpr char kBlank = 0x20;
  static constexpr int kForeign = 0x80;

  [[LDAPPW_VECTORS]] __m128i row(int number, __m128i lower) const noexcept {
    return _mm_shuffle_epi8(rows_[number], lower);
  }
  __m128i rows_[kRows];
};

// The bytes of four groups, and four zeros.
[[LDAPPW_VECTORS]] inline __m128i bytesOf(__m128i values) noexcept {
  const __m128i pairs = _mm_maddubs_epi16(values, _mm_set1_epi32(0x01400140));
  const __m128i groups = _mm_madd_epi16(pairs, _mm_set1_epi32(0x00011000));
  return _mm_shuffle_epi8(groups, _mm_setr_epi8(2, 1, 0, 6, 5, 4, 10, 9, 8, 14, 13, 12, -1, -1, -1, -1));
}

template <typename Values>
[[LDAPPW_KERNEL, gnu::target("sse4.1")]] DecodedText decode(const char* text, size_t length, const char* alphabet,
                                                            const Values& table, unsigned char* out) noexcept {
  const char* const last = text + length - kStepCharacters;
  const char* at = text;
  unsigned char* to = out;
  __m128i values;
  for (; at < last; at += kStepCharacters, to += kStepBytes) {
    if (!table.find(load(at), values)) return decodeRest(text, length, alphabet, static_cast<size_t>(at - text), out);
    store(to, bytesOf(values));
  }

  // The last step: one pad or two may stand at its end, for which the symbol of 0 is looked up.
  const __m128i characters = load(last);
  const __m128i isPad = _mm_cmpeq_epi8(characters, _mm_set1_epi8(kPad));
  const int padPlaces = _mm_movemask_epi8(isPad);
  const bool isUsual = length % 4 == 0 && (padPlaces == 0 || padPlaces == 0x8000 || padPlaces == 0xc000);
  if (!isUsual || !table.find(_mm_blendv_epi8(characters, _mm_set1_epi8(alphabet[0]), isPad), values)) {
    return decodeRest(text, length, alphabet, static_cast<size_t>(at - text), out);
  }
  const size_t bytes = length / 4 * 3;
  store(out + bytes - kStepBytes, bytesOf(values));
  if (padPlaces == 0) return {bytes, true};
  out[bytes - 1] = 0;
  if (padPlaces == 0x8000) return {bytes - 1, true};
  out[bytes - 2] = 0;
  return {bytes - 2, true};
}

[[LDAPPW_KERNEL, gnu::target("sse4.1")]] DecodedText decodeAny(const char* text, size_t length, const char* alphabet,
                                                               unsigned char* out) noexcept {
  if (std::strlen(alphabet) != kSymbols || !AnyValues::fits(alphabet)) {
    return decodePlainly(text, length, alphabet, out);
  }
  return decode(text, length, alphabet, AnyValues(alphabet), out);
}

}  // namespace

void encodeWithVectors(const unsigned char* data, size_t bytes, const char* alphabet, char* out) noexcept {
  if (bytes < kReadBytes) return encodePlainly(data, bytes, alphabet, out);
  if (isStandard(alphabet)) return encode<StandardSymbols>(data, bytes, alphabet, out);
  encode<AnySymbols>(data, bytes, alphabet, out);
}

DecodedText decodeWithVectors(const char* text, size_t length, const char* alphabet, unsigned char* out) noexcept {
  if (length < kStepCharacters) return decodePlainly(text, length, alphabet, out);
  if (isStandard(alphabet)) return decode(text, length, alphabet, StandardValues(), out);
  return decodeAny(text, length, alphabet, out);
}

}  // namespace ldappw
