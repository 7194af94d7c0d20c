// SPDX-License-Identifier: Apache-2.0
// Making the password values of an export anew under another scheme or other keys, and leaving every other byte alone.
#ifndef LDAPPW_TOOLS_LDIF_CONVERT_H
#define LDAPPW_TOOLS_LDIF_CONVERT_H

#include <array>
#include <cstdint>
#include <string>
#include <vector>

#include "common.h"
#include "ldif_record.h"
#include "ldif_report.h"

namespace tool {

struct ConvertOptions {
  const Scheme* target = nullptr;
  KeyRecord oldKeys;
  KeyRecord newKeys;
  bool allowBinary = false;  // what opens into bytes that are not text is taken for right
};

struct ConvertTally {
  std::uint64_t entries = 0;
  std::uint64_t values = 0;
  std::uint64_t made = 0;
  std::uint64_t cut = 0;  // of made: the new value stands for the beginning of the password alone
  std::uint64_t asTheyAre = 0;
  std::uint64_t oneWay = 0;
  std::uint64_t urls = 0;
  std::uint64_t deleted = 0;
  std::uint64_t unknownTags = 0;
  std::uint64_t malformed = 0;
  std::uint64_t failed = 0;
};

struct ConvertField {
  const char* name;  // as a JSON field
  const char* text;
  std::uint64_t ConvertTally::*count;
};
extern const std::array<ConvertField, 11> kConvertFields;

struct ConvertResult {
  Secret out;
  ConvertTally tally;
  std::vector<Finding> findings;
};

ConvertResult convertBatch(const Batch& batch, const AttributeSet& attributes, const ConvertOptions& options);

}  // namespace tool

#endif
