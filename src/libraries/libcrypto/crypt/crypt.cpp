// SPDX-License-Identifier: Apache-2.0
// The traditional Unix crypt: DES applied 25 times to a block of zeros, the password as key, with an expansion that the
// salt perturbs. The hash has a kernel of its own (crypt_hash.cpp); the one-bit-a-byte state that the interface
// promises is filled from its results, and only _encrypt_r works from that state.
#include "password_schemes.h"

#include <cstring>
#include <utility>

#include "crypt/crypt_hash.h"
#include "crypt/crypto_des.h"
#include "support/bits.h"

static_assert(sizeof(ldappw_crypt_data) == 898 && offsetof(ldappw_crypt_data, KS) == 48 &&
                  offsetof(ldappw_crypt_data, block) == 816 && offsetof(ldappw_crypt_data, iobuf) == 882,
              "callers allocate this record");

namespace ldappw {
namespace {

ldappw_crypt_data CD;  // of the forms that take no state

// The bits of a byte as the state has them: a byte each, the most significant first.
struct BitTable {
  char bits[256][8];
};

constexpr BitTable bitTable() {
  BitTable table{};
  for (unsigned i = 0; i < 256 * 8; ++i) table.bits[i / 8][i % 8] = static_cast<char>((i / 8) >> (7U - i % 8) & 1U);
  return table;
}

constexpr BitTable kSpread = bitTable();

void spreadBits(char* to, uint64_t bits, unsigned count) noexcept {
  for (unsigned i = 0; i < count; i += 8) std::memcpy(to + i, kSpread.bits[bits >> (count - 8 - i) & 255U], 8);
}

uint64_t gatheredBits(const char* from, unsigned count) noexcept {
  uint64_t bits = 0;
  for (unsigned i = 0; i < count; ++i) bits = bits << 1U | (static_cast<unsigned char>(from[i]) & 1U);
  return bits;
}

// The six bits of each group, and two zeros on which the next group comes to lie; behind the last there is no room.
void spreadRoundKeys(ldappw_crypt_data* state, const RoundKeys& keys) noexcept {
  for (unsigned round = 0; round < 16; ++round) {
#pragma GCC unroll 8
    for (unsigned group = 0; group < 8; ++group) {
      const uint32_t word = group < 4 ? keys.c[round] : keys.d[round];
      const uint32_t bits = word >> kGroupShifts[group % 4] & 63U;
      std::memcpy(state->KS[round] + 6 * group, kSpread.bits[bits << 2U], group < 7 ? 8 : 6);
    }
  }
}

// The expansion, of which each bit of a salt character exchanges two entries 24 places apart.
void storeExpansion(ldappw_crypt_data* state, const CryptSalt& salt) noexcept {
  std::memcpy(state->E, kExpansion, sizeof state->E);
  for (unsigned i = 0; i < 12; ++i) {
    if ((salt.bits[i / 6] >> i % 6 & 1U) != 0) std::swap(state->E[i], state->E[i + 24]);
  }
}

// The round function as the state has it: any expansion, any round keys.
uint32_t stateRound(uint32_t half, const ldappw_crypt_data* state, unsigned round) noexcept {
  uint32_t result = 0;
  for (unsigned group = 0; group < 8; ++group) {
    unsigned input = 0;
    for (unsigned j = 0; j < 6; ++j) {
      const unsigned source = static_cast<unsigned>(state->E[6 * group + j] - 1) & 31U;
      const unsigned keyBit = static_cast<unsigned char>(state->KS[round][6 * group + j]) & 1U;
      input = input << 1U | (((half >> (31U - source)) & 1U) ^ keyBit);
    }
    result ^= Spbox[group][input];
  }
  return rotateRight(result, 1);
}

}  // namespace
}  // namespace ldappw

using namespace ldappw;

extern "C" {

// Documented in password_schemes.h.

char* _crypt_r(char const* key, char const* salt, ldappw_crypt_data* state) noexcept {
  if (key == nullptr || salt == nullptr || state == nullptr) return nullptr;
  const CryptInput input(key, salt);
  const uint64_t hash = input.hash();
  spreadRoundKeys(state, input.roundKeys());
  storeExpansion(state, input.salt());
  spreadBits(state->block, hash, 64);
  state->block[64] = state->block[65] = 0;
  writeCryptText(input.salt(), hash, state->iobuf);
  state->iobuf[kCryptCharacters] = '\0';
  return state->iobuf;
}

int _setkey_r(char const* key, ldappw_crypt_data* state) noexcept {
  if (key == nullptr || state == nullptr) return -1;
  unsigned char keyBytes[8];
  for (unsigned i = 0; i < 8; ++i) keyBytes[i] = static_cast<unsigned char>(gatheredBits(key + 8 * i, 8));
  RoundKeys keys;
  deriveRoundKeys(keys, keyBytes);
  wipe(keyBytes, sizeof keyBytes);
  spreadRoundKeys(state, keys);
  std::memcpy(state->E, kExpansion, sizeof state->E);
  return 0;
}

int _encrypt_r(char* block, int decrypt, ldappw_crypt_data* state) noexcept {
  if (block == nullptr || state == nullptr || decrypt != 0) return -1;
  Halves halves{static_cast<uint32_t>(gatheredBits(block, 32)), static_cast<uint32_t>(gatheredBits(block + 32, 32))};
  initialPermutation(halves);
  uint32_t left = rotateRight(halves.left, 1);
  uint32_t right = rotateRight(halves.right, 1);
  for (unsigned round = 0; round < 16; round += 2) {
    left ^= stateRound(right, state, round);
    right ^= stateRound(left, state, round + 1);
  }
  halves = {rotateLeft(left, 1), rotateLeft(right, 1)};
  finalPermutation(halves);
  spreadBits(block, halves.left, 32);
  spreadBits(block + 32, halves.right, 32);
  return 0;
}

char* _crypt(char const* key, char const* salt) noexcept {
  return _crypt_r(key, salt, &CD);
}
int _setkey(char const* key) noexcept {
  return _setkey_r(key, &CD);
}
int _encrypt(char* block, int decrypt) noexcept {
  return _encrypt_r(block, decrypt, &CD);
}

char* __crypt_std_r(char const* key, char const* salt, ldappw_crypt_data* state) noexcept {
  return _crypt_r(key, salt, state);
}

char* __crypt_std(char const* key, char const* salt) noexcept {
  return __crypt_std_r(key, salt, &CD);
}

int ldappw_setkey_r(char const* key, ldappw_crypt_data* state) noexcept {
  _setkey_r(key, state);
  return 0;
}

int ldappw_encrypt_r(char* block, int decrypt, ldappw_crypt_data* state) noexcept {
  _encrypt_r(block, decrypt, state);
  return 0;
}

int ldappw_setkey(char const* key) noexcept {
  return ldappw_setkey_r(key, &CD);
}
int ldappw_encrypt(char* block, int decrypt) noexcept {
  return ldappw_encrypt_r(block, decrypt, &CD);
}

}  // extern "C"
