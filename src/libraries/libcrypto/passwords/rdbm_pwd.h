// SPDX-License-Identifier: Apache-2.0
// Detection of a value's scheme, as the password module's other pieces call it.
#pragma once

#include "passwords/rdbm_pwd_schemes.h"

namespace ldappw {

// The row of check_format's code; traced as check_format.
const Scheme& schemeOf(const char* value, size_t length) noexcept;

}  // namespace ldappw
