// SPDX-License-Identifier: Apache-2.0
// SHA-1 (FIPS 180-1) in one call, without the crypto provider: the way for any processor, in which all rounds are
// written out, for speed; and the choice between it and the faster one.
#include "digests/sha.h"

#include <cstdint>
#include <cstring>
#include <utility>

#include "support/bits.h"
#include "support/wipe.h"

static_assert(sizeof(sha_digest) == 20, "the record is the digest");

namespace ldappw {
namespace {

constexpr size_t kBlockBytes = 64;
constexpr size_t kLengthAt = 56;  // where the bit count begins in the last block

// What is on the stack while a block is worked on; it held clear text.
struct Work {
  unsigned char block[kBlockBytes];
  uint32_t words[16];  // the last sixteen words of the message schedule
  ~Work() { wipe(this, sizeof *this); }
};

// Word number t of the message schedule.
template <unsigned t>
inline uint32_t scheduled(uint32_t (&words)[16]) noexcept {
  if (t >= 16) {
    words[t % 16] = rotateLeft(words[(t + 13) % 16] ^ words[(t + 8) % 16] ^ words[(t + 2) % 16] ^ words[t % 16], 1);
  }
  return words[t % 16];
}

template <unsigned t>
inline uint32_t mixed(uint32_t b, uint32_t c, uint32_t d) noexcept {
  if (t < 20) return (d ^ (b & (c ^ d))) + 0x5a827999U;
  if (t < 40) return (b ^ c ^ d) + 0x6ed9eba1U;
  if (t < 60) return ((b & c) | (d & (b | c))) + 0x8f1bbcdcU;
  return (b ^ c ^ d) + 0xca62c1d6U;
}

template <unsigned t>
[[gnu::always_inline]] inline void step(uint32_t a, uint32_t& b, uint32_t c, uint32_t d, uint32_t& e,
                                        uint32_t (&words)[16]) noexcept {
  e += rotateLeft(a, 5) + mixed<t>(b, c, d) + scheduled<t>(words);
  b = rotateLeft(b, 30);
}

// Five rounds, after which the five values are back in their places. The inlining is asked for: without it the rounds
// become calls and take nearly twice as long.
template <unsigned t>
[[gnu::always_inline]] inline void fiveSteps(uint32_t (&v)[5], uint32_t (&words)[16]) noexcept {
  step<t>(v[0], v[1], v[2], v[3], v[4], words);
  step<t + 1>(v[4], v[0], v[1], v[2], v[3], words);
  step<t + 2>(v[3], v[4], v[0], v[1], v[2], words);
  step<t + 3>(v[2], v[3], v[4], v[0], v[1], words);
  step<t + 4>(v[1], v[2], v[3], v[4], v[0], words);
}

template <unsigned... fives>
[[gnu::always_inline]] inline void eightySteps(uint32_t (&v)[5], uint32_t (&words)[16],
                                               std::integer_sequence<unsigned, fives...>) noexcept {
  (fiveSteps<5 * fives>(v, words), ...);
}

void compress(uint32_t (&chain)[5], Work& work) noexcept {
  for (unsigned i = 0; i < 16; ++i) work.words[i] = loadBigEndian(work.block + 4 * i);
  uint32_t v[5] = {chain[0], chain[1], chain[2], chain[3], chain[4]};
  eightySteps(v, work.words, std::make_integer_sequence<unsigned, 16>());
  for (unsigned i = 0; i < 5; ++i) chain[i] += v[i];
}

}  // namespace

void digestPlainly(const unsigned char* data, size_t length, sha_digest* digest) noexcept {
  uint32_t chain[5] = {0x67452301U, 0xefcdab89U, 0x98badcfeU, 0x10325476U, 0xc3d2e1f0U};
  const uint64_t bits = uint64_t{length} * 8;
  Work work;
  for (; length >= kBlockBytes; length -= kBlockBytes, data += kBlockBytes) {
    std::memcpy(work.block, data, kBlockBytes);
    compress(chain, work);
  }
  if (length != 0) std::memcpy(work.block, data, length);
  std::memset(work.block + length, 0, kBlockBytes - length);
  work.block[length] = 0x80;
  if (length >= kLengthAt) {  // no room for the bit count: one more block
    compress(chain, work);
    std::memset(work.block, 0, kLengthAt);
  }
  storeBigEndian(work.block + kLengthAt, static_cast<uint32_t>(bits >> 32U));
  storeBigEndian(work.block + kLengthAt + 4, static_cast<uint32_t>(bits));
  compress(chain, work);
  auto* out = reinterpret_cast<unsigned char*>(digest);
  for (unsigned i = 0; i < 5; ++i) storeBigEndian(out + 4 * i, chain[i]);
}

}  // namespace ldappw

using namespace ldappw;

extern "C" {

// Documented in password_schemes.h.

void SHA(char* data, unsigned long length, sha_digest* digest) noexcept {
  if (digest == nullptr || (data == nullptr && length != 0)) return;
  digestBytes(reinterpret_cast<const unsigned char*>(data), length, digest);
}

}  // extern "C"
