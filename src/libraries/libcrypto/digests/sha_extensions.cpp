// SPDX-License-Identifier: Apache-2.0
// SHA-1 by the SHA extensions of x86, which do four rounds at a time: Gulley, Gopal, Yap, Feghali, Guilford, Wolrich,
// "Intel SHA Extensions", 2013. The schedule is computed as the rounds need it. The last block is put together in
// registers, so that no clear text lies in memory: by way of a block there a password takes twice the time.
#include "digests/sha.h"

#include <immintrin.h>

#include <cstdint>
#include <cstring>
#include <utility>

#include "support/vector_kernel.h"

#define LDAPPW_SHA_TARGET gnu::target("sha,sse4.1")

namespace ldappw {
namespace {

constexpr size_t kBlockBytes = 64;
constexpr size_t kLengthAt = 56;  // where the bit count begins in the last block
constexpr size_t kPieceBytes = 16;

// The first word is the highest, as the instructions have it.
struct Block {
  __m128i words[4];
};
struct Chain {
  __m128i abcd;
  __m128i e;
};

[[LDAPPW_SHA_TARGET]] inline __m128i swapped(__m128i bytes) noexcept {
  return _mm_shuffle_epi8(bytes, _mm_set_epi64x(0x0001020304050607, 0x08090a0b0c0d0e0f));
}

[[LDAPPW_SHA_TARGET]] inline __m128i loaded(const void* from) noexcept {
  return _mm_loadu_si128(static_cast<const __m128i*>(from));
}

// Rounds 4 * quad and the three after it. before: the first four chaining values as they were four rounds ago.
template <int quad>
[[gnu::always_inline, LDAPPW_SHA_TARGET]] inline void fourRounds(Block& block, __m128i& abcd,
                                                                 __m128i& before) noexcept {
  __m128i& words = block.words[quad % 4];
  if (quad >= 4) {
    words = _mm_sha1msg1_epu32(words, block.words[(quad + 1) % 4]);
    words = _mm_sha1msg2_epu32(_mm_xor_si128(words, block.words[(quad + 2) % 4]), block.words[(quad + 3) % 4]);
  }
  // In the first four rounds E is a chaining value, later it comes from what A was.
  const __m128i e = quad == 0 ? _mm_add_epi32(before, words) : _mm_sha1nexte_epu32(before, words);
  before = abcd;
  abcd = _mm_sha1rnds4_epu32(abcd, e, quad / 5);
}

template <int... quads>
[[gnu::always_inline, LDAPPW_SHA_TARGET]] inline void compress(Chain& chain, Block block,
                                                               std::integer_sequence<int, quads...>) noexcept {
  __m128i abcd = chain.abcd;
  __m128i before = chain.e;
  (fourRounds<quads>(block, abcd, before), ...);
  chain.e = _mm_sha1nexte_epu32(before, chain.e);
  chain.abcd = _mm_add_epi32(chain.abcd, abcd);
}

[[gnu::always_inline, LDAPPW_SHA_TARGET]] inline void compress(Chain& chain, const Block& block) noexcept {
  compress(chain, block, std::make_integer_sequence<int, 20>());
}

// Up to seven bytes, then zeros.
inline uint64_t fewBytes(const unsigned char* from, size_t count) noexcept {
  if (count >= 4) {
    uint32_t first = 0;
    uint32_t last = 0;
    std::memcpy(&first, from, sizeof first);
    std::memcpy(&last, from + count - 4, sizeof last);
    return first | uint64_t{last} << (8 * (count - 4));
  }
  uint64_t bytes = 0;
  for (size_t i = count; i-- > 0;) bytes = bytes << 8U | from[i];
  return bytes;
}

// The last bytes of a message, fewer than a piece, with the mark behind them. Nothing outside the message is read: a
// longer message is read up to its end, and what comes before the piece shifted out.
[[gnu::always_inline, LDAPPW_SHA_TARGET]] inline __m128i lastPiece(const unsigned char* from, size_t count,
                                                                   size_t messageBytes) noexcept {
  alignas(16) static constexpr unsigned char kShift[2 * kPieceBytes] = {
      0,    1,    2,    3,    4,    5,    6,    7,    8,    9,    10,   11,   12,   13,   14,   15,
      0x80, 0x80, 0x80, 0x80, 0x80, 0x80, 0x80, 0x80, 0x80, 0x80, 0x80, 0x80, 0x80, 0x80, 0x80, 0x80};
  alignas(16) static constexpr unsigned char kMark[2 * kPieceBytes] = {0, 0, 0, 0, 0, 0, 0, 0,   0,
                                                                       0, 0, 0, 0, 0, 0, 0, 0x80};
  const size_t missing = kPieceBytes - count;
  __m128i bytes;
  if (messageBytes >= kPieceBytes) {
    bytes = _mm_shuffle_epi8(loaded(from - missing), loaded(kShift + missing));
  } else if (count >= 8) {
    const __m128i first = _mm_loadl_epi64(reinterpret_cast<const __m128i*>(from));
    const __m128i last = _mm_loadl_epi64(reinterpret_cast<const __m128i*>(from + count - 8));
    bytes = _mm_unpacklo_epi64(first, _mm_srl_epi64(last, _mm_cvtsi32_si128(static_cast<int>(8 * missing))));
  } else {
    bytes = _mm_set_epi64x(0, static_cast<int64_t>(fewBytes(from, count)));
  }
  return _mm_or_si128(bytes, loaded(kMark + missing));
}

// Sixteen bytes of the last block: of the message, its end with the mark, or zeros.
[[gnu::always_inline, LDAPPW_SHA_TARGET]] inline __m128i piece(const unsigned char* from, size_t count, size_t at,
                                                               size_t messageBytes) noexcept {
  if (count < at) return _mm_setzero_si128();
  if (count < at + kPieceBytes) return swapped(lastPiece(from + at, count - at, messageBytes));
  return swapped(loaded(from + at));
}

[[gnu::always_inline, LDAPPW_SHA_TARGET]] inline void store(const Chain& chain, sha_digest* digest) noexcept {
  auto* out = reinterpret_cast<unsigned char*>(digest);
  _mm_storeu_si128(reinterpret_cast<__m128i*>(out), swapped(chain.abcd));
  const int last = _mm_cvtsi128_si32(swapped(chain.e));
  std::memcpy(out + sizeof chain.abcd, &last, sizeof last);
}

[[LDAPPW_KERNEL, LDAPPW_SHA_TARGET]] void digestAll(const unsigned char* data, size_t length,
                                                    sha_digest* digest) noexcept {
  Chain chain{_mm_set_epi32(0x67452301, static_cast<int>(0xefcdab89U), static_cast<int>(0x98badcfeU), 0x10325476),
              _mm_set_epi32(static_cast<int>(0xc3d2e1f0U), 0, 0, 0)};
  size_t left = length;
  for (; left >= kBlockBytes; left -= kBlockBytes, data += kBlockBytes) {
    compress(chain, {swapped(loaded(data)), swapped(loaded(data + 16)), swapped(loaded(data + 32)),
                     swapped(loaded(data + 48))});
  }
  Block block{piece(data, left, 0, length), piece(data, left, 16, length), piece(data, left, 32, length),
              piece(data, left, 48, length)};
  if (left >= kLengthAt) {  // no room for the bit count: one more block
    compress(chain, block);
    block = {};
  }
  const uint64_t bits = uint64_t{length} * 8;
  block.words[3] = _mm_or_si128(block.words[3], _mm_set_epi64x(0, static_cast<int64_t>(bits)));
  compress(chain, block);
  store(chain, digest);
}

}  // namespace

void digestWithExtensions(const unsigned char* data, size_t length, sha_digest* digest) noexcept {
  digestAll(data, length, digest);
  clearTraces();
}

}  // namespace ldappw
