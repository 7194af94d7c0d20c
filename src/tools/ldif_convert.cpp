// SPDX-License-Identifier: Apache-2.0
// The conversion. A value that cannot be carried over unharmed stays what it was and is reported: the export is often
// the only copy of the passwords in it.
#include "ldif_passes.h"

#include <unistd.h>

#include <algorithm>
#include <functional>
#include <optional>
#include <unordered_map>
#include <utility>

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
  kAuthPasswords,
  kFixed,
  kDropped,
  kLocked,
  kWrapped,
  kUnknownTags,
  kMalformed,
  kFailed
};

constexpr CountName kNames[] = {
    {"values", "password values"},
    {"made", "converted"},
    {"cut", "of these cut by the scheme"},
    {"asTheyAre", "clear already, kept"},
    {"oneWay", "one-way, kept"},
    {"urls", "behind a URL, kept"},
    {"deleted", "to be deleted, kept"},
    {"authPasswords", "of authPassword, kept"},
    {"fixed", "unwrapped and one-way"},
    {"dropped", "equal to another value of the entry, dropped"},
    {"locked", "locked, kept"},
    {"wrapped", "padded or encoded, kept"},
    {"unknownTags", "with an unknown tag, kept"},
    {"malformed", "malformed, kept"},
    {"failed", "failed, kept"},
};

constexpr mode_t kNewFileMode = 0600;

struct Conversion {
  const Scheme& target;
  KeyRecord oldKeys;
  KeyRecord newKeys;
  bool allowBinary;
  bool fix;
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
  const ConditionText& condition = textOf(conditionOf(value, value.problem()));
  const Wrapping wrapping = wrappingOf(value);
  if (source.kind == Kind::kUnknown) return {kUnknownTags, {kBadValue, "unknown tag; the value is kept"}};
  if (wrapping != Wrapping::kNone) {
    return {wrapping == Wrapping::kLocked ? kLocked : kWrapped, {condition.code, condition.text}};
  }
  if (source.kind == Kind::kOneWay) {
    return {condition.code == kSuccess ? kOneWay : kMalformed, {condition.code, condition.text}};
  }
  if (source.isClear() && conversion.target.isClear()) return {kAsTheyAre, {}};
  Secret clear;
  Status status = openSource(value, conversion, clear);
  if (status.ok()) status = makeTarget(clear, conversion, made);
  if (!status.ok()) return {kFailed, status};
  return {conversion.target.cuts(clear.size()) ? kCut : kMade, {}};
}

// What is within a padded or encoded value takes its place, converted where it can be.
Outcome fixValue(const Secret& whole, const Conversion& conversion, Secret& made) {
  const Wrapping wrapping = wrappingOf(StoredValue(whole));
  if (!conversion.fix || wrapping == Wrapping::kNone || wrapping == Wrapping::kLocked) {
    return convertValue(whole, conversion, made);
  }
  Secret inner = unwrapped(whole, wrapping);
  const Outcome outcome = convertValue(inner, conversion, made);
  if (outcome.total != kOneWay && outcome.total != kAsTheyAre) return outcome;
  made = std::move(inner);
  return {kFixed, {}};
}

Outcome outcomeOf(const PasswordLine& password, const Conversion& conversion, Secret& made) {
  constexpr Total kKept[] = {kMade, kUrls, kDeleted, kAuthPasswords};
  if (password.form == ValueForm::kBytes) return fixValue(password.value, conversion, made);
  if (password.form == ValueForm::kBroken) return {kFailed, {kBadValue, password.problem}};
  return {kKept[static_cast<std::size_t>(password.form)], {}};
}

// The values that the lines of one entry have come to. Servers refuse an entry with two equal ones.
class EntryValues {
 public:
  // True when an equal value stands in the entry already and one of the two is new.
  bool repeats(const RecordWalker& walker, const Secret& value, bool changed) {
    if (group_ != walker.group()) values_.clear();
    group_ = walker.group();
    const std::string& name = walker.password().description;
    const std::size_t hash = std::hash<std::string_view>()(value.view());
    const auto equal = values_.equal_range(hash);
    const bool found = std::any_of(equal.first, equal.second, [&](const auto& row) {
      const Value& other = row.second;
      return (changed || other.changed) && sameName(other.name, name) && other.value.view() == value.view();
    });
    if (!found) values_.emplace(hash, Value{name, Secret(value.view()), changed});
    return found;
  }

 private:
  struct Value {
    std::string name;
    Secret value;
    bool changed;
  };
  std::unordered_multimap<std::size_t, Value> values_;
  std::uint64_t group_ = 0;
};

void convertLine(const RecordWalker& walker, const Conversion& conversion, EntryValues& values, Part& part) {
  Secret made;
  const PasswordLine& password = walker.password();
  const Outcome outcome = outcomeOf(password, conversion, made);
  const bool changed = outcome.total == kMade || outcome.total == kCut || outcome.total == kFixed;
  ++part.tally.totals[kValues];
  if (!outcome.status.ok()) part.report(walker.lineNumber(), walker.dn(), outcome.status.code, outcome.status.text);
  const Secret whole = password.whole(changed ? made : password.value);
  if (password.form == ValueForm::kBytes && values.repeats(walker, whole, changed)) {
    ++part.tally.totals[kDropped];
    return;
  }
  ++part.tally.totals[outcome.total];
  if (outcome.total == kCut) ++part.tally.totals[kMade];
  changed ? writeChanged(walker.line(), password.description, whole, part.out) : part.out.append(walker.line().raw);
}

void convertBatch(RecordWalker& walker, const Conversion& conversion, Part& part) {
  EntryValues values;
  while (walker.next()) {
    walker.atPassword() ? convertLine(walker, conversion, values, part) : part.out.append(walker.line().raw);
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
                              options.allowBinary, options.fix};
  if (conversion.oldKeys && conversion.newKeys && sameRecord(conversion.oldKeys, conversion.newKeys)) {
    throw Failure(kUsage, "--keys and --new-keys hold the same keys");
  }
  Input input = openExport(options.source);
  std::optional<OutputFile> file;
  if (options.out != "-") {
    file.emplace(options.out, kNewFileMode, options.force);
    file->keepAccess();
  }
  const auto deliver = [&](const Part& part) {
    file ? file->write(part.out.view()) : writeAll(STDOUT_FILENO, part.out.view(), "standard output");
  };
  ExportOptions source = options.source;
  source.resultsOnStdout = !file;
  const Part sum = runExport(
      input, source, [&](RecordWalker& walker, Part& part) { convertBatch(walker, conversion, part); }, deliver);
  if (file) file->commit();
  if (!options.quiet) showSummary(sum.tally, target, options.json);
  return sum.exitCode;
}

}  // namespace tool
