// SPDX-License-Identifier: Apache-2.0
#include "audit/pass.h"

#include <utility>

namespace tool {
namespace {

struct AuditPart : ExportPart {
  Facts facts;
};

}  // namespace

ExitCode auditExport(const ExportOptions& source, const AuditRules& rules, Facts& facts, Reuse& reuse,
                     Results& results) {
  ExportOptions audited = source;
  audited.others = auditedNames();
  audited.write = [&](std::string_view lines) { results.write(lines); };
  Input input = openExport(audited);
  const auto work = [&](RecordWalker& walker, AuditPart& part) {
    Collector collector(rules, part);
    part.facts = collector.collect(walker);
    if (rules.valuesAreProblems) keepFirst(part.exitCode, collector.firstProblem());
  };
  const auto deliver = [&](AuditPart& part) {
    reuse.add(part.facts);
    facts.add(std::move(part.facts), rules.listed);
  };
  return runExport<AuditPart>(input, audited, work, deliver).exitCode;
}

}  // namespace tool
