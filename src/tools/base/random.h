// SPDX-License-Identifier: Apache-2.0
// Random bytes of the system's generator.
#pragma once

#include <cstddef>

namespace tool {

// Fills out; throws Failure with kInternal when the system has no random bytes.
void drawRandom(void* out, size_t bytes);

}  // namespace tool
