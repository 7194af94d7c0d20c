// SPDX-License-Identifier: Apache-2.0
// In what condition the password values of an export are: what an audit counts and a conversion refuses.
#pragma once

#include <cstddef>

#include "base/failure.h"
#include "ldif/wrapping.h"
#include "schemes/schemes.h"

namespace tool {

enum class Condition {
  kFine,
  kUnknownTag,
  kMalformed,
  kUntagged,
  kForeign,
  kUnopened,
  kNotText,
  kBroken,
  kLocked,
  kPadded,
  kEncoded
};

struct ConditionText {
  const char* name;  // as a JSON field
  const char* text;
  ExitCode code;
};
constexpr ConditionText kConditions[] = {
    {"fine", "well formed", kSuccess},
    {"unknownTag", "unknown tag", kBadValue},
    {"malformed", "malformed payload", kBadValue},
    {"untagged", "masked without a tag", kBadValue},
    {"cryptVariant", "crypt variant that cannot be checked", kBadValue},
    {"unopened", "not opened by the keys", kBadKey},
    {"notText", "opens into bytes that are not text, as a wrong key can make them", kBadKey},
    {"broken", "the line is not well formed", kBadValue},
    {"locked", "locked", kBadValue},
    {"padded", "a value with blanks around it", kBadValue},
    {"encoded", "a value encoded in base64 once more", kBadValue},
};
constexpr size_t kConditionCount = sizeof kConditions / sizeof kConditions[0];

constexpr const ConditionText& textOf(Condition condition) {
  return kConditions[static_cast<size_t>(condition)];
}

// As far as it shows without keys. problem is that of the value.
inline Condition conditionOf(const StoredValue& value, const char* problem) {
  constexpr Condition kWrapped[] = {Condition::kFine, Condition::kLocked, Condition::kPadded, Condition::kEncoded};
  const Scheme& scheme = value.scheme();
  if (scheme.kind == Kind::kUnknown) return Condition::kUnknownTag;
  if (value.foreign()) return Condition::kForeign;
  const Condition wrapped = kWrapped[static_cast<size_t>(wrappingOf(value))];
  if (wrapped != Condition::kFine) return wrapped;
  if (!scheme.isClear() && value.tag().empty()) return Condition::kUntagged;
  return problem != nullptr ? Condition::kMalformed : Condition::kFine;
}

}  // namespace tool
