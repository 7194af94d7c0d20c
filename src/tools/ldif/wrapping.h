// SPDX-License-Identifier: Apache-2.0
// Stored values that somebody has altered: taken for clear passwords, they would be protected in place of the password
// that they stand for.
#pragma once

#include "schemes/scheme.h"

namespace tool {

enum class Wrapping {
  kNone,
  kLocked,  // "!", "*", "x" and the like, or such a mark before a value or its payload: no password is to match
  kPadded,  // blanks before or after a value
  kEncoded  // base64 of a value
};

Wrapping wrappingOf(const StoredValue& value);

// The value within one that is padded or encoded.
Secret unwrapped(const Secret& value, Wrapping wrapping);

}  // namespace tool
