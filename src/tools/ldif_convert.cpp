// SPDX-License-Identifier: Apache-2.0
// The conversion. A value that cannot be carried over unharmed stays what it was and is reported: the export is often
// the only copy of the passwords in it.
#include "ldif_passes.h"

#include <sys/stat.h>
#include <unistd.h>

#include <optional>

#include "condition.h"
#include "messages.h"
#include "output_file.h"
#include "password_schemes.h"
#include "text.h"
#include "values.h"

namespace tool {
namespace {

// Totals. What becomes of a value is one of those from kMade on.
enum Total : std::size_t {
  kValues,
  kMade,
  kCut,
  kAsTheyAre,
  kOneWay,
  kUrls,
  kDeleted,
  kUnknownTags,
  kMalformed,
  kFailed
};

constexpr CountName kNames[] = {
    {"values", "password values"},         {"made", "converted"},
    {"cut", "of these cut by the scheme"}, {"asTheyAre", "clear already, kept"},
    {"oneWay", "one-way, kept"},           {"urls", "behind a URL, kept"},
    {"deleted", "to be deleted, kept"},    {"unknownTags", "with an unknown tag, kept"},
    {"malformed", "malformed, kept"},      {"failed", "failed, kept"},
};

struct Conversion {
  const Scheme& target;
  KeyRecord oldKeys;
  KeyRecord newKeys;
  bool allowBinary;
};

// What became of one value, and the problem if there is one.
struct Outcome {
  Total total;
  Status status;
};

Status openSource(const StoredValue& value, const Conversion& conversion, Secret& clear) {
  const Status status = openValue(value, conversion.oldKeys, clear);
  if (!status.ok() || value.scheme().isClear() || conversion.allowBinary || looksLikeText(clear.view())) return status;
  return {kBadKey, "opens into bytes that are not text: a wrong key, or a binary password (--allow-binary)"};
}

// The new value takes the place of the only copy, so the server's own check has to accept it first, where it knows the
// scheme.
Status makeTarget(const Secret& clear, const Conversion& conversion, Secret& made) {
  const Scheme& target = conversion.target;
  if (target.reversible() && target.cuts(clear.size())) {
    return {kBadValue, "the password has more bytes than the scheme holds"};
  }
  const Status status = makeValue(target, conversion.newKeys, clear, made);
  if (!status.ok() || target.code == FORMAT_NONE || serverAccepts(made, conversion.newKeys, clear)) return status;
  return {kBadValue, "the new value does not verify"};
}

Outcome convertValue(const Secret& whole, const Conversion& conversion, Secret& made) {
  const StoredValue value(whole);
  const Scheme& source = value.scheme();
  if (source.kind == Kind::kUnknown) return {kUnknownTags, {kBadValue, "unknown tag; the value is kept"}};
  if (source.kind == Kind::kOneWay) {
    const ConditionText& condition = textOf(conditionOf(value, value.problem()));
    return {condition.code == kSuccess ? kOneWay : kMalformed, {condition.code, condition.text}};
  }
  if (source.isClear() && conversion.target.isClear()) return {kAsTheyAre, {}};
  Secret clear;
  Status status = openSource(value, conversion, clear);
  if (status.ok()) status = makeTarget(clear, conversion, made);
  if (!status.ok()) return {kFailed, status};
  return {conversion.target.cuts(clear.size()) ? kCut : kMade, {}};
}

Outcome outcomeOf(const PasswordLine& password, const Conversion& conversion, Secret& made) {
  if (password.form == ValueForm::kBytes) return convertValue(password.value, conversion, made);
  if (password.form == ValueForm::kBroken) return {kFailed, {kBadValue, password.problem}};
  return {password.form == ValueForm::kUrl ? kUrls : kDeleted, {}};
}

void convertLine(const RecordWalker& walker, const Conversion& conversion, Part& part) {
  Secret made;
  const Outcome outcome = outcomeOf(walker.password(), conversion, made);
  ++part.tally.totals[kValues];
  ++part.tally.totals[outcome.total];
  if (outcome.total == kCut) ++part.tally.totals[kMade];
  if (!outcome.status.ok()) part.report(walker.lineNumber(), walker.dn(), outcome.status.code, outcome.status.text);
  if (outcome.total == kMade || outcome.total == kCut) {
    writeChanged(walker.line(), walker.password().description, made, part.out);
  } else {
    part.out.append(walker.line().raw);
  }
}

void convertBatch(RecordWalker& walker, const Conversion& conversion, Part& part) {
  while (walker.next()) {
    walker.atPassword() ? convertLine(walker, conversion, part) : part.out.append(walker.line().raw);
  }
}

const Scheme& targetOf(const LdifOptions& options) {
  const Scheme* scheme = findScheme(options.to);
  if (scheme == nullptr || scheme->make == nullptr) {
    throw Failure(kUsage, options.to + " is not a scheme that values can be made under");
  }
  if (scheme->isClear() && !options.allowClear) {
    throw Failure(kUsage, "passwords are written in the clear only with --allow-clear");
  }
  if (scheme->needsKey() && options.newKeys.empty()) throw Failure(kUsage, options.to + " needs --new-keys");
  return *scheme;
}

// A file that is replaced keeps its mode; a new one is closed to others.
mode_t modeFor(const std::string& path) {
  struct stat old {};
  return stat(path.c_str(), &old) == 0 ? old.st_mode & 07777 : 0600;
}

void showSummary(const Tally& tally, const Scheme& target, bool json) {
  if (tally.totals[kCut] > 0) {
    warning(std::to_string(tally.totals[kCut]) + " passwords are longer than the " + std::to_string(target.cutBytes) +
            " bytes that " + target.name + " uses: only their beginnings will be checked");
  }
  if (json) {
    Results results;
    Json object;
    object.number("entries", tally.entries);
    addCounts(object, kNames, tally.totals.data());
    results.line(object.end());
    return results.flush();
  }
  message("entries: " + std::to_string(tally.entries));
  for (std::size_t total = kValues; total <= kFailed; ++total) {
    const std::uint64_t count = tally.totals[total];
    if (total <= kMade || count > 0) message(std::string(kNames[total].text) + ": " + std::to_string(count));
  }
}

}  // namespace

ExitCode convertExport(const LdifOptions& options) {
  const Scheme& target = targetOf(options);
  requireProvider();
  const Conversion conversion{target, KeyRecord::load(options.keys), KeyRecord::load(options.newKeys),
                              options.allowBinary};
  Input input = openExport(options.source);
  std::optional<OutputFile> file;
  if (options.out != "-") file.emplace(options.out, modeFor(options.out), options.force);
  const auto deliver = [&](const Part& part) {
    file ? file->write(part.out.view()) : writeAll(STDOUT_FILENO, part.out.view(), "standard output");
  };
  ExportOptions source = options.source;
  source.resultsOnStdout = !file;
  const Part sum = runExport(
      input, source, [&](RecordWalker& walker, Part& part) { convertBatch(walker, conversion, part); }, deliver);
  if (file) file->commit();
  showSummary(sum.tally, target, options.json);
  return sum.exitCode;
}

}  // namespace tool
