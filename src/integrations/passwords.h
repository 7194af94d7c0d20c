// SPDX-License-Identifier: Apache-2.0
// Checking presented passwords and making stored values, as a server calls for it. Both may be called from many threads
// at once.
#pragma once

#include <string_view>

#include "schemes.h"

namespace plugin {

// Whether the clear password matches. It is never taken for anything but clear text; a payload that is not well formed
// matches nothing; without keys no AES value matches.
bool matches(const Scheme& scheme, const Check& check) noexcept;

// Makes the stored value of a clear password in memory that allocate gives, terminated, tag included. Null when none
// was made: problem then says why in a static text that is fit for a client's eyes.
char* makeValue(const Library& library, const Scheme& scheme, AesKeyData* keys, std::string_view clear,
                void* (*allocate)(size_t), const char*& problem) noexcept;

}  // namespace plugin
