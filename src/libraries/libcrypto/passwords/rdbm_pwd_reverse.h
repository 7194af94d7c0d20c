// SPDX-License-Identifier: Apache-2.0
// Undoing the masked encoding of a stored value, as verification calls it.
#pragma once

#include <cstddef>

namespace ldappw {

// Decodes what is taken of a masked value, the first 164 characters, into a new clear text, or null where it holds
// none. Returns the decoder's code.
int unmaskPayload(const char* payload, size_t length, char** clear) noexcept;

}  // namespace ldappw
