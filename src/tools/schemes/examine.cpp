// SPDX-License-Identifier: Apache-2.0
#include "schemes/examine.h"

namespace tool {
namespace {

Condition conditionOf(const Examined& examined) {
  constexpr Condition kWrapped[] = {Condition::kFine, Condition::kLocked, Condition::kPadded, Condition::kEncoded};
  static_assert(sizeof kWrapped / sizeof kWrapped[0] == static_cast<size_t>(Wrapping::kEncoded) + 1);
  const Scheme& scheme = examined.scheme();
  if (scheme.kind == Kind::kUnknown) return Condition::kUnknownTag;
  if (examined.value.foreign()) return Condition::kForeign;
  if (examined.wrapping != Wrapping::kNone) return kWrapped[static_cast<size_t>(examined.wrapping)];
  if (!scheme.isClear() && examined.value.tag().empty()) return Condition::kUntagged;
  return examined.problem != nullptr ? Condition::kMalformed : Condition::kFine;
}

}  // namespace

Examined examine(const Secret& value) {
  Examined examined{StoredValue(value), nullptr, Wrapping::kNone, Condition::kFine};
  examined.problem = examined.value.problem();
  examined.wrapping = wrappingOf(examined.value, examined.problem);
  examined.condition = conditionOf(examined);
  return examined;
}

}  // namespace tool
