// SPDX-License-Identifier: Apache-2.0
// A line for each password value of an export, for an administrator who looks for the values behind a finding.
#pragma once

#include <cstdint>
#include <string>

#include "ldif/record.h"
#include "schemes/examine.h"

namespace tool {

enum class Lines { kNone, kText, kJson };

// A password line of an entry, kept until the whole entry is known.
struct StoredLine {
  std::uint64_t number = 0;
  std::string description;  // of the attribute
  ValueForm form = ValueForm::kBytes;
  const char* problem = "";
  Secret value;         // of kBytes
  bool current = true;  // a value to log in with, not an earlier one
};

// What an audit says of it.
struct Verdict {
  const char* kind = "unknown";  // the scheme, or where the value is
  Condition condition = Condition::kBroken;
  const char* detail = "";  // what is wrong with the payload or the line
};

void appendLine(Lines lines, const std::string& dn, const StoredLine& line, const Verdict& verdict, Secret& out);

}  // namespace tool
