// SPDX-License-Identifier: Apache-2.0
// Telling which schemes the password values of an export use, and what is wrong with them.
#ifndef LDAPPW_TOOLS_LDIF_AUDIT_H
#define LDAPPW_TOOLS_LDIF_AUDIT_H

#include <array>
#include <cstdint>

#include "common.h"
#include "ldif_record.h"
#include "ldif_report.h"

namespace tool {

struct AuditOptions {
  KeyRecord keys;
  bool verbose = false;      // a line for each value
  bool allowBinary = false;  // what opens into bytes that are not text is no finding
  bool json = false;
};

constexpr std::size_t kMaxSchemes = 16;

struct SchemeTally {
  std::uint64_t values = 0;
  std::uint64_t opened = 0;
  std::uint64_t notText = 0;
  std::uint64_t unopened = 0;
};

struct AuditTally {
  std::uint64_t entries = 0;
  std::uint64_t values = 0;
  std::uint64_t urls = 0;
  std::uint64_t deleted = 0;
  std::array<SchemeTally, kMaxSchemes> schemes;  // in the order of kSchemes
  std::array<std::uint64_t, static_cast<std::size_t>(Look::kCount)> looks{};
  ExitCode firstProblem = kSuccess;

  void add(const AuditTally& part) noexcept;
};

struct AuditResult {
  Secret out;  // the lines of a verbose audit
  AuditTally tally;
};

AuditResult auditBatch(const Batch& batch, const AttributeSet& attributes, const AuditOptions& options);

// Writes the counts, as a table or as one JSON object.
void writeAudit(const AuditTally& tally, bool json, Results& results);

}  // namespace tool

#endif
