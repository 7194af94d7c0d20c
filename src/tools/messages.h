// SPDX-License-Identifier: Apache-2.0
// Messages on standard error. A message is one write, and what it quotes is shown as printable() shows it.
#ifndef LDAPPW_TOOLS_MESSAGES_H
#define LDAPPW_TOOLS_MESSAGES_H

#include <string_view>

namespace tool {

void message(std::string_view text) noexcept;  // "ldappw: text"
void warning(std::string_view text) noexcept;  // "ldappw: warning: text"

}  // namespace tool

#endif
