// SPDX-License-Identifier: Apache-2.0
#include "audit/lines.h"

#include "base/results.h"
#include "base/text.h"

namespace tool {
namespace {

void appendText(const std::string& dn, const StoredLine& line, const Verdict& verdict, Secret& out) {
  out.append("line " + std::to_string(line.number) + ": " + printable(shownDn(dn)) + ": " + verdict.kind);
  if (verdict.condition != Condition::kFine) out.append(std::string(": ") + textOf(verdict.condition).text);
  if (*verdict.detail != '\0') out.append(std::string(" (") + verdict.detail + ")");
}

void appendJson(const std::string& dn, const StoredLine& line, const Verdict& verdict, Secret& out) {
  Json json;
  json.number("line", line.number)
      .text("dn", shownDn(dn))
      .text("attribute", line.description)
      .text("kind", verdict.kind);
  if (verdict.condition != Condition::kFine) json.text("finding", textOf(verdict.condition).name);
  if (*verdict.detail != '\0') json.text("detail", verdict.detail);
  out.append(json.end());
}

}  // namespace

void appendLine(Lines lines, const std::string& dn, const StoredLine& line, const Verdict& verdict, Secret& out) {
  if (lines == Lines::kNone) return;
  (lines == Lines::kText ? appendText : appendJson)(dn, line, verdict, out);
  out.append('\n');
}

}  // namespace tool
