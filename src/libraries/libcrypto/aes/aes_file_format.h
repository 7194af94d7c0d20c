// SPDX-License-Identifier: Apache-2.0
// The writer of stash files, which the library keeps to itself.
#pragma once

#include "aes_keys.h"

namespace ldappw {

// Writes a stash file, created with mode 0600 or truncated. Returns 0 or 1; a file written in part stays.
int writeKeyStashFile(const char* keyStashFile, const AesKeyData* keyData) noexcept;

}  // namespace ldappw
