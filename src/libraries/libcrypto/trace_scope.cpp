// SPDX-License-Identifier: Apache-2.0
// The usual trace lines; out of line, since they run only while debug lines are on.
#include "trace_scope.h"

#include <cstdio>

namespace ldappw {

void TracedCall::writeEntering(const void* const* pairs, size_t count) noexcept {
  char list[512] = "";  // the longest list has six arguments of at most 40 characters
  size_t used = 0;
  for (size_t i = 0; i < count && used < sizeof list; ++i) {
    const char* name = static_cast<const char*>(pairs[2 * i]);
    const int written =
        std::snprintf(list + used, sizeof list - used, "%s %s = %p", i == 0 ? "" : ",", name, pairs[2 * i + 1]);
    used += static_cast<size_t>(written);
  }
  const char* function = info_.enteringAs != nullptr ? info_.enteringAs : info_.name;
  ldtr_formater_local(&info_.scope, LDTR_DEBUG, "%s: Entering.%s\n", function, list);
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
