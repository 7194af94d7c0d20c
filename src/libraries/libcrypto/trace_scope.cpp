// SPDX-License-Identifier: Apache-2.0
// The usual trace lines; out of line, since they run only while debug lines are on.
#include "trace_scope.h"

#include <cstdio>

namespace ldappw {

void TracedCall::writeEntering(std::initializer_list<TraceArgument> arguments) noexcept {
  char list[512] = "";  // the longest list has ten arguments of at most 40 characters
  size_t used = 0;
  const char* separator = " ";
  for (const TraceArgument& argument : arguments) {
    const int written =
        std::snprintf(list + used, sizeof list - used, "%s%s = %p", separator, argument.name, argument.value);
    used += static_cast<size_t>(written);
    if (used >= sizeof list) break;
    separator = ", ";
  }
  const char* name = info_.enteringAs != nullptr ? info_.enteringAs : info_.name;
  ldtr_formater_local(&info_.scope, LDTR_DEBUG, "%s: Entering.%s\n", name, list);
}

void TracedCall::writeLeaving() noexcept {
  if (info_.leavingLine != nullptr) {
    ldtr_formater_local(&info_.scope, LDTR_DEBUG, info_.leavingLine, scope_.rc());
  } else {
    ldtr_formater_local(&info_.scope, LDTR_DEBUG, "%s: Leaving. rc = %d\n", info_.name, scope_.rc());
  }
}

void TracedCall::writeFailure(const char* what, int shown) noexcept {
  ldtr_formater_local(&info_.scope, static_cast<int>(info_.failures), "Error - %s: %s rc = %d\n", info_.name, what,
                      shown);
}

}  // namespace ldappw
