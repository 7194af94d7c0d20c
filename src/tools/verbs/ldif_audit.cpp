// SPDX-License-Identifier: Apache-2.0
// The audit of an export.
#include "ldif/passes.h"

#include "base/text.h"
#include "ldif/key_ring.h"
#include "schemes/schemes.h"
#include "schemes/values.h"

namespace tool {
namespace {

// Totals; the conditions follow the last one. Columns by scheme.
enum Total : size_t { kValues, kUrls, kDeleted, kAuthPasswords, kFirstCondition };
enum Column : size_t { kAll, kOpened, kNotText, kUnopened };
static_assert(kFirstCondition + kConditionCount <= Tally::kTotals);

constexpr CountName kTotalNames[] = {
    {"values", "values"}, {"urls", "behind a URL"}, {"deleted", "to be deleted"}, {"authPasswords", "of authPassword"}};
constexpr CountName kColumnNames[] = {
    {"values", "values"}, {"opened", "opened"}, {"notText", "not text"}, {"unopened", "unopened"}};

// What is said of one line: a scheme, or where the value is; the condition; what is wrong with the payload or the line.
struct Verdict {
  const char* kind;
  Condition condition;
  const char* detail;
};

// Tries the keys on a reversible value. Without keys only what needs none is tried.
Condition tryToOpen(const Examined& value, const KeyRing& keys, bool allowBinary, Tally::Row& counts) {
  if (!value.scheme().reversible() || (value.scheme().needsKey() && keys.empty())) return Condition::kFine;
  if (value.scheme().open == nullptr) return Condition::kFine;  // of another server, which alone has the key
  Secret clear;
  size_t used = 0;
  const Status status = keys.open(value, 0, true, clear, used);
  if (!status.ok() && clear.empty()) {
    ++counts[kUnopened];
    return Condition::kUnopened;
  }
  const bool text = looksLikeText(clear.view());
  ++counts[text ? kOpened : kNotText];
  return text || (allowBinary && status.ok()) ? Condition::kFine : Condition::kNotText;
}

Verdict auditValue(const Examined& value, const KeyRing& keys, bool allowBinary, Tally& tally) {
  const char* problem = value.problem;
  Condition condition = value.condition;
  const Scheme& scheme = value.scheme();
  if (condition == Condition::kUnknownTag) return {scheme.name, condition, ""};
  Tally::Row& counts = tally.of(scheme);
  ++counts[kAll];
  if (problem == nullptr) {
    const Condition opened = tryToOpen(value, keys, allowBinary, counts);
    if (condition == Condition::kFine) condition = opened;
  }
  return {scheme.name, condition, condition == Condition::kMalformed && problem != nullptr ? problem : ""};
}

Verdict auditLine(const PasswordLine& password, const KeyRing& keys, bool allowBinary, Tally& tally) {
  ++tally.totals[kValues];
  if (password.form == ValueForm::kBytes) return auditValue(examine(password.value), keys, allowBinary, tally);
  if (password.form == ValueForm::kBroken) return {"unknown", Condition::kBroken, password.problem};
  constexpr Total kKept[] = {kValues, kUrls, kDeleted, kAuthPasswords};
  constexpr const char* kKinds[] = {"", "url", "deleted", "authPassword"};
  const auto form = static_cast<size_t>(password.form);
  ++tally.totals[kKept[form]];
  return {kKinds[form], Condition::kFine, ""};
}

void appendText(const RecordWalker& walker, const Verdict& verdict, Secret& out) {
  out.append("line " + std::to_string(walker.lineNumber()) + ": " + printable(walker.dn()) + ": " + verdict.kind);
  if (verdict.condition != Condition::kFine) out.append(std::string(": ") + textOf(verdict.condition).text);
  if (*verdict.detail != '\0') out.append(std::string(" (") + verdict.detail + ")");
  out.append('\n');
}

void appendJson(const RecordWalker& walker, const Verdict& verdict, Secret& out) {
  Json json;
  json.number("line", walker.lineNumber()).text("dn", walker.dn()).text("attribute", walker.password().description);
  json.text("kind", verdict.kind);
  if (verdict.condition != Condition::kFine) json.text("finding", textOf(verdict.condition).name);
  if (*verdict.detail != '\0') json.text("detail", verdict.detail);
  out.append(json.end());
  out.append('\n');
}

void auditBatch(RecordWalker& walker, const LdifOptions& options, const KeyRing& keys, Part& part) {
  while (walker.next()) {
    if (!walker.atPassword()) continue;
    const Verdict verdict = auditLine(walker.password(), keys, options.allowBinary, part.tally);
    ++part.tally.totals[kFirstCondition + static_cast<size_t>(verdict.condition)];
    keepFirst(part.exitCode, textOf(verdict.condition).code);
    if (options.verbose) (options.json ? appendJson : appendText)(walker, verdict, part.out);
  }
}

// Every scheme of the library, whether it occurs or not, and of the others those that do.
template <typename Work>
void forEachScheme(const Tally& tally, const Work& work) {
  for (const Scheme& scheme : kSchemes) {
    if (scheme.own() || tally.of(scheme)[kAll] > 0) work(scheme, tally.of(scheme));
  }
}

void writeTable(const Tally& tally, Results& results) {
  const auto write = [&](const CountName& name, std::uint64_t count, const char* prefix) {
    results.line(prefix + std::string(name.text) + ": " + std::to_string(count));
  };
  std::string row = leftCell("scheme", 10);
  for (const CountName& column : kColumnNames) row += cell(column.text, 12);
  results.line(row);
  forEachScheme(tally, [&](const Scheme& scheme, const Tally::Row& counts) {
    if (counts[kAll] == 0) return;
    row = leftCell(scheme.name, 10);
    for (size_t column = kAll; column <= kUnopened; ++column) row += cell(counts[column], 12);
    results.line(row);
  });
  write({"entries", "entries"}, tally.entries, "");
  for (size_t total = kValues; total < kFirstCondition; ++total) {
    if (total == kValues || tally.totals[total] > 0) write(kTotalNames[total], tally.totals[total], "");
  }
  for (size_t i = 1; i < kConditionCount; ++i) {
    const std::uint64_t count = tally.totals[kFirstCondition + i];
    if (count > 0) write({kConditions[i].name, kConditions[i].text}, count, "finding: ");
  }
  if (tally.outside > 0) write({"outside", kOutsideText}, tally.outside, "finding: ");
}

void writeObject(const Tally& tally, Results& results) {
  Json json;
  json.number("entries", tally.entries);
  addCounts(json, kTotalNames, tally.totals.data());
  json.open("schemes");
  forEachScheme(tally, [&](const Scheme& scheme, const Tally::Row& counts) {
    json.open(scheme.name);
    scheme.reversible() ? addCounts(json, kColumnNames, counts.data()) : (void)json.number("values", counts[kAll]);
    json.close();
  });
  json.close().open("findings");
  for (size_t i = 1; i < kConditionCount; ++i) {
    json.number(kConditions[i].name, tally.totals[kFirstCondition + i]);
  }
  results.line(json.number("outside", tally.outside).close().end());
}

}  // namespace

ExitCode auditExport(const LdifOptions& options) {
  requireProvider();
  const KeyRing keys(options.keys);
  Input input = openExport(options.source);
  ExportOptions source = options.source;
  source.resultsOnStdout = options.verbose;
  Results results;
  const Part sum = runExport(
      input, source, [&](RecordWalker& walker, Part& part) { auditBatch(walker, options, keys, part); },
      [&](const Part& part) { results.write(part.out.view()); });
  (options.json ? writeObject : writeTable)(sum.tally, results);
  results.flush();
  return sum.exitCode;
}

}  // namespace tool
