// SPDX-License-Identifier: Apache-2.0
// The random numbers behind random texts.
#pragma once

namespace ldappw {

// A random number from lowBound to highBound - 1. Ends the process for bounds that are not in order.
int morva_rand_range(void* qelCtx, int lowBound, int highBound) noexcept;

}  // namespace ldappw
