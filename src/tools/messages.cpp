// SPDX-License-Identifier: Apache-2.0
#include "messages.h"

#include <unistd.h>

#include <new>
#include <string>

#include "descriptor.h"
#include "text.h"

namespace tool {
namespace {

void show(const char* prefix, std::string_view text) noexcept {
  try {
    tryWrite(STDERR_FILENO, prefix + printable(text) + '\n');
  } catch (const std::bad_alloc&) {
    tryWrite(STDERR_FILENO, "ldappw: out of memory\n");
  }
}

}  // namespace

void message(std::string_view text) noexcept {
  show("ldappw: ", text);
}

void warning(std::string_view text) noexcept {
  show("ldappw: warning: ", text);
}

}  // namespace tool
