// SPDX-License-Identifier: Apache-2.0
// A mark stands for a password, so that equal ones are found and none is kept; a sighting says whose it is.
#pragma once

#include <cstddef>
#include <cstdint>
#include <utility>

namespace tool {

using Mark = std::pair<std::uint64_t, std::uint64_t>;

// Of different kinds, equal bytes have different marks.
enum class MarkKind : char { kPassword, kValue };

// A password, or a value that stands for one, and the entry that has it, as an index into the holders of a batch.
struct Sighting {
  Mark mark;
  size_t holder;
};

}  // namespace tool
