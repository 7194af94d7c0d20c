// SPDX-License-Identifier: Apache-2.0
// Base64 (RFC 4648, padded) into memory that is wiped.
#pragma once

#include <string_view>

#include "base/secret.h"

namespace tool {

// Throw std::bad_alloc when memory runs out.
void appendBase64(std::string_view bytes, Secret& out);
// False, with no bytes, for a text that is no base64.
bool decodeBase64(std::string_view text, Secret& bytes);

}  // namespace tool
