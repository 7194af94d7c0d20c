// SPDX-License-Identifier: Apache-2.0
// The audit of an export.
#include "ldif_audit.h"

namespace tool {
namespace {

std::size_t indexOf(const Scheme& scheme) noexcept {
  return static_cast<std::size_t>(&scheme - kSchemes);
}

// Tries the keys on a reversible value. Without keys only what needs none is tried.
Look openedLook(const Scheme& scheme, std::string_view value, const AuditOptions& options, SchemeTally& tally) {
  if (!scheme.reversible || (scheme.needsKey() && !options.keys)) return Look::kFine;
  Secret clear;
  if (!revealValue(value, options.keys, clear).ok()) {
    ++tally.unopened;
    return Look::kUnopened;
  }
  const bool text = looksLikeText(clear.view());
  ++(text ? tally.opened : tally.notText);
  return text || options.allowBinary ? Look::kFine : Look::kNotText;
}

// What is told of one line: a scheme or where the value is, and the finding.
struct Verdict {
  const char* kind;
  Look look;
  const char* detail;
};

Verdict auditValue(std::string_view value, const AuditOptions& options, AuditTally& tally) {
  Look look = lookOf(value);
  if (look == Look::kUnknownTag) return {"unknown", look, ""};
  const Scheme& scheme = schemeOf(value);
  SchemeTally& counts = tally.schemes[indexOf(scheme)];
  ++counts.values;
  const char* problem = payloadProblem(value);
  if (problem == nullptr) {
    const Look opened = openedLook(scheme, value, options, counts);
    if (look == Look::kFine) look = opened;
  }
  return {scheme.name, look, look == Look::kMalformed && problem != nullptr ? problem : ""};
}

Verdict auditLine(const PasswordLine& password, const AuditOptions& options, AuditTally& tally) {
  ++tally.values;
  switch (password.form) {
    case ValueForm::kUrl:
      ++tally.urls;
      return {"url", Look::kFine, ""};
    case ValueForm::kDeleted:
      ++tally.deleted;
      return {"deleted", Look::kFine, ""};
    case ValueForm::kBroken:
      return {"unknown", Look::kBroken, password.problem};
    case ValueForm::kBytes:
      break;
  }
  return auditValue(password.value.view(), options, tally);
}

void appendText(const RecordWalker& walker, const Verdict& verdict, Secret& out) {
  out.append("line " + std::to_string(walker.lineNumber()) + ": " + printable(walker.dn()) + ": " + verdict.kind);
  if (verdict.look != Look::kFine) {
    out.append(": ");
    out.append(kLooks[static_cast<std::size_t>(verdict.look)].text);
  }
  if (*verdict.detail != '\0') out.append(std::string(" (") + verdict.detail + ")");
  out.append('\n');
}

void appendJson(const RecordWalker& walker, const Verdict& verdict, Secret& out) {
  out.append("{\"line\":" + std::to_string(walker.lineNumber()) + ",\"dn\":");
  appendJsonString(out, wellFormedUtf8(walker.dn()) ? walker.dn() : printable(walker.dn()));
  out.append(",\"attribute\":");
  appendJsonString(out, printable(walker.password().description));
  out.append(std::string(",\"kind\":\"") + verdict.kind + "\"");
  if (verdict.look != Look::kFine) {
    out.append(std::string(",\"finding\":\"") + kLooks[static_cast<std::size_t>(verdict.look)].name + "\"");
  }
  if (*verdict.detail != '\0') {
    out.append(",\"detail\":");
    appendJsonString(out, verdict.detail);
  }
  out.append("}\n");
}

void writeTable(const AuditTally& tally, Results& results) {
  results.line(leftCell("scheme", 10) + cell("values", 12) + cell("opened", 12) + cell("not text", 12) +
               cell("unopened", 12));
  for (std::size_t i = 0; kSchemes[i].name != nullptr; ++i) {
    const SchemeTally& counts = tally.schemes[i];
    if (counts.values == 0) continue;
    results.line(leftCell(kSchemes[i].name, 10) + cell(counts.values, 12) + cell(counts.opened, 12) +
                 cell(counts.notText, 12) + cell(counts.unopened, 12));
  }
  results.line("entries: " + std::to_string(tally.entries));
  results.line("values: " + std::to_string(tally.values));
  if (tally.urls > 0) results.line("behind a URL: " + std::to_string(tally.urls));
  if (tally.deleted > 0) results.line("to be deleted: " + std::to_string(tally.deleted));
  for (std::size_t i = 1; i < tally.looks.size(); ++i) {
    if (tally.looks[i] > 0)
      results.line("finding: " + std::string(kLooks[i].text) + ": " + std::to_string(tally.looks[i]));
  }
}

std::string field(const char* name, std::uint64_t count) {
  return '"' + std::string(name) + "\":" + std::to_string(count);
}

void writeObject(const AuditTally& tally, Results& results) {
  std::string text = "{" + field("entries", tally.entries) + "," + field("values", tally.values) + "," +
                     field("urls", tally.urls) + "," + field("deleted", tally.deleted) + ",\"schemes\":{";
  for (std::size_t i = 0; kSchemes[i].name != nullptr; ++i) {
    const SchemeTally& counts = tally.schemes[i];
    text += (i == 0 ? "\"" : ",\"") + std::string(kSchemes[i].name) + "\":{" + field("values", counts.values);
    if (kSchemes[i].reversible) {
      text += "," + field("opened", counts.opened) + "," + field("notText", counts.notText) + "," +
              field("unopened", counts.unopened);
    }
    text += "}";
  }
  text += "},\"findings\":{";
  for (std::size_t i = 1; i < tally.looks.size(); ++i)
    text += (i == 1 ? "" : ",") + field(kLooks[i].name, tally.looks[i]);
  results.line(text + "}}");
}

}  // namespace

void AuditTally::add(const AuditTally& part) noexcept {
  entries += part.entries;
  values += part.values;
  urls += part.urls;
  deleted += part.deleted;
  for (std::size_t i = 0; i < schemes.size(); ++i) {
    schemes[i].values += part.schemes[i].values;
    schemes[i].opened += part.schemes[i].opened;
    schemes[i].notText += part.schemes[i].notText;
    schemes[i].unopened += part.schemes[i].unopened;
  }
  for (std::size_t i = 0; i < looks.size(); ++i) looks[i] += part.looks[i];
  if (firstProblem == kSuccess) firstProblem = part.firstProblem;
}

AuditResult auditBatch(const Batch& batch, const AttributeSet& attributes, const AuditOptions& options) {
  AuditResult result;
  RecordWalker walker(batch, attributes);
  while (walker.next()) {
    if (!walker.atPassword()) continue;
    const Verdict verdict = auditLine(walker.password(), options, result.tally);
    const std::size_t look = static_cast<std::size_t>(verdict.look);
    ++result.tally.looks[look];
    if (result.tally.firstProblem == kSuccess) result.tally.firstProblem = kLooks[look].code;
    if (options.verbose) (options.json ? appendJson : appendText)(walker, verdict, result.out);
  }
  result.tally.entries = walker.entries();
  return result;
}

void writeAudit(const AuditTally& tally, bool json, Results& results) {
  json ? writeObject(tally, results) : writeTable(tally, results);
}

}  // namespace tool
