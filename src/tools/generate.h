// SPDX-License-Identifier: Apache-2.0
// New passwords.
#ifndef LDAPPW_TOOLS_GENERATE_H
#define LDAPPW_TOOLS_GENERATE_H

#include <cstddef>

#include "secret.h"

namespace tool {

// A password of so many letters and digits, without those that are easily taken for one another; each has 5.8 bits.
// Throws Failure (kInternal) when there are no random bytes.
Secret generatePassword(std::size_t characters);

}  // namespace tool

#endif
