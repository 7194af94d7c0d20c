// SPDX-License-Identifier: Apache-2.0
// Everything that a stored value shows without keys, found once and handed on: payloads are decoded for it.
#pragma once

#include <cstddef>

#include "base/failure.h"
#include "schemes/schemes.h"
#include "schemes/wrapping.h"

namespace tool {

// What a conversion refuses and an audit reports.
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
static_assert(kConditionCount == static_cast<size_t>(Condition::kEncoded) + 1);

constexpr const ConditionText& textOf(Condition condition) {
  return kConditions[static_cast<size_t>(condition)];
}

// Refers to the bytes of the value, like StoredValue.
struct Examined {
  StoredValue value;
  const char* problem;  // of value, or null
  Wrapping wrapping;
  Condition condition;  // never one that only keys or lines can show: kUnopened, kNotText, kBroken

  const Scheme& scheme() const noexcept { return value.scheme(); }
};

Examined examine(const Secret& value);

}  // namespace tool
