// SPDX-License-Identifier: Apache-2.0
// The result of an audit, and writing it: as text, as a JSON object and as a page.
#pragma once

#include <bitset>
#include <string>
#include <utility>
#include <vector>

#include "audit/facts.h"
#include "audit/marks.h"
#include "base/results.h"

namespace tool {

struct AuditReport {
  Facts facts;
  std::vector<ReuseGroup> reused;  // the largest groups
  std::uint64_t reuseGroups = 0;
  std::vector<std::string> exports;
  std::string time;  // UTC
  bool policy = false;
  bool brief = false;                    // counts alone: no subtrees, no DNs
  std::bitset<kFindingCount> forbidden;  // by the policy

  // The name, strength and number of the values of a scheme.
  struct SchemeRow {
    const char* name;
    Strength strength;
    std::uint64_t values;
  };
  std::vector<SchemeRow> schemes() const;  // those that occur, the weakest first
  // The largest 50, and one row for all others.
  std::vector<std::pair<std::string, Subtree>> subtrees() const;
  bool fails(size_t finding) const { return forbidden.test(finding) && facts.findings[finding].count > 0; }
  bool met() const;
};

void writeText(const AuditReport& report, Results& results);
void writeObject(const AuditReport& report, Results& results);
// A page of HTML that needs nothing besides itself.
std::string pageOf(const AuditReport& report);

}  // namespace tool
