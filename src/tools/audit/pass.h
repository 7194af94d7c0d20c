// SPDX-License-Identifier: Apache-2.0
// The pass over an export that both audits make: "ldappw audit" shows the whole report of it, "ldappw ldif --audit" the
// short one.
#pragma once

#include "audit/collector.h"
#include "audit/report.h"
#include "base/results.h"
#include "ldif/export_run.h"

namespace tool {

// Adds an export to the facts and its sightings to reuse; the lines that the rules ask for are written to results.
// Returns the code of the first problem.
ExitCode auditExport(const ExportOptions& source, const AuditRules& rules, Facts& facts, Reuse& reuse,
                     Results& results);

}  // namespace tool
