// SPDX-License-Identifier: Apache-2.0
// The round keys of DES. Their bits are bits of the key, each in its place, so a table holds what four bits of the key add
// to all round keys at once, and an OR of sixteen rows is the result. PC-1, the rotations and PC-2 are in the table.
#include "crypt/crypto_des.h"

namespace ldappw {
namespace {

using Rows = const RoundWords* [8];  // one for each byte of the key

// The reference is restricted so that the compiler uses vectors.
void combine(RoundWords& __restrict words, const Rows& rows) noexcept {
  for (unsigned round = 0; round < 16; ++round) {
    words[round] = (*rows[0])[round] | (*rows[1])[round] | (*rows[2])[round] | (*rows[3])[round] | (*rows[4])[round] |
                   (*rows[5])[round] | (*rows[6])[round] | (*rows[7])[round];
  }
}

}  // namespace

void deriveRoundKeys(RoundKeys& keys, const unsigned char* key) noexcept {
  Rows c;
  Rows d;
  for (unsigned i = 0; i < 8; ++i) {
    c[i] = &kKeyParts.c[i][key[i] >> 4U];
    d[i] = &kKeyParts.d[i][(key[i] >> 1U) & 15U];
  }
  combine(keys.c, c);
  combine(keys.d, d);
  wipe(c, sizeof c);  // the rows' addresses are the key
  wipe(d, sizeof d);
}

}  // namespace ldappw
