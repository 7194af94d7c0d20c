// SPDX-License-Identifier: Apache-2.0
// Whole blocks of DES. Each round's lookups wait for those of the round before, so that one block leaves most of the
// processor idle; six blocks side by side fill it.
#include "crypt/crypto_des.h"

// Leaves the XORs of a round in the tree in which they are bracketed. GCC would make a chain of them, for which the
// next round waits: a block takes a fifth longer.
#if defined(__GNUC__) && !defined(__clang__)
#pragma GCC optimize("no-tree-reassoc")
#endif

namespace ldappw {
namespace {

constexpr size_t kBlockBytes = 8;
constexpr size_t kLanes = 6;

// One round: the lookups of the groups 1, 3, 5, 7 and 2, 4, 6, 8.
inline void desRound(uint32_t& to, uint32_t half, const uint32_t* roundKey) noexcept {
  const uint32_t odd = rotateRight(half, 4) ^ roundKey[0];
  const uint32_t even = half ^ roundKey[1];
  to = ((to ^ Spbox[0][(odd >> 24U) & 63U]) ^ (Spbox[2][(odd >> 16U) & 63U] ^ Spbox[4][(odd >> 8U) & 63U])) ^
       ((Spbox[6][odd & 63U] ^ Spbox[1][(even >> 24U) & 63U]) ^
        ((Spbox[3][(even >> 16U) & 63U] ^ Spbox[5][(even >> 8U) & 63U]) ^ Spbox[7][even & 63U]));
}

template <size_t kCount>
void sideBySide(const uint32_t* schedule, unsigned char* bytes) noexcept {
  Halves blocks[kCount];
  for (size_t i = 0; i < kCount; ++i) {
    blocks[i] = {loadBigEndian(bytes + kBlockBytes * i), loadBigEndian(bytes + kBlockBytes * i + 4)};
    initialPermutation(blocks[i]);
  }
  for (const uint32_t* key = schedule; key != schedule + 32; key += 4) {
    for (Halves& block : blocks) desRound(block.left, block.right, key);
    for (Halves& block : blocks) desRound(block.right, block.left, key + 2);
  }
  for (size_t i = 0; i < kCount; ++i) {
    finalPermutation(blocks[i]);
    storeBigEndian(bytes + kBlockBytes * i, blocks[i].left);
    storeBigEndian(bytes + kBlockBytes * i + 4, blocks[i].right);
  }
}

}  // namespace

void desBlocks(const uint32_t* schedule, unsigned char* blocks, size_t count) noexcept {
  for (; count >= kLanes; count -= kLanes, blocks += kLanes * kBlockBytes) sideBySide<kLanes>(schedule, blocks);
  for (; count > 0; --count, blocks += kBlockBytes) sideBySide<1>(schedule, blocks);
}

}  // namespace ldappw
