// SPDX-License-Identifier: Apache-2.0
// Stored values that somebody has altered. A conversion that took them for clear passwords would protect the value in
// place of the password behind it.
#pragma once

#include "schemes/scheme.h"

namespace tool {

enum class Wrapping {
  kNone,
  kLocked,  // "!", "*", "x" and the like, or such a mark before a value or its payload: no password may match
  kPadded,  // blanks before or after a value
  kEncoded  // base64 of a value
};

// problem is that of the value.
Wrapping wrappingOf(const StoredValue& value, const char* problem);

// The value within one that is padded or encoded.
Secret unwrapped(const Secret& value, Wrapping wrapping);

}  // namespace tool
