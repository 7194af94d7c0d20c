// SPDX-License-Identifier: Apache-2.0
// Counters of a pass over an export. Each pass has a struct of them and a table with their names, by which they are
// added up and shown.
#pragma once

#include <algorithm>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "base/results.h"
#include "schemes/schemes.h"

namespace tool {

template <typename Counts>
struct CountName {
  std::uint64_t Counts::*counter;
  const char* name;  // as a JSON field
  const char* text;
};

template <typename Counts, size_t N>
void addCounts(Counts& sum, const Counts& part, const CountName<Counts> (&names)[N]) noexcept {
  static_assert(sizeof(Counts) == N * sizeof(std::uint64_t), "each counter has a name");
  for (const CountName<Counts>& row : names) sum.*row.counter += part.*row.counter;
}

template <typename Counts, size_t N>
void addFields(Json& json, const Counts& counts, const CountName<Counts> (&names)[N]) {
  for (const CountName<Counts>& row : names) json.number(row.name, counts.*row.counter);
}

// Counters for each scheme of the table.
template <typename Counts>
class ByScheme {
 public:
  Counts& of(const Scheme& scheme) { return rows_[indexOf(scheme)]; }
  const Counts& of(const Scheme& scheme) const { return rows_[indexOf(scheme)]; }
  template <size_t N>
  void add(const ByScheme& part, const CountName<Counts> (&names)[N]) noexcept {
    for (size_t i = 0; i < rows_.size(); ++i) addCounts(rows_[i], part.rows_[i], names);
  }

 private:
  std::vector<Counts> rows_ = std::vector<Counts>(kSchemes.size());
};

// Cells of a table, filled up to a width with blanks: before a number or heading, and after the name of a row.
inline std::string cell(std::string_view text, size_t width) {
  return std::string(width - std::min(width, text.size()), ' ').append(text);
}
inline std::string cell(std::uint64_t number, size_t width) {
  return cell(std::to_string(number), width);
}
inline std::string leftCell(std::string_view text, size_t width) {
  return std::string(text).append(width - std::min(width, text.size()), ' ');
}

}  // namespace tool
