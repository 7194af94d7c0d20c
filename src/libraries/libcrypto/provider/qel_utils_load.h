// SPDX-License-Identifier: Apache-2.0
// Where the provider library may lie, for the tests of the loader.
#pragma once

#include "crypto_provider.h"
#include "support/owners.h"

namespace ldappw {

// New paths of the provider library, or null: the system's copy (mode 1), and the copy shipped in the install tree
// (mode 1) or that tree's library folder itself (mode 2).
PlainOwner<char> getQelInstallLibPath(int mode) noexcept;
PlainOwner<char> getKubInstallLibPath(int mode) noexcept;

}  // namespace ldappw
