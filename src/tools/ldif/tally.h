// SPDX-License-Identifier: Apache-2.0
// What a pass over an export counts: totals, and counts by scheme. Each pass gives the places meaning by an enumeration
// and names them by a table.
#pragma once

#include <algorithm>
#include <array>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "base/results.h"
#include "schemes/schemes.h"

namespace tool {

struct Tally {
  static constexpr size_t kTotals = 24;
  static constexpr size_t kColumns = 6;
  using Row = std::array<std::uint64_t, kColumns>;

  std::uint64_t entries = 0;
  std::uint64_t outside = 0;  // runs of lines that belong to no entry
  std::array<std::uint64_t, kTotals> totals{};
  std::vector<Row> schemes = std::vector<Row>(kSchemes.size());

  Row& of(const Scheme& scheme) { return schemes[indexOf(scheme)]; }
  const Row& of(const Scheme& scheme) const { return const_cast<Tally*>(this)->of(scheme); }
  void add(const Tally& part) noexcept {
    entries += part.entries;
    outside += part.outside;
    addRow(totals, part.totals);
    for (size_t i = 0; i < schemes.size(); ++i) addRow(schemes[i], part.schemes[i]);
  }

 private:
  template <size_t N>
  static void addRow(std::array<std::uint64_t, N>& sum, const std::array<std::uint64_t, N>& part) noexcept {
    for (size_t i = 0; i < N; ++i) sum[i] += part[i];
  }
};

// The schemes of which a column counts any.
template <typename Work>
void forEachScheme(const Tally& tally, size_t column, const Work& work) {
  for (const Scheme& scheme : kSchemes) {
    if (tally.of(scheme)[column] > 0) work(scheme, tally.of(scheme)[column]);
  }
}

// The name of a total or column as a JSON field, and as text.
struct CountName {
  const char* name;
  const char* text;
};

// Cells of a table: filled up to width with blanks, before a number or heading and after the name of a row.
inline std::string cell(std::string_view text, size_t width) {
  return std::string(width - std::min(width, text.size()), ' ').append(text);
}
inline std::string cell(std::uint64_t number, size_t width) {
  return cell(std::to_string(number), width);
}
inline std::string leftCell(std::string_view text, size_t width) {
  return std::string(text).append(width - std::min(width, text.size()), ' ');
}

// The fields of consecutive counts.
template <size_t N>
void addCounts(Json& json, const CountName (&names)[N], const std::uint64_t* counts) {
  for (size_t i = 0; i < N; ++i) json.number(names[i].name, counts[i]);
}

}  // namespace tool
