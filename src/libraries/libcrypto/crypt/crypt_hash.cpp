// SPDX-License-Identifier: Apache-2.0
// The hash of the Unix crypt after Feldmeier and Karn, "UNIX Password Security - Ten Years Later" (CRYPTO '89): both
// halves stay expanded to 48 bits, six to a byte, from the first round to the last; one table does S-box, permutation
// and expansion; the salt is worked into the tables once a call; and of the permutations between the iterations nothing
// is left but the exchange of the halves.
#include "crypt/crypt_hash.h"

#include <utility>

// Leaves the XORs of a round in the tree in which they are bracketed. GCC would make a chain of them, for which the
// next round waits: the hash takes a quarter longer.
#if defined(__GNUC__) && !defined(__clang__)
#pragma GCC optimize("no-tree-reassoc")
#endif

namespace ldappw {
namespace {

constexpr unsigned kIterations = 25;
constexpr char kDigits[] = "./0123456789ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz";

// The six bits of a salt character. Characters that no salt should hold count by the same arithmetic.
unsigned bitsOf(char character) noexcept {
  int value = character;
  value -= value > 'Z' ? 6 : 0;
  value -= value > '9' ? 7 : 0;
  return static_cast<unsigned>(value - '.') & 63U;
}

// A salt character exchanges bits of its group, the first or the second, with those of the group four further on.
uint32_t maskOf(unsigned group, unsigned bits) noexcept {
  uint32_t mask = 0;
  for (unsigned j = 0; j < 6; ++j) mask |= ((bits >> j) & 1U) << (kGroupShifts[group] + 5U - j);
  return mask;
}

WordPair salted(const WordPair& pair, uint32_t mask) noexcept {
  const uint32_t difference = (pair[0] ^ pair[1]) & mask;
  return {pair[0] ^ difference, pair[1] ^ difference};
}

// The reference is restricted so that the compiler uses vectors: a call is a tenth faster.
void saltBoxes(ExpandedBoxes& __restrict boxes, uint32_t mask) noexcept {
  for (unsigned box = 0; box < 8; ++box) {
    for (unsigned i = 0; i < 64; ++i) boxes[box][i] = salted(kExpandedBoxes[box][i], mask);
  }
}

inline uint64_t joined(uint32_t c, uint32_t d) noexcept {
  return uint64_t{d} << 32U | c;
}
inline uint64_t joined(const WordPair& pair) noexcept {
  return joined(pair[0], pair[1]);
}
inline WordPair parted(uint64_t joinedWords) noexcept {
  return {static_cast<uint32_t>(joinedWords), static_cast<uint32_t>(joinedWords >> 32U)};
}

// One round: the half other, XORed with what the boxes make of the half in, which comes with its round key in it. The
// XORs are bracketed so that what is there first is combined first.
inline uint64_t cryptRound(uint64_t other, uint64_t in, const ExpandedBoxes& boxes) noexcept {
  const auto a = static_cast<uint16_t>(in);
  const auto b = static_cast<uint16_t>(in >> 16U);
  const auto c = static_cast<uint16_t>(in >> 32U);
  const auto d = static_cast<uint16_t>(in >> 48U);
  return (((other ^ joined(boxes[0][a & 255U])) ^ (joined(boxes[1][a >> 8U]) ^ joined(boxes[7][d >> 8U]))) ^
          joined(boxes[6][d & 255U])) ^
         ((joined(boxes[2][b & 255U]) ^ joined(boxes[3][b >> 8U])) ^
          (joined(boxes[4][c & 255U]) ^ joined(boxes[5][c >> 8U])));
}

// The half that a pair stands for: the four inner bits of each group. Rotated, as the permutations of DES take it.
uint32_t collapsed(const WordPair& pair) noexcept {
  uint32_t half = 0;
  for (unsigned group = 0; group < 8; ++group) {
    half = half << 4U | (pair[group / 4] >> (kGroupShifts[group % 4] + 1U) & 15U);
  }
  return rotateLeft(half, 1);
}

// The round keys as the rounds take them, wiped when they go. A half carries the key of the next round that reads it.
// Two rounds later it is to carry another: the difference of the two is XORed in, off the path of the lookups.
struct KeySteps {
  uint64_t first;
  uint64_t second;
  uint64_t steps[16];

  explicit KeySteps(const RoundKeys& keys) noexcept {
    const auto key = [&keys](unsigned round) { return joined(keys.c[round], keys.d[round]); };
    first = key(0);
    second = key(1);
    for (unsigned i = 0; i < 14; ++i) steps[i] = key(i) ^ key(i + 2);
    steps[14] = key(14) ^ second;  // the halves are exchanged before the next iteration
    steps[15] = key(15) ^ first;
  }
  ~KeySteps() { wipe(this, sizeof *this); }
};

}  // namespace

CryptSalt::CryptSalt(const char* salt) noexcept
    : characters{salt[0], salt[0] == '\0' ? '\0' : salt[1]}, bits{bitsOf(characters[0]), bitsOf(characters[1])} {}

void writeCryptText(const CryptSalt& salt, uint64_t hash, char* text) noexcept {
  text[0] = salt.characters[0];
  text[1] = salt.characters[salt.characters[1] == '\0' ? 0 : 1];
  for (unsigned k = 0; k < kCryptCharacters - 2; ++k) {
    const uint64_t six = k < 10 ? hash >> (58U - 6U * k) : hash << 2U;
    text[2 + k] = kDigits[six & 63U];
  }
}

CryptInput::CryptInput(const char* key, const char* salt) noexcept
    : salt_(salt), saltMask_(maskOf(0, salt_.bits[0]) | maskOf(1, salt_.bits[1])) {
  unsigned char bytes[8] = {};
  for (unsigned i = 0; i < 8 && key[i] != '\0'; ++i) {
    bytes[i] = static_cast<unsigned char>(static_cast<unsigned char>(key[i]) << 1U);
  }
  deriveRoundKeys(keys_, bytes);
  wipe(bytes, sizeof bytes);
  saltBoxes(boxes_, saltMask_);
}

uint64_t CryptInput::hash() const noexcept {
  const KeySteps keys(keys_);
  uint64_t left = keys.second;
  uint64_t right = keys.first;
  for (unsigned i = 0; i < kIterations; ++i) {
#pragma GCC unroll 8
    for (unsigned round = 0; round < 16; round += 2) {
      left = cryptRound(left, right, boxes_);
      right = cryptRound(right ^ keys.steps[round], left, boxes_);
      left ^= keys.steps[round + 1];
    }
    std::swap(left, right);
  }
  Halves block{collapsed(salted(parted(right ^ keys.first), saltMask_)),
               collapsed(salted(parted(left ^ keys.second), saltMask_))};
  finalPermutation(block);
  return uint64_t{block.left} << 32U | block.right;
}

}  // namespace ldappw
