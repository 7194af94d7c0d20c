// SPDX-License-Identifier: Apache-2.0
// Adding tallies, and the cells of their tables.
#include "tally.h"

#include <algorithm>
#include <functional>

namespace tool {
namespace {

template <class Counts>
void addTo(Counts& sum, const Counts& part) noexcept {
  std::transform(sum.begin(), sum.end(), part.begin(), sum.begin(), std::plus<>());
}

}  // namespace

void Tally::add(const Tally& part) noexcept {
  entries += part.entries;
  addTo(totals, part.totals);
  for (std::size_t i = 0; i < schemes.size(); ++i) addTo(schemes[i], part.schemes[i]);
}

std::string cell(std::string_view text, std::size_t width) {
  return std::string(width - std::min(width, text.size()), ' ').append(text);
}

std::string cell(std::uint64_t number, std::size_t width) {
  return cell(std::to_string(number), width);
}

std::string leftCell(std::string_view text, std::size_t width) {
  return std::string(text).append(width - std::min(width, text.size()), ' ');
}

}  // namespace tool
