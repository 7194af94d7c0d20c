// SPDX-License-Identifier: Apache-2.0
// The salt of new {crypt} values.
#include "password_schemes.h"

#include <unistd.h>

#include <cstdint>
#include <cstdlib>
#include <ctime>

namespace ldappw {
namespace {

// The digits end in 0 here: the order decides which salt a seed gives.
constexpr char kSaltCharacters[] = "abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ1234567890./";
constexpr int kSeedModulus = 2147483647;

}  // namespace
}  // namespace ldappw

using namespace ldappw;

extern "C" {

// Documented in password_schemes.h.

void generate_crypt_salt(char* out) noexcept {
  if (out == nullptr) return;
  const auto mixed = static_cast<int32_t>(static_cast<uint32_t>(std::time(nullptr)) ^ static_cast<uint32_t>(getpid()));
  auto seed = static_cast<unsigned>(mixed % kSeedModulus);
  for (unsigned i = 0; i < 2; ++i) {
    const auto drawn = static_cast<unsigned>(rand_r(&seed));
    out[i] = kSaltCharacters[(drawn >> 4U) % 64U];
  }
  out[2] = '\0';
}

}  // extern "C"
