// SPDX-License-Identifier: Apache-2.0
// SHA-1 as the product calls it, and the two ways to it.
#pragma once

#include <cstddef>

#include "password_schemes.h"
#include "support/processor.h"

namespace ldappw {

// For any processor, and the reference of the other.
void digestPlainly(const unsigned char* data, size_t length, sha_digest* digest) noexcept;

// For those that have the SHA extensions.
void digestWithExtensions(const unsigned char* data, size_t length, sha_digest* digest) noexcept;

inline void digestBytes(const unsigned char* data, size_t length, sha_digest* digest) noexcept {
  (processor.hasSha ? digestWithExtensions : digestPlainly)(data, length, digest);
}

}  // namespace ldappw
