// SPDX-License-Identifier: Apache-2.0
// The usual trace lines; out of line, since they run only while debug lines are on.
#include "support/trace_scope.h"

#include <cstdio>

namespace ldappw {
namespace {

constexpr size_t kLineSize = 2048;  // the longest line shows an attach path of 1023 characters

// Formats here, where the compiler has checked the format, so that the facility gets no format from a variable.
struct Line {
  Line(const char* format, va_list values) noexcept { std::vsnprintf(text, sizeof text, format, values); }
  char text[kLineSize];
};

}  // namespace

int TracedCall::failShowing(int rc, const char* what, int shown) noexcept {
  line(info().failures, "Error - %s: %s rc = %d\n", info().name, what, shown);
  return leave(rc);
}

int TracedCall::failText(int rc, const char* format, ...) noexcept {
  va_list values;
  va_start(values, format);
  write(info().failures, format, values);
  va_end(values);
  return leave(rc);
}

void TracedCall::line(LineClass lineClass, const char* format, ...) noexcept {
  va_list values;
  va_start(values, format);
  write(lineClass, format, values);
  va_end(values);
}

void TracedCall::write(LineClass lineClass, const char* format, va_list values) noexcept {
  if (!scope_.debugOn()) return;
  ldtr_formater_local(&info(), static_cast<int>(lineClass), "%s", Line(format, values).text);
}

void TracedCall::writeEntering(const void* const* arguments, size_t count) noexcept {
  char list[512] = "";  // six arguments of at most 40 characters
  size_t used = 0;
  for (size_t i = 0; i < count && used < sizeof list; ++i) {
    const int written = std::snprintf(list + used, sizeof list - used, "%s %s = %p", i == 0 ? "" : ",",
                                      info().arguments.names[i], arguments[i]);
    used += static_cast<size_t>(written);
  }
  line(LineClass::debug, "%s: Entering.%s\n", info().enteringAs != nullptr ? info().enteringAs : info().name, list);
}

void TracedCall::writeLeaving() noexcept {
  if (info().leavingLine != nullptr) {
    ldtr_formater_local(&info(), LDTR_DEBUG, info().leavingLine, scope_.rc());
  } else {
    line(LineClass::debug, "%s: Leaving. rc = %d\n", info().name, scope_.rc());
  }
}

void globalLine(LineClass lineClass, const char* format, ...) noexcept {
  if ((ldtr_events() & static_cast<unsigned>(LDTR_EVENT_DEBUG)) == 0) return;
  va_list values;
  va_start(values, format);
  ldtr_formater_global(static_cast<int>(lineClass), "%s", Line(format, values).text);
  va_end(values);
}

}  // namespace ldappw
