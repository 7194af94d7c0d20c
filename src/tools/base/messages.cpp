// SPDX-License-Identifier: Apache-2.0
#include "base/messages.h"

#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <new>
#include <string>

#include "base/descriptor.h"
#include "base/text.h"

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

void Repeated::add(const std::string& text, const std::string& kind) {
  if (++counts_[kind] <= most_) show_(text);
}

void Repeated::finish() noexcept {
  for (const auto& [kind, count] : counts_) {
    char number[32];
    snprintf(number, sizeof number, "%llu more: ", static_cast<unsigned long long>(count - std::min(count, most_)));
    try {
      if (count > most_) show_(number + kind);
    } catch (const std::bad_alloc&) {
      show_("there are more of these");
    }
  }
  counts_.clear();
}

}  // namespace tool
