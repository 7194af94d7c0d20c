// SPDX-License-Identifier: Apache-2.0
// The provider's entry table as rows, for the loader.
#pragma once

#include <cstddef>

#include "crypto_provider.h"

namespace ldappw {

struct Entry {
  const char* symbol;
  void* slot;  // of the pointer, whose type is the operation's
};

// In the order in which they are resolved, which decides which missing entry is reported.
constexpr size_t kEntryCount = 36;
extern const Entry kEntries[kEntryCount];

}  // namespace ldappw
