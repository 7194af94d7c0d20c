// SPDX-License-Identifier: Apache-2.0
// Recognising a library's cell that is closed already, for an owner whose pointer to it stays.
#pragma once

namespace ldappw {

// Remembers one cell that has been closed, until ldapLoadLib gives out its address again.
void rememberClosed(void** cell) noexcept;
bool isClosed(void** cell) noexcept;

}  // namespace ldappw
