// SPDX-License-Identifier: Apache-2.0
// The conversion. A value that cannot be carried over unharmed stays what it was and is reported: the export is often
// the only copy of the passwords in it.
#include "ldif/passes.h"

#include <unistd.h>

#include <algorithm>
#include <map>
#include <optional>
#include <utility>

#include "base/messages.h"
#include "base/output_file.h"
#include "base/random.h"
#include "base/signals.h"
#include "base/text.h"
#include "ldif/change_records.h"
#include "ldif/counts.h"
#include "ldif/key_ring.h"
#include "password_schemes.h"
#include "schemes/schemes.h"
#include "schemes/values.h"

namespace tool {
namespace {

struct Counts {
  std::uint64_t values = 0;
  std::uint64_t made = 0;
  std::uint64_t cut = 0;
  std::uint64_t resumed = 0;
  std::uint64_t done = 0;
  std::uint64_t asTheyAre = 0;
  std::uint64_t oneWay = 0;
  std::uint64_t urls = 0;
  std::uint64_t deleted = 0;
  std::uint64_t authPasswords = 0;
  std::uint64_t fixed = 0;
  std::uint64_t dropped = 0;
  std::uint64_t locked = 0;
  std::uint64_t wrapped = 0;
  std::uint64_t unknownTags = 0;
  std::uint64_t malformed = 0;
  std::uint64_t failed = 0;
};
constexpr CountName<Counts> kNames[] = {
    {&Counts::values, "values", "password values"},
    {&Counts::made, "made", "converted"},
    {&Counts::cut, "cut", "of these cut by the scheme"},
    {&Counts::resumed, "resumed", "of these taken from the earlier run"},
    {&Counts::done, "done", "done already, kept"},
    {&Counts::asTheyAre, "asTheyAre", "clear already, kept"},
    {&Counts::oneWay, "oneWay", "one-way, kept"},
    {&Counts::urls, "urls", "behind a URL, kept"},
    {&Counts::deleted, "deleted", "to be deleted, kept"},
    {&Counts::authPasswords, "authPasswords", "of authPassword, kept"},
    {&Counts::fixed, "fixed", "unwrapped and one-way"},
    {&Counts::dropped, "dropped", "equal to another value of the entry, dropped"},
    {&Counts::locked, "locked", "locked, kept"},
    {&Counts::wrapped, "wrapped", "padded or encoded, kept"},
    {&Counts::unknownTags, "unknownTags", "with an unknown tag, kept"},
    {&Counts::malformed, "malformed", "malformed, kept"},
    {&Counts::failed, "failed", "failed, kept"},
};

// What becomes of a value is one of the counters.
using Counter = std::uint64_t Counts::*;

constexpr mode_t kNewFileMode = 0600;

// What becomes of the values of a scheme.
struct Plan {
  std::uint64_t now = 0;
  std::uint64_t later = 0;  // one-way, and weaker than the target: only their owners can present the passwords
};
constexpr CountName<Plan> kPlanNames[] = {{&Plan::now, "now", "now"},
                                          {&Plan::later, "atNextLogin", "at the next login"}};

struct ConversionPart : ExportPart {
  Counts counts;
  ByScheme<Plan> plan;
};

struct Conversion {
  const Scheme& target;
  const LdifOptions& options;
  Costs costs;
  KeyRecord newKeys;
  KeyRing keys;  // the new ones first
  EarlierChanges earlier;
};

// What became of one value, and the problem if there is one.
struct Outcome {
  Counter counter;
  Status status;
};

// The new value takes the place of the only copy, so the server's own check has to accept it first, where it knows the
// scheme. A dry run spares the work that is long on purpose; such values have a salt, for which some random bytes
// stand.
Status makeTarget(const Secret& clear, const Conversion& conversion, Secret& made) {
  const Scheme& target = conversion.target;
  if (target.reversible() && target.cuts(clear.size())) {
    return {kBadValue, "the password has more bytes than the scheme holds"};
  }
  if (conversion.options.dryRun && isCostly(target)) {
    constexpr size_t kStandInBytes = 16;
    made.resize(kStandInBytes);
    drawRandom(made.data(), made.size());
    return passwordProblem(target, clear.view());
  }
  const Status status = makeValue(target, conversion.newKeys, conversion.costs, clear, made);
  if (!status.ok() || target.code == FORMAT_NONE || serverAccepts(made, conversion.newKeys, clear)) return status;
  return {kBadValue, "the new value does not verify"};
}

// Of a scheme that the server's check does not know one value is checked before all others are made: twice the work for
// each would be too much.
void proveTarget(const Conversion& conversion) {
  const Scheme& target = conversion.target;
  if (target.code != FORMAT_NONE || target.isClear() || conversion.options.dryRun) return;
  const KeyRecord none;
  Secret made;
  const Status status = makeTarget(Secret("probe"), conversion, made);
  if (!status.ok()) throw Failure(status.code, status.text);
  if (!checkValue(examine(made), none, Secret("probe")).ok() ||
      checkValue(examine(made), none, Secret("Probe")).code != kNoMatch) {
    throw Failure(kInternal, std::string("values of ") + target.name + " do not verify");
  }
}

Outcome convertValue(const Examined& value, const Conversion& conversion, Secret& made) {
  const Scheme& source = value.scheme();
  const ConditionText& condition = textOf(value.condition);
  if (source.kind == Kind::kUnknown) return {&Counts::unknownTags, {kBadValue, "unknown tag; the value is kept"}};
  if (value.wrapping != Wrapping::kNone) {
    return {value.wrapping == Wrapping::kLocked ? &Counts::locked : &Counts::wrapped, {condition.code, condition.text}};
  }
  if (source.kind == Kind::kOneWay) {
    if (&source == &conversion.target && condition.code == kSuccess) return {&Counts::done, {}};
    return {condition.code == kSuccess ? &Counts::oneWay : &Counts::malformed, {condition.code, condition.text}};
  }
  if (source.isClear() && conversion.target.isClear()) return {&Counts::asTheyAre, {}};
  Secret clear;
  // The new keys are for values that this run or an earlier one has made: those of another scheme are none of them.
  const size_t first = conversion.newKeys && &source != &conversion.target ? 1 : 0;
  const KeyRing::Opened opened = conversion.keys.open(value, first, clear);
  Status status = opened.status(conversion.options.allowBinary);
  const bool underNew = !source.needsKey() || (conversion.newKeys && opened.key == 0);
  if (status.ok() && &source == &conversion.target && underNew && !value.value.tag().empty())
    return {&Counts::done, {}};
  if (status.ok()) status = makeTarget(clear, conversion, made);
  if (!status.ok()) return {&Counts::failed, status};
  return {conversion.target.cuts(clear.size()) ? &Counts::cut : &Counts::made, {}};
}

// What is within a padded or encoded value takes its place, converted where it can be.
Outcome fixValue(const Examined& value, const Conversion& conversion, Secret& made) {
  const Wrapping wrapping = value.wrapping;
  if (!conversion.options.fix || wrapping == Wrapping::kNone || wrapping == Wrapping::kLocked) {
    return convertValue(value, conversion, made);
  }
  Secret inner = unwrapped(value.value.whole(), wrapping);
  const Outcome outcome = convertValue(examine(inner), conversion, made);
  if (outcome.counter != &Counts::oneWay && outcome.counter != &Counts::asTheyAre && outcome.counter != &Counts::done)
    return outcome;
  made = std::move(inner);
  return {&Counts::fixed, {}};
}

// Of a line that holds no value to convert.
Outcome outcomeWithout(const PasswordLine& password) {
  constexpr Counter kKept[] = {&Counts::made, &Counts::urls, &Counts::deleted, &Counts::authPasswords};
  static_assert(sizeof kKept / sizeof kKept[0] == static_cast<size_t>(ValueForm::kBroken));
  if (password.form == ValueForm::kBroken) return {&Counts::failed, {kBadValue, password.problem}};
  return {kKept[static_cast<size_t>(password.form)], {}};
}

// earlier has the values that an earlier run has made for the entry, or is null.
Outcome outcomeOf(const RecordWalker& walker, const Examined& value, const Conversion& conversion,
                  const EarlierChanges::Values* earlier, Secret& made) {
  const PasswordLine& password = walker.password();
  if (conversion.options.changes && (walker.inChange() || walker.dn().empty() || walker.dn().front() == ':')) {
    return {&Counts::failed, {kBadValue, "no change can be written for a change record, or without a well-formed dn"}};
  }
  EarlierChanges::Values::const_iterator known;
  if (earlier != nullptr) known = earlier->find(keyOf(password.description, password.whole(password.value).view()));
  if (earlier != nullptr && known != earlier->end()) {
    made = Secret(known->second.view().substr(password.history.size()));
    if (!password.history.empty()) made = Secret(made.view().substr(made.view().find('#') + 1));
    const StoredValue taken(made);
    if (&taken.scheme() == &conversion.target && taken.problem() == nullptr) return {&Counts::resumed, {}};
  }
  return fixValue(value, conversion, made);
}

// The values that the lines of one entry have come to. Servers refuse an entry with two equal ones.
class EntryValues {
 public:
  // True when an equal value stands in the entry already and one of the two is new.
  bool repeats(const RecordWalker& walker, const Secret& value, bool changed) {
    if (group_ != walker.group()) changed_.clear();
    group_ = walker.group();
    const auto [found, isFirst] = changed_.emplace(keyOf(walker.password().description, value.view()), changed);
    return !isFirst && (changed || found->second);
  }

 private:
  std::map<Secret, bool, ByBytes> changed_;
  std::uint64_t group_ = 0;
};

constexpr bool isChanged(Counter counter) {
  return counter == &Counts::made || counter == &Counts::cut || counter == &Counts::resumed ||
         counter == &Counts::fixed;
}

void countForPlan(const Scheme& source, Counter counter, const Scheme& target, ByScheme<Plan>& plan) {
  if (source.kind == Kind::kUnknown) return;
  const bool later = counter == &Counts::oneWay && source.strength < target.strength;
  if (isChanged(counter)) ++plan.of(source).now;
  if (later && target.kind == Kind::kOneWay) ++plan.of(source).later;
}

// Converts the lines of a batch, one after the other.
class Converter {
 public:
  Converter(const Conversion& conversion, ConversionPart& part) : conversion_(conversion), part_(part) {}

  void all(RecordWalker& walker) {
    while (walker.next()) {
      if (walker.entries() != entry_) earlier_ = conversion_.earlier.of(walker.dn());
      entry_ = walker.entries();
      walker.atPassword() ? convert(walker) : keep(walker);
      part_.spill();
    }
    changes_.flush(part_);
  }

 private:
  bool writesExport() const noexcept { return !conversion_.options.changes && !conversion_.options.dryRun; }
  void keep(const RecordWalker& walker) {
    if (writesExport()) part_.out.append(walker.line().raw);
  }

  void convert(const RecordWalker& walker) {
    Secret made;
    const PasswordLine& password = walker.password();
    std::optional<Examined> value;
    if (password.form == ValueForm::kBytes) value = examine(password.value);
    const Outcome outcome = value ? outcomeOf(walker, *value, conversion_, earlier_, made) : outcomeWithout(password);
    const bool changed = isChanged(outcome.counter);
    Counts& counts = part_.counts;
    ++counts.values;
    if (!outcome.status.ok()) part_.report(walker.lineNumber(), walker.dn(), outcome.status.code, outcome.status.text);
    const Secret whole = password.whole(changed ? made : password.value);
    const bool repeated = value && values_.repeats(walker, whole, changed);
    ++(counts.*(repeated ? &Counts::dropped : outcome.counter));
    if (!repeated && (outcome.counter == &Counts::cut || outcome.counter == &Counts::resumed)) ++counts.made;
    if (value) countForPlan(value->scheme(), outcome.counter, conversion_.target, part_.plan);
    write(walker, whole, changed, repeated);
  }

  void write(const RecordWalker& walker, const Secret& whole, bool changed, bool repeated) {
    const PasswordLine& password = walker.password();
    if (conversion_.options.dryRun) return;
    if (!conversion_.options.changes) {
      if (repeated) return;
      return changed ? writeChanged(walker.line(), password.description, whole, part_.out) : keep(walker);
    }
    if (!changed && !repeated) return;
    const Secret old = password.whole(password.value);
    repeated ? changes_.drop(walker, old, whole, changed, part_) : changes_.replace(walker, old, whole, part_);
  }

  const Conversion& conversion_;
  ConversionPart& part_;
  EntryValues values_;
  ChangeWriter changes_;
  const EarlierChanges::Values* earlier_ = nullptr;  // of the entry
  std::uint64_t entry_ = 0;
};

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

// The schemes of which a counter of the plan is not 0.
template <typename Work>
void forEachPlanned(const ByScheme<Plan>& plan, std::uint64_t Plan::*counter, const Work& work) {
  for (const Scheme& scheme : kSchemes) {
    const std::uint64_t count = plan.of(scheme).*counter;
    if (count > 0) work(scheme.name, count);
  }
}

// "clear 3, aes256 2"
std::string listed(const ByScheme<Plan>& plan, std::uint64_t Plan::*counter) {
  std::string list;
  forEachPlanned(plan, counter, [&](const char* scheme, std::uint64_t count) {
    list += (list.empty() ? "" : ", ") + std::string(scheme) + " " + std::to_string(count);
  });
  return list;
}

void writeObject(std::uint64_t entries, const ConversionPart& sum) {
  Results results;
  Json json;
  json.number("entries", entries);
  addFields(json, sum.counts, kNames);
  for (const CountName<Plan>& row : kPlanNames) {
    json.open(row.name);
    forEachPlanned(sum.plan, row.counter, [&](const char* scheme, std::uint64_t count) { json.number(scheme, count); });
    json.close();
  }
  results.line(json.end());
  results.flush();
}

void showSummary(std::uint64_t entries, const ConversionPart& sum, const Conversion& conversion) {
  const Scheme& target = conversion.target;
  if (sum.counts.cut > 0) {
    warning(std::to_string(sum.counts.cut) + " passwords are longer than the " + std::to_string(target.cutBytes) +
            " bytes that " + target.name + " uses: only their beginnings will be checked");
  }
  if (conversion.options.json) return writeObject(entries, sum);
  message("entries: " + std::to_string(entries));
  for (const CountName<Counts>& row : kNames) {
    const std::uint64_t count = sum.counts.*row.counter;
    const bool always = row.counter == &Counts::values || row.counter == &Counts::made;
    if (always || count > 0) message(std::string(row.text) + ": " + std::to_string(count));
  }
  const std::string now = listed(sum.plan, &Plan::now);
  const std::string later = listed(sum.plan, &Plan::later);
  if (!now.empty()) message((conversion.options.dryRun ? "would now be " : "now ") + (target.name + (": " + now)));
  if (!later.empty()) message(std::string(target.name) + " only at the next login: " + later);
}

Conversion conversionOf(const LdifOptions& options) {
  const Scheme& target = targetOf(options);
  const Costs costs = completeCosts(target, options.costs);
  requireProvider();
  std::vector<std::string> paths = options.keys;
  paths.insert(paths.begin(), options.newKeys);
  return {target, options, costs, KeyRecord::load(options.newKeys), KeyRing(paths), {}};
}

void requireOtherKeys(const Conversion& conversion) {
  const std::vector<KeyRecord>& keys = conversion.keys.keys();
  for (size_t i = 1; conversion.newKeys && i < keys.size(); ++i) {
    if (sameRecord(keys[i], conversion.newKeys)) throw Failure(kUsage, "--keys and --new-keys hold the same keys");
  }
}

}  // namespace

ExitCode convertExport(const LdifOptions& options) {
  Conversion conversion = conversionOf(options);
  requireOtherKeys(conversion);
  proveTarget(conversion);
  Input input = openExport(options.source);
  if (!options.resume.empty()) conversion.earlier.load(options.resume, AttributeSet(options.source.attributes));
  std::optional<OutputFile> file;
  if (options.out != "-" && !options.dryRun) {
    Place place(options.out, options.force);
    nameLeftovers(place, nullptr);
    file.emplace(std::move(place), kNewFileMode);
    file->keepAccess();
  }
  std::optional<GracefulStop> stop;  // what has been written of changes is whole, what of an export is not
  if (options.changes) stop.emplace();
  ConversionPart sum;
  const auto deliver = [&](const ConversionPart& part) {
    addCounts(sum.counts, part.counts, kNames);
    sum.plan.add(part.plan, kPlanNames);
  };
  ExportOptions source = options.source;
  source.resultsOnStdout = !file;
  source.write = [&](std::string_view bytes) {
    file ? file->write(bytes) : writeAll(STDOUT_FILENO, bytes, "standard output");
  };
  source.costly = isCostly(conversion.target);
  const ExportSum whole = runExport<ConversionPart>(
      input, source, [&](RecordWalker& walker, ConversionPart& part) { Converter(conversion, part).all(walker); },
      deliver);
  if (file) file->commit();
  if (!options.quiet) showSummary(whole.entries, sum, conversion);
  if (stop && stopIsAsked()) message("stopped before the end of the export; --resume goes on with what was written");
  if (stop) stop->finish();
  return whole.exitCode;
}

}  // namespace tool
