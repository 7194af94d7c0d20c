// SPDX-License-Identifier: Apache-2.0
// SHA-1 (FIPS 180-1) in one call, without the crypto provider. All rounds are written out, for speed.
#include <cstdint>
#include <cstring>

#include "bits.h"
#include "password_schemes.h"
#include "wipe.h"

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
inline void step(uint32_t a, uint32_t& b, uint32_t c, uint32_t d, uint32_t& e, uint32_t (&words)[16]) noexcept {
  e += rotateLeft(a, 5) + mixed<t>(b, c, d) + scheduled<t>(words);
  b = rotateLeft(b, 30);
}

// Long for its eighty rounds.
void compress(uint32_t (&chain)[5], Work& work) noexcept {
  uint32_t(&w)[16] = work.words;
  for (unsigned i = 0; i < 16; ++i) w[i] = loadBigEndian(work.block + 4 * i);
  uint32_t a = chain[0];
  uint32_t b = chain[1];
  uint32_t c = chain[2];
  uint32_t d = chain[3];
  uint32_t e = chain[4];
  step<0>(a, b, c, d, e, w);
  step<1>(e, a, b, c, d, w);
  step<2>(d, e, a, b, c, w);
  step<3>(c, d, e, a, b, w);
  step<4>(b, c, d, e, a, w);
  step<5>(a, b, c, d, e, w);
  step<6>(e, a, b, c, d, w);
  step<7>(d, e, a, b, c, w);
  step<8>(c, d, e, a, b, w);
  step<9>(b, c, d, e, a, w);
  step<10>(a, b, c, d, e, w);
  step<11>(e, a, b, c, d, w);
  step<12>(d, e, a, b, c, w);
  step<13>(c, d, e, a, b, w);
  step<14>(b, c, d, e, a, w);
  step<15>(a, b, c, d, e, w);
  step<16>(e, a, b, c, d, w);
  step<17>(d, e, a, b, c, w);
  step<18>(c, d, e, a, b, w);
  step<19>(b, c, d, e, a, w);
  step<20>(a, b, c, d, e, w);
  step<21>(e, a, b, c, d, w);
  step<22>(d, e, a, b, c, w);
  step<23>(c, d, e, a, b, w);
  step<24>(b, c, d, e, a, w);
  step<25>(a, b, c, d, e, w);
  step<26>(e, a, b, c, d, w);
  step<27>(d, e, a, b, c, w);
  step<28>(c, d, e, a, b, w);
  step<29>(b, c, d, e, a, w);
  step<30>(a, b, c, d, e, w);
  step<31>(e, a, b, c, d, w);
  step<32>(d, e, a, b, c, w);
  step<33>(c, d, e, a, b, w);
  step<34>(b, c, d, e, a, w);
  step<35>(a, b, c, d, e, w);
  step<36>(e, a, b, c, d, w);
  step<37>(d, e, a, b, c, w);
  step<38>(c, d, e, a, b, w);
  step<39>(b, c, d, e, a, w);
  step<40>(a, b, c, d, e, w);
  step<41>(e, a, b, c, d, w);
  step<42>(d, e, a, b, c, w);
  step<43>(c, d, e, a, b, w);
  step<44>(b, c, d, e, a, w);
  step<45>(a, b, c, d, e, w);
  step<46>(e, a, b, c, d, w);
  step<47>(d, e, a, b, c, w);
  step<48>(c, d, e, a, b, w);
  step<49>(b, c, d, e, a, w);
  step<50>(a, b, c, d, e, w);
  step<51>(e, a, b, c, d, w);
  step<52>(d, e, a, b, c, w);
  step<53>(c, d, e, a, b, w);
  step<54>(b, c, d, e, a, w);
  step<55>(a, b, c, d, e, w);
  step<56>(e, a, b, c, d, w);
  step<57>(d, e, a, b, c, w);
  step<58>(c, d, e, a, b, w);
  step<59>(b, c, d, e, a, w);
  step<60>(a, b, c, d, e, w);
  step<61>(e, a, b, c, d, w);
  step<62>(d, e, a, b, c, w);
  step<63>(c, d, e, a, b, w);
  step<64>(b, c, d, e, a, w);
  step<65>(a, b, c, d, e, w);
  step<66>(e, a, b, c, d, w);
  step<67>(d, e, a, b, c, w);
  step<68>(c, d, e, a, b, w);
  step<69>(b, c, d, e, a, w);
  step<70>(a, b, c, d, e, w);
  step<71>(e, a, b, c, d, w);
  step<72>(d, e, a, b, c, w);
  step<73>(c, d, e, a, b, w);
  step<74>(b, c, d, e, a, w);
  step<75>(a, b, c, d, e, w);
  step<76>(e, a, b, c, d, w);
  step<77>(d, e, a, b, c, w);
  step<78>(c, d, e, a, b, w);
  step<79>(b, c, d, e, a, w);
  chain[0] += a;
  chain[1] += b;
  chain[2] += c;
  chain[3] += d;
  chain[4] += e;
}

}  // namespace
}  // namespace ldappw

using namespace ldappw;

extern "C" {

// Documented in password_schemes.h.

void SHA(char* data, unsigned long length, sha_digest* digest) noexcept {
  if (digest == nullptr || (data == nullptr && length != 0)) return;
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

}  // extern "C"
