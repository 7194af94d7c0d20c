// SPDX-License-Identifier: Apache-2.0
// ldappw trial: shows on the passwords of a real export that every scheme does what it promises: made, checked, a wrong
// one refused, read back. Values are checked with the call that the server makes, not with the command's own check,
// which serves longer passwords.
#include "verbs/options.h"

#include <ctime>
#include <optional>

#include "ldif/export_run.h"
#include "password_schemes.h"
#include "schemes/schemes.h"
#include "schemes/values.h"

namespace tool {
namespace {

// Totals: the clear passwords; the reversible values that the keys open and those that they do not; one-way, unknown,
// elsewhere or not well formed; what went wrong.
enum Total : size_t { kClear, kRead, kUnread, kOther, kDifferences };
// Columns: values made; those accepted; those whose wrong password was refused; those read back and equal, as far as
// the scheme holds the password; passwords that the scheme cannot hold; processor time.
enum Column : size_t { kMade, kVerified, kRefused, kRecovered, kSkipped, kNanoseconds };

constexpr CountName kTotalNames[] = {{"clear", "clear passwords"},
                                     {"reversibleRead", "reversible values read"},
                                     {"reversibleUnread", "not read"},
                                     {"others", "others"},
                                     {"differences", "differences"}};
constexpr CountName kColumnNames[] = {{"values", "values"},
                                      {"verified", "verified"},
                                      {"refused", "refused"},
                                      {"recovered", "recovered"},
                                      {"skipped", "skipped"}};

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
const char* tryPassword(const Scheme& scheme, const Secret& password, const KeyRecord& keys, Tally::Row& counts) {
  Secret stored;
  const Status made = makeValue(scheme, keys, password, stored);
  if (!made.ok()) return made.text;
  ++counts[kMade];
  const char* problem = nullptr;
  const auto check = [&](bool good, Column column, const char* text) {
    if (good) ++counts[column];
    if (!good && problem == nullptr) problem = text;
  };
  check(serverAccepts(stored, keys, password), kVerified, "the value does not verify");
  check(!serverAccepts(stored, keys, wrongFor(password)), kRefused, "a wrong password verifies");
  if (!scheme.reversible()) return problem;
  Secret clear;
  const size_t held = scheme.cutBytes != 0 ? scheme.cutBytes : std::string_view::npos;
  const bool same =
      openValue(examine(stored), keys, clear).ok() && equalBytes(clear.view(), password.view().substr(0, held));
  check(same, kRecovered, "the password does not come back from the value");
  return problem;
}

void tryScheme(const Scheme& scheme, const std::vector<Candidate>& candidates, const KeyRecord& keys, Part& part) {
  const std::uint64_t start = threadNanoseconds();
  Tally::Row& counts = part.tally.of(scheme);
  for (const Candidate& candidate : candidates) {
    if (!passwordProblem(scheme, candidate.password.view()).ok()) {
      ++counts[kSkipped];
      continue;
    }
    const char* problem = tryPassword(scheme, candidate.password, keys, counts);
    if (problem == nullptr) continue;
    ++part.tally.totals[kDifferences];
    part.report(candidate.line, candidate.dn, kBadValue, std::string(scheme.name) + ": " + problem);
  }
  counts[kNanoseconds] += threadNanoseconds() - start;
}

// Counts the value, and returns it when it is a clear password.
std::optional<Candidate> candidateOf(const RecordWalker& walker, const KeyRecord& keys, Tally& tally) {
  const PasswordLine& password = walker.password();
  if (password.form != ValueForm::kBytes) {
    ++tally.totals[kOther];
    return std::nullopt;
  }
  const Examined value = examine(password.value);
  const Kind kind = value.scheme().kind;
  Secret opened;
  if (kind == Kind::kClear) {
    ++tally.totals[kClear];
    return Candidate{walker.lineNumber(), walker.dn(), Secret(password.value.view())};
  }
  ++tally.totals[kind != Kind::kReversible ? kOther : openValue(value, keys, opened).ok() ? kRead : kUnread];
  return std::nullopt;
}

void tryBatch(RecordWalker& walker, const KeyRecord& keys, Part& part) {
  std::vector<Candidate> candidates;
  while (walker.next()) {
    if (!walker.atPassword()) continue;
    std::optional<Candidate> candidate = candidateOf(walker, keys, part.tally);
    if (candidate) candidates.push_back(std::move(*candidate));
  }
  for (const Scheme& scheme : kSchemes) {
    if (inTrial(scheme)) tryScheme(scheme, candidates, keys, part);
  }
}

std::uint64_t rateOf(const Tally::Row& counts) noexcept {
  const double seconds = static_cast<double>(counts[kNanoseconds]) / 1e9;
  return seconds > 0 ? static_cast<std::uint64_t>(static_cast<double>(counts[kMade]) / seconds) : 0;
}

void writeTable(const Tally& tally, Results& results) {
  std::string row = leftCell("scheme", 9);
  for (const CountName& column : kColumnNames) row += cell(column.text, 10);
  results.line(row + cell("values/s", 12));
  for (const Scheme& scheme : kSchemes) {
    if (!inTrial(scheme)) continue;
    const Tally::Row& counts = tally.of(scheme);
    row = leftCell(scheme.name, 9);
    for (size_t column = kMade; column <= kSkipped; ++column) {
      row += column == kRecovered && !scheme.reversible() ? cell("-", 10) : cell(counts[column], 10);
    }
    results.line(row + cell(rateOf(counts), 12));
  }
  std::string sum = std::to_string(tally.entries) + " entries";
  for (size_t total = kClear; total <= kDifferences; ++total) {
    sum += (total == kClear         ? ": "
            : total == kDifferences ? "; "
                                    : ", ") +
           std::to_string(tally.totals[total]) + " " + kTotalNames[total].text;
  }
  results.line(sum);
  results.line(kNotes);
}

void writeObject(const Tally& tally, Results& results) {
  Json json;
  json.number("entries", tally.entries);
  addCounts(json, kTotalNames, tally.totals.data());
  json.open("schemes");
  for (const Scheme& scheme : kSchemes) {
    if (!inTrial(scheme)) continue;
    const Tally::Row& counts = tally.of(scheme);
    json.open(scheme.name);
    for (size_t column = kMade; column <= kSkipped; ++column) {
      if (column != kRecovered || scheme.reversible()) json.number(kColumnNames[column].name, counts[column]);
    }
    json.number("perSecond", rateOf(counts)).close();
  }
  results.line(json.close().end());
}

ExitCode trial(const Options& options) {
  requireProvider();
  const KeyRecord keys = KeyRecord::load(options.keys);
  Input input = openExport(options.source);
  const Part sum = runExport(
      input, options.source, [&](RecordWalker& walker, Part& part) { tryBatch(walker, keys, part); },
      [](const Part&) {});
  Results results;
  (options.json ? writeObject : writeTable)(sum.tally, results);
  results.flush();
  if (sum.exitCode != kSuccess) return sum.exitCode;
  return sum.tally.totals[kUnread] > 0 ? kBadKey : kSuccess;
}

}  // namespace

void setUpTrial(CLI::App& verb, ExitCode& exitCode) {
  const auto options = std::make_shared<Options>();
  addPath(verb, "FILE", options->source.in, "export (LDIF) to read, \"-\" for standard input; it is not changed")
      ->required();
  addKeys(verb, "--keys", options->keys, "key stash file, for the AES schemes and values")->required();
  verb.add_flag("--json", options->json, "the counts as one JSON object");
  verb.footer("Exits with 0 when everything agrees, 3 when anything differs, 4 when the keys do not open a value.");
  verb.callback([options, &exitCode] { exitCode = trial(*options); });
}

}  // namespace tool
