// SPDX-License-Identifier: Apache-2.0
// Pairs of a value and a password are checked one after the other. Pairs of a DN and a password wait for the entry to
// come by in the export, on whatever thread it does.
#include "verbs/verify_batch.h"

#include <map>
#include <mutex>
#include <string>
#include <vector>

#include "base/input.h"
#include "base/results.h"
#include "schemes/values.h"
#ifdef LDAPPW_WITH_LDIF
#include "ldif/export_run.h"
#include "schemes/schemes.h"
#endif

namespace tool {
namespace {

constexpr Status kNoTab{kBadValue, "there is no tab in the record"};
constexpr Status kUntaggedValue{kBadValue, "the value has no tag (--clear takes it as a clear password)"};

Status check(const Secret& whole, const KeyRecord& key, const Secret& password, bool clear) {
  const Examined value = examine(whole);
  return value.scheme().isClear() && !clear ? kUntaggedValue : checkValue(value, key, password);
}

class Answers {
 public:
  explicit Answers(const BatchOptions& options) : options_(options), results_(options.null ? '\0' : '\n') {}

  void add(const Status& status, bool mayWait) {
    ++index_;
    keepFirst(exitCode_, status.code);
    const bool answered = status.code <= kNoMatch;
    if (options_.quiet) return;
    if (!options_.json) {
      results_.line(status.ok() ? "match" : answered ? "no match" : status.text);
    } else if (answered) {
      results_.line(Json().number("index", index_).flag("match", status.ok()).end());
    } else {
      showProblem(status);
    }
    if (mayWait) results_.flush();
  }

  ExitCode finish() {
    if (index_ == 0) throw Failure(kUsage, "there is no record in " + Input::nameOf(options_.file));
    results_.flush();
    return exitCode_;
  }

 private:
  void showProblem(const Status& status) { results_.line(Json().number("index", index_).problem(status).end()); }

  const BatchOptions& options_;
  Results results_;
  size_t index_ = 0;
  ExitCode exitCode_ = kSuccess;
};

// Calls work with what stands before and after the first tab of each record, or with nothing where there is no tab.
template <typename Work>
void forEachRecord(const BatchOptions& options, Work work) {
  LineReader lines(Input(options.file), kValueLine, options.null ? '\0' : '\n');
  Secret line;
  while (lines.next(line)) {
    const size_t tab = line.view().find('\t');
    const bool whole = tab != std::string_view::npos;
    const Secret subject(line.view().substr(0, whole ? tab : 0));
    const Secret password(line.view().substr(whole ? tab + 1 : line.size()));
    work(subject, password, whole, !lines.lineBuffered());
  }
}

ExitCode checkValues(const BatchOptions& options, const KeyRecord& key) {
  Answers answers(options);
  forEachRecord(options, [&](const Secret& value, const Secret& password, bool whole, bool mayWait) {
    answers.add(whole ? check(value, key, password, options.clear) : kNoTab, mayWait);
  });
  return answers.finish();
}

#ifdef LDAPPW_WITH_LDIF
constexpr Status kNoEntry{kBadValue, "the export has no such entry"};
constexpr Status kNoPassword{kBadValue, "the entry has no password"};
constexpr size_t kMostPasswords = 100;  // each is tried on each value of the entry
constexpr Status kTooMany{kBadValue, "the batch has more than 100 passwords for this entry"};

// DNs as they are compared: without regard to case, and to blanks beside the separators.
std::string plainName(std::string_view dn) {
  std::string plain;
  for (const char byte : dn) {
    const bool separator = byte == ',' || byte == '=' || byte == '+';
    while (separator && !plain.empty() && plain.back() == ' ') plain.pop_back();
    const bool afterOne = !plain.empty() && (plain.back() == ',' || plain.back() == '=' || plain.back() == '+');
    if (byte == ' ' && (plain.empty() || afterOne)) continue;
    plain += byte >= 'A' && byte <= 'Z' ? static_cast<char>(byte - 'A' + 'a') : byte;
  }
  while (!plain.empty() && plain.back() == ' ') plain.pop_back();
  return plain;
}

// What is known of a record; a later one counts more. An entry may have several values: any of them may match, and one
// that cannot be checked leaves the answer open.
enum class Known { kNothing, kEntry, kNoMatch, kProblem, kMatch };

struct Answer {
  Known known;
  Status status;
};

class Waiting {
 public:
  using Places = std::multimap<std::string, size_t>;  // sorted: a batch fills it
  using Range = std::pair<Places::const_iterator, Places::const_iterator>;

  explicit Waiting(const BatchOptions& options) {
    forEachRecord(options, [&](const Secret& dn, const Secret& password, bool whole, bool) {
      const std::string name = plainName(dn.view());
      const bool waits = whole && places_.count(name) < kMostPasswords;
      if (waits) places_.emplace(name, passwords_.size());
      passwords_.emplace_back(password.view());
      answers_.push_back({Known::kNothing, waits ? kNoEntry : whole ? kTooMany : kNoTab});
    });
  }

  // The records for an entry that has come by.
  Range enter(const std::string& dn) {
    const Range range = places_.equal_range(plainName(dn));
    settle(range, [](const Secret&) { return Answer{Known::kEntry, kNoPassword}; });
    return range;
  }
  void meet(const Range& range, const Secret& value, const KeyRecord& key, bool clear) {
    settle(range, [&](const Secret& password) {
      const Status status = check(value, key, password, clear);
      const Known known = status.ok() ? Known::kMatch : status.code == kNoMatch ? Known::kNoMatch : Known::kProblem;
      return Answer{known, status};
    });
  }

  const std::vector<Answer>& answers() const noexcept { return answers_; }

 private:
  template <typename Find>
  void settle(const Range& range, Find find) {
    for (auto place = range.first; place != range.second; ++place) {
      const Answer found = find(passwords_[place->second]);
      const std::lock_guard<std::mutex> lock(mutex_);
      Answer& answer = answers_[place->second];
      if (found.known > answer.known) answer = found;
    }
  }

  Places places_;
  std::vector<Secret> passwords_;
  std::vector<Answer> answers_;
  std::mutex mutex_;
};

ExitCode checkEntries(const BatchOptions& options, const KeyRecord& key) {
  Waiting waiting(options);
  ExportOptions source;
  source.in = options.ldif;
  Input input = openExport(source);
  const auto work = [&](RecordWalker& walker, ExportPart&) {
    std::uint64_t entries = 0;
    Waiting::Range range;
    while (walker.next()) {
      if (walker.entries() > entries) range = waiting.enter(walker.dn());
      entries = walker.entries();
      const bool current = walker.atPassword() && walker.password().history.empty();
      if (current && walker.password().form == ValueForm::kBytes) {
        waiting.meet(range, walker.password().value, key, options.clear);
      }
    }
  };
  runExport<ExportPart>(input, source, work, [](const ExportPart&) {});
  Answers answers(options);
  for (const Answer& answer : waiting.answers()) answers.add(answer.status, false);
  return answers.finish();
}
#endif

}  // namespace

ExitCode verifyBatch(const BatchOptions& options) {
  requireProvider();
  const KeyRecord key = KeyRecord::load(options.keys);
  if (options.ldif.empty()) return checkValues(options, key);
#ifdef LDAPPW_WITH_LDIF
  return checkEntries(options, key);
#else
  throw Failure(kUsage, "this command is built without LDIF");
#endif
}

}  // namespace tool
