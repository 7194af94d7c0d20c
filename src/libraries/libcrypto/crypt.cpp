// SPDX-License-Identifier: Apache-2.0
// The traditional Unix crypt: DES applied 25 times to a block of zeros, the password as key, with an expansion that the
// salt perturbs. The hash runs on the DES kernel; the one-bit-a-byte state that the interface promises is filled from
// its results, and only _encrypt_r works from that state.
#include "crypt_state.h"

#include <cstring>

#include "bits.h"
#include "crypto_des.h"
#include "password_schemes.h"

static_assert(sizeof(ldappw_crypt_data) == 898 && offsetof(ldappw_crypt_data, KS) == 48 &&
                  offsetof(ldappw_crypt_data, block) == 816 && offsetof(ldappw_crypt_data, iobuf) == 882,
              "callers allocate this record");

namespace ldappw {
namespace {

constexpr unsigned kIterations = 25;
constexpr unsigned kHashCharacters = 11;
constexpr char kDigits[] = "./0123456789ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz";

ldappw_crypt_data CD;  // of the forms that take no state

// The salt exchanges bits of the expanded block 24 places apart: those of the groups 1 and 5, and of 2 and 6. The masks
// select them in the lower group of a pair.
struct SaltMasks {
  uint32_t odd;
  uint32_t even;
};

// The six bits of a salt character. Characters that no salt should hold count by the same arithmetic.
unsigned saltBits(char character) noexcept {
  int value = character;
  if (value > 'Z') value -= 6;
  if (value > '9') value -= 7;
  return static_cast<unsigned>(value - '.') & 63U;
}

// The expansion's first input of a group is the highest of its six bits, and the salt's lowest bit is for it.
uint32_t saltMask(unsigned bits) noexcept {
  uint32_t mask = 0;
  for (unsigned j = 0; j < 6; ++j) mask |= ((bits >> j) & 1U) << (13U - j);
  return mask;
}

uint32_t salted(uint32_t word, uint32_t mask) noexcept {
  const uint32_t difference = (word ^ (word >> 16U)) & mask;
  return word ^ difference ^ (difference << 16U);
}

uint32_t saltedRound(uint32_t half, const uint32_t* roundKey, const SaltMasks& salt) noexcept {
  return substituted(salted(rotateRight(half, 4), salt.odd) ^ roundKey[0], salted(half, salt.even) ^ roundKey[1]);
}

// The permutations that end one iteration and begin the next cancel out, but for the exchange of the halves.
uint64_t hashed(const DesSchedule& schedule, const SaltMasks& salt) noexcept {
  Halves block{0, 0};
  for (unsigned i = 0; i < kIterations; ++i) {
    const uint32_t left = block.left;
    block.left = i == 0 ? left : block.right;
    block.right = i == 0 ? block.right : left;
    for (const uint32_t* key = schedule.words; key != schedule.words + 32; key += 4) {
      block.left ^= saltedRound(block.right, key, salt);
      block.right ^= saltedRound(block.left, key + 2, salt);
    }
  }
  finalPermutation(block);
  return uint64_t{block.left} << 32U | block.right;
}

// One bit a byte, the most significant first. The product puts copies of the byte nine places apart, so that each of
// its bits lands in a byte of its own; the bytes then lie in the order of x86's memory.
void spreadByte(char* to, unsigned byte) noexcept {
  const uint64_t bits = ((uint64_t{byte} * 0x8040201008040201U) >> 7U) & 0x0101010101010101U;
  std::memcpy(to, &bits, sizeof bits);
}

void spreadBits(char* to, uint64_t bits, unsigned count) noexcept {
  for (unsigned i = 0; i < count; i += 8) spreadByte(to + i, static_cast<unsigned>(bits >> (count - 8 - i)) & 255U);
}

uint64_t gatheredBits(const char* from, unsigned count) noexcept {
  uint64_t bits = 0;
  for (unsigned i = 0; i < count; ++i) bits = bits << 1U | (static_cast<unsigned char>(from[i]) & 1U);
  return bits;
}

void spreadSchedule(ldappw_crypt_data* state, const DesSchedule& schedule) noexcept {
  for (unsigned round = 0; round < 16; ++round) {
    uint64_t groups = 0;
    for (unsigned group = 0; group < 8; ++group) {
      const uint32_t word = schedule.words[2 * round + group % 2];
      groups = groups << 6U | ((word >> (24U - 8U * (group / 2))) & 63U);
    }
    spreadBits(state->KS[round], groups, 48);
  }
}

void swapExpansion(ldappw_crypt_data* state, unsigned saltIndex, unsigned bits) noexcept {
  for (unsigned j = 0; j < 6; ++j) {
    if (((bits >> j) & 1U) == 0) continue;
    char& low = state->E[6 * saltIndex + j];
    char& high = state->E[6 * saltIndex + j + 24];
    const char kept = low;
    low = high;
    high = kept;
  }
}

void keyFromText(unsigned char (&key)[8], const char* text) noexcept {
  for (unsigned i = 0; i < 8 && text[i] != '\0'; ++i) {
    key[i] = static_cast<unsigned char>(static_cast<unsigned char>(text[i]) << 1U);
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

void wipeCryptState() noexcept {
  wipe(CD.KS, sizeof CD.KS);
  wipe(CD.block, sizeof CD.block);
}

}  // namespace ldappw

using namespace ldappw;

extern "C" {

// Documented in password_schemes.h.

char* _crypt_r(char const* key, char const* salt, ldappw_crypt_data* state) noexcept {
  if (key == nullptr || salt == nullptr || state == nullptr) return nullptr;
  unsigned char keyBytes[8] = {};
  keyFromText(keyBytes, key);
  DesSchedule schedule;
  buildSchedule(schedule.words, keyBytes);
  wipe(keyBytes, sizeof keyBytes);

  const char saltCharacters[2] = {salt[0], salt[0] == '\0' ? '\0' : salt[1]};
  const unsigned bits[2] = {saltBits(saltCharacters[0]), saltBits(saltCharacters[1])};
  const uint64_t hash = hashed(schedule, {saltMask(bits[0]), saltMask(bits[1])});

  spreadSchedule(state, schedule);
  std::memcpy(state->E, kExpansion, sizeof state->E);
  for (unsigned i = 0; i < 2; ++i) {
    state->iobuf[i] = saltCharacters[i];
    swapExpansion(state, i, bits[i]);
  }
  spreadBits(state->block, hash, 64);
  state->block[64] = state->block[65] = 0;
  for (unsigned k = 0; k < kHashCharacters; ++k) {
    const uint64_t six = k < 10 ? hash >> (58U - 6U * k) : hash << 2U;
    state->iobuf[2 + k] = kDigits[six & 63U];
  }
  state->iobuf[13] = '\0';
  if (state->iobuf[1] == '\0') state->iobuf[1] = state->iobuf[0];
  return state->iobuf;
}

int _setkey_r(char const* key, ldappw_crypt_data* state) noexcept {
  if (key == nullptr || state == nullptr) return -1;
  unsigned char keyBytes[8];
  for (unsigned i = 0; i < 8; ++i) keyBytes[i] = static_cast<unsigned char>(gatheredBits(key + 8 * i, 8));
  DesSchedule schedule;
  buildSchedule(schedule.words, keyBytes);
  wipe(keyBytes, sizeof keyBytes);
  spreadSchedule(state, schedule);
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
