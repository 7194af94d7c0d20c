// SPDX-License-Identifier: Apache-2.0
// What the password module needs of the Unix crypt beside its public operations.
#pragma once

namespace ldappw {

// Clears the round keys and the block that the last _crypt left in the process-wide state.
void wipeCryptState() noexcept;

}  // namespace ldappw
