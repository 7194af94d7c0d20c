// SPDX-License-Identifier: Apache-2.0
#include "audit/pass.h"

#include <utility>

namespace tool {

ExitCode auditExport(const ExportOptions& source, const AuditRules& rules, Facts& facts, Reuse& reuse,
                     Results& results) {
  ExportOptions audited = source;
  audited.others = auditedNames();
  Input input = openExport(audited);
  const auto work = [&](RecordWalker& walker, Part& part) {
    Collector collector(rules, part.out);
    part.gathered = collector.collect(walker);
    if (rules.valuesAreProblems) keepFirst(part.exitCode, collector.firstProblem());
  };
  const auto deliver = [&](const Part& part) {
    auto& batch = static_cast<Facts&>(*part.gathered);
    results.write(part.out.view());
    reuse.add(batch);
    facts.add(std::move(batch), rules.listed);
  };
  return runExport(input, audited, work, deliver).exitCode;
}

}  // namespace tool
