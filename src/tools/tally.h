// SPDX-License-Identifier: Apache-2.0
// What a pass over an export counts: totals, and counts by scheme. Each pass gives the places meaning by an enumeration
// and names them by a table.
#ifndef LDAPPW_TOOLS_TALLY_H
#define LDAPPW_TOOLS_TALLY_H

#include <array>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "results.h"
#include "scheme.h"

namespace tool {

struct Tally {
  static constexpr std::size_t kTotals = 16;
  static constexpr std::size_t kColumns = 6;
  using Row = std::array<std::uint64_t, kColumns>;

  std::uint64_t entries = 0;
  std::array<std::uint64_t, kTotals> totals{};
  std::vector<Row> schemes{kSchemes.size()};

  Row& of(const Scheme& scheme) { return schemes[kSchemes.indexOf(scheme)]; }
  const Row& of(const Scheme& scheme) const { return schemes[kSchemes.indexOf(scheme)]; }
  void add(const Tally& part) noexcept;
};

// The name of a total or column as a JSON field, and as text.
struct CountName {
  const char* name;
  const char* text;
};

// Cells of a table: text filled up to width with blanks, before it or, for a left cell, after it.
std::string cell(std::string_view text, std::size_t width);
std::string cell(std::uint64_t number, std::size_t width);
std::string leftCell(std::string_view text, std::size_t width);

// The fields of consecutive counts.
template <std::size_t N>
void addCounts(Json& json, const CountName (&names)[N], const std::uint64_t* counts) {
  for (std::size_t i = 0; i < N; ++i) json.number(names[i].name, counts[i]);
}

}  // namespace tool

#endif
