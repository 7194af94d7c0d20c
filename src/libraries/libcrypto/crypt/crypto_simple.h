// SPDX-License-Identifier: Apache-2.0
// simpleCrypt without the copy.
#pragma once

#include <cstddef>

namespace ldappw {

// XORs n bytes with the key text in place; its own inverse.
void simpleCryptInPlace(unsigned char* data, size_t n) noexcept;

}  // namespace ldappw
