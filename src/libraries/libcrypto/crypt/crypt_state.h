// SPDX-License-Identifier: Apache-2.0
// What the password module needs of the Unix crypt beside its public operations.
#pragma once

#include "crypt/crypt_hash.h"

namespace ldappw {

// _crypt on the process-wide state, with neither the round keys nor the block left in it. One call at a time.
char* cryptWiped(const CryptInput& input) noexcept;

}  // namespace ldappw
