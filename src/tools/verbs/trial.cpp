// SPDX-License-Identifier: Apache-2.0
// ldappw trial: shows on the passwords of a real export that every scheme does what it promises: made, checked, a wrong
// one refused, read back. Values are checked with the call that the server makes, not with the command's own check,
// which serves longer passwords.
#include "verbs/options.h"

#include <ctime>
#include <optional>

#include "ldif/counts.h"
#include "ldif/export_run.h"
#include "password_schemes.h"
#include "schemes/schemes.h"
#include "schemes/values.h"

namespace tool {
namespace {

struct Counts {
  std::uint64_t clear = 0;
  std::uint64_t read = 0;    // reversible values that the keys open
  std::uint64_t unread = 0;  // and those that they do not
  std::uint64_t others = 0;  // one-way, unknown, elsewhere or not well formed
  std::uint64_t differences = 0;
};
constexpr CountName<Counts> kNames[] = {{&Counts::clear, "clear", "clear passwords"},
                                        {&Counts::read, "reversibleRead", "reversible values read"},
                                        {&Counts::unread, "reversibleUnread", "not read"},
                                        {&Counts::others, "others", "others"},
                                        {&Counts::differences, "differences", "differences"}};

struct SchemeCounts {
  std::uint64_t made = 0;
  std::uint64_t verified = 0;
  std::uint64_t refused = 0;    // the wrong password of a value
  std::uint64_t recovered = 0;  // read back and equal, as far as the scheme holds the password
  std::uint64_t skipped = 0;    // passwords that the scheme cannot hold
  std::uint64_t nanoseconds = 0;
};
constexpr CountName<SchemeCounts> kSchemeNames[] = {
    {&SchemeCounts::made, "values", "values"},      {&SchemeCounts::verified, "verified", "verified"},
    {&SchemeCounts::refused, "refused", "refused"}, {&SchemeCounts::recovered, "recovered", "recovered"},
    {&SchemeCounts::skipped, "skipped", "skipped"}, {&SchemeCounts::nanoseconds, nullptr, nullptr}};

// True for a counter that is shown for the scheme.
bool isShown(const CountName<SchemeCounts>& row, const Scheme& scheme) noexcept {
  return row.name != nullptr && (scheme.reversible() || row.counter != &SchemeCounts::recovered);
}

struct TrialPart : ExportPart {
  Counts counts;
  ByScheme<SchemeCounts> schemes;
};

constexpr char kNotes[] =
    R"(verified: accepted by the server's check. refused: a password that differs in the first byte is not accepted.
recovered: read back and equal. values/s: made, checked twice and read back, per second of processor time.
crypt looks at the first 8 bytes of a password and qveil holds the first 46. ssha, md5 and crypt end at a NUL byte.
skipped: a password with a NUL byte, or under sha one that begins with {SHA}, which no value can stand for.)";

struct Options {
  ExportOptions source;
  std::string keys;
  bool json = false;
};

struct Candidate {
  std::uint64_t line;
  std::string dn;
  Secret password;
};

bool inTrial(const Scheme& scheme) noexcept {
  return scheme.make != nullptr && scheme.code != FORMAT_NONE;
}

std::uint64_t threadNanoseconds() noexcept {
  timespec now{};
  clock_gettime(CLOCK_THREAD_CPUTIME_ID, &now);
  return static_cast<std::uint64_t>(now.tv_sec) * 1000000000U + static_cast<std::uint64_t>(now.tv_nsec);
}

// A password that differs in its first byte, which every scheme looks at; in the lower 7 bits, as crypt looks at no
// more.
Secret wrongFor(const Secret& password) {
  Secret wrong(password.empty() ? std::string_view("x") : password.view());
  if (password.empty()) return wrong;
  char& first = *wrong.data();
  first = static_cast<char>(first ^ 1);
  if (first == '\0') first = 2;
  return wrong;
}

// The first thing that goes wrong, or null.
const char* tryPassword(const Scheme& scheme, const Costs& costs, const Secret& password, const KeyRecord& keys,
                        SchemeCounts& counts) {
  Secret stored;
  const Status made = makeValue(scheme, keys, costs, password, stored);
  if (!made.ok()) return made.text;
  ++counts.made;
  const char* problem = nullptr;
  const auto check = [&](bool good, std::uint64_t& counter, const char* text) {
    if (good) ++counter;
    if (!good && problem == nullptr) problem = text;
  };
  check(serverAccepts(stored, keys, password), counts.verified, "the value does not verify");
  check(!serverAccepts(stored, keys, wrongFor(password)), counts.refused, "a wrong password verifies");
  if (!scheme.reversible()) return problem;
  Secret clear;
  const size_t held = scheme.cutBytes != 0 ? scheme.cutBytes : std::string_view::npos;
  const bool same =
      openValue(examine(stored), keys, clear).ok() && equalBytes(clear.view(), password.view().substr(0, held));
  check(same, counts.recovered, "the password does not come back from the value");
  return problem;
}

void tryScheme(const Scheme& scheme, const std::vector<Candidate>& candidates, const KeyRecord& keys, TrialPart& part) {
  const std::uint64_t start = threadNanoseconds();
  SchemeCounts& counts = part.schemes.of(scheme);
  const Costs costs = completeCosts(scheme, {});
  for (const Candidate& candidate : candidates) {
    if (!passwordProblem(scheme, candidate.password.view()).ok()) {
      ++counts.skipped;
      continue;
    }
    const char* problem = tryPassword(scheme, costs, candidate.password, keys, counts);
    if (problem == nullptr) continue;
    ++part.counts.differences;
    part.report(candidate.line, candidate.dn, kBadValue, std::string(scheme.name) + ": " + problem);
  }
  counts.nanoseconds += threadNanoseconds() - start;
}

// Counts the value, and returns it when it is a clear password.
std::optional<Candidate> candidateOf(const RecordWalker& walker, const KeyRecord& keys, Counts& counts) {
  const PasswordLine& password = walker.password();
  if (password.form != ValueForm::kBytes) {
    ++counts.others;
    return std::nullopt;
  }
  const Examined value = examine(password.value);
  const Kind kind = value.scheme().kind;
  Secret opened;
  if (kind == Kind::kClear) {
    ++counts.clear;
    return Candidate{walker.lineNumber(), shownDn(walker.dn()), Secret(password.value.view())};
  }
  ++(kind != Kind::kReversible ? counts.others : openValue(value, keys, opened).ok() ? counts.read : counts.unread);
  return std::nullopt;
}

void tryBatch(RecordWalker& walker, const KeyRecord& keys, TrialPart& part) {
  std::vector<Candidate> candidates;
  while (walker.next()) {
    if (!walker.atPassword()) continue;
    std::optional<Candidate> candidate = candidateOf(walker, keys, part.counts);
    if (candidate) candidates.push_back(std::move(*candidate));
  }
  for (const Scheme& scheme : kSchemes) {
    if (inTrial(scheme)) tryScheme(scheme, candidates, keys, part);
  }
}

std::uint64_t rateOf(const SchemeCounts& counts) noexcept {
  const double seconds = static_cast<double>(counts.nanoseconds) / 1e9;
  return seconds > 0 ? static_cast<std::uint64_t>(static_cast<double>(counts.made) / seconds) : 0;
}

void writeTable(std::uint64_t entries, const TrialPart& sum, Results& results) {
  std::string row = leftCell("scheme", 9);
  for (const auto& column : kSchemeNames) row += column.text != nullptr ? cell(column.text, 10) : "";
  results.line(row + cell("values/s", 12));
  for (const Scheme& scheme : kSchemes) {
    if (!inTrial(scheme)) continue;
    const SchemeCounts& counts = sum.schemes.of(scheme);
    row = leftCell(scheme.name, 9);
    for (const auto& column : kSchemeNames) {
      if (column.name != nullptr) row += isShown(column, scheme) ? cell(counts.*column.counter, 10) : cell("-", 10);
    }
    results.line(row + cell(rateOf(counts), 12));
  }
  row = std::to_string(entries) + " entries";
  const char* separator = ": ";
  for (const auto& name : kNames) {
    if (name.counter == &Counts::differences) separator = "; ";
    row += separator + std::to_string(sum.counts.*name.counter) + " " + name.text;
    separator = ", ";
  }
  results.line(row);
  results.line(kNotes);
}

void writeObject(std::uint64_t entries, const TrialPart& sum, Results& results) {
  Json json;
  json.number("entries", entries);
  addFields(json, sum.counts, kNames);
  json.open("schemes");
  for (const Scheme& scheme : kSchemes) {
    if (!inTrial(scheme)) continue;
    const SchemeCounts& counts = sum.schemes.of(scheme);
    json.open(scheme.name);
    for (const auto& column : kSchemeNames) {
      if (isShown(column, scheme)) json.number(column.name, counts.*column.counter);
    }
    json.number("perSecond", rateOf(counts)).close();
  }
  results.line(json.close().end());
}

ExitCode trial(const Options& options) {
  requireProvider();
  const KeyRecord keys = KeyRecord::load(options.keys);
  Input input = openExport(options.source);
  TrialPart sum;
  const ExportSum whole = runExport<TrialPart>(
      input, options.source, [&](RecordWalker& walker, TrialPart& part) { tryBatch(walker, keys, part); },
      [&](const TrialPart& part) {
        addCounts(sum.counts, part.counts, kNames);
        sum.schemes.add(part.schemes, kSchemeNames);
      });
  Results results;
  (options.json ? writeObject : writeTable)(whole.entries, sum, results);
  results.flush();
  if (whole.exitCode != kSuccess) return whole.exitCode;
  return sum.counts.unread > 0 ? kBadKey : kSuccess;
}

}  // namespace

void setUpTrial(CLI::App& verb, ExitCode& exitCode) {
  const auto options = std::make_shared<Options>();
  addPath(verb, "FILE", options->source.in, "export (LDIF) to read, \"-\" for standard input; it is not changed")
      .required();
  addKeys(verb, "--keys", options->keys, "key stash file, for the AES schemes and values").required();
  addFlag(verb, "--json", options->json, "the counts as one JSON object");
  addFooter(verb, "Exits with 0 when everything agrees, 3 when anything differs, 4 when the keys do not open a value.");
  onRun(verb, [options, &exitCode] { exitCode = trial(*options); });
}

}  // namespace tool
