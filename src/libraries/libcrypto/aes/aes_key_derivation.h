// SPDX-License-Identifier: Apache-2.0
// The derivation as key generation calls it.
#pragma once

#include "provider/qel_utils.h"

namespace ldappw {

// What keys are derived from.
struct DerivationInput {
  const unsigned char* seed;
  uint32_t seedLength;
  const unsigned char* salt;
  uint64_t saltLength;
  uint32_t iterations;
};

// morva_pbkdf2 for keys that get into use: LDAPPW_OPERATIONS_ERROR also when the provider has left a step of a round
// undone, which would give other keys than those of seed and salt.
int deriveWhole(const Digest& digest, const DerivationInput& input, unsigned char* derivedKey,
                uint64_t derivedKeyLen) noexcept;

}  // namespace ldappw
