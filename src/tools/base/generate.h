// SPDX-License-Identifier: Apache-2.0
// New passwords.
#pragma once

#include <cstddef>

#include "base/secret.h"

namespace tool {

// A password of so many letters and digits, without those that are easily taken for one another; each has 5.8 bits.
// Throws Failure (kInternal) when there are no random bytes.
Secret generatePassword(size_t characters);

}  // namespace tool
