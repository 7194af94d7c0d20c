// SPDX-License-Identifier: Apache-2.0
// The trial of one batch. Values are checked with the call that the server makes, not with the command's own check,
// which is kinder to long passwords.
#include "trial_run.h"

#include <time.h>

#include <optional>

namespace tool {
namespace {

struct Candidate {
  std::uint64_t line;
  std::string dn;
  Secret password;
};

double threadSeconds() noexcept {
  timespec now{};
  clock_gettime(CLOCK_THREAD_CPUTIME_ID, &now);
  return static_cast<double>(now.tv_sec) + static_cast<double>(now.tv_nsec) / 1e9;
}

// A password that differs in its first byte, which every scheme looks at; in the lower 7 bits, as crypt looks at no
// more.
Secret wrongFor(const Secret& password) {
  Secret wrong(password.empty() ? std::string_view("x") : password.view());
  if (password.empty()) return wrong;
  char& first = wrong.data()[0];
  first = static_cast<char>(first ^ 1);
  if (first == '\0') first = 2;
  return wrong;
}

bool accepts(const Secret& stored, const Secret& presented, const KeyRecord& keys) noexcept {
  return verify_password(presented.c_str(), static_cast<int>(presented.size()), stored.c_str(),
                         static_cast<int>(stored.size()), 1, keys.get()) == LDAPPW_SUCCESS;
}

// The first thing that goes wrong, or null.
const char* tryPassword(const Scheme& scheme, const Secret& password, const KeyRecord& keys, TrialCounts& counts) {
  Secret stored;
  const Status made = formatPassword(scheme, keys, password, stored);
  if (!made.ok()) return made.text;
  ++counts.values;
  const char* problem = nullptr;
  const auto check = [&problem](bool good, std::uint64_t& counter, const char* text) {
    if (good) ++counter;
    if (!good && problem == nullptr) problem = text;
  };
  check(accepts(stored, password, keys), counts.verified, "the value does not verify");
  check(!accepts(stored, wrongFor(password), keys), counts.refused, "a wrong password verifies");
  if (!scheme.reversible) return problem;
  Secret clear;
  const std::size_t held = scheme.cutBytes != 0 ? scheme.cutBytes : std::string_view::npos;
  const bool same =
      revealValue(stored.view(), keys, clear).ok() && equalBytes(clear.view(), password.view().substr(0, held));
  check(same, counts.recovered, "the password does not come back from the value");
  return problem;
}

void tryScheme(const Scheme& scheme, const std::vector<Candidate>& candidates, const KeyRecord& keys,
               TrialCounts& counts, TrialResult& result) {
  const double start = threadSeconds();
  for (const Candidate& candidate : candidates) {
    if (!passwordProblem(scheme, candidate.password.view()).ok()) {
      ++counts.skipped;
      continue;
    }
    const char* problem = tryPassword(scheme, candidate.password, keys, counts);
    if (problem == nullptr) continue;
    ++result.tally.differences;
    result.findings.push_back("line " + std::to_string(candidate.line) + ": " + candidate.dn + ": " + scheme.name +
                              ": " + problem);
  }
  counts.seconds += threadSeconds() - start;
}

// Counts the value, and returns it when it is a clear password.
std::optional<Candidate> candidateOf(const RecordWalker& walker, const KeyRecord& keys, TrialTally& tally) {
  const PasswordLine& password = walker.password();
  const std::string_view value = password.value.view();
  const bool there = password.form == ValueForm::kBytes && !unknownTag(value);
  const bool clear = there && schemeOf(value).code == FORMAT_NONE;
  if (clear) {
    ++tally.clear;
    return Candidate{walker.lineNumber(), walker.dn(), Secret(value)};
  }
  Secret opened;
  if (!there || !schemeOf(value).reversible) {
    ++tally.other;
  } else if (revealValue(value, keys, opened).ok()) {
    ++tally.read;
  } else {
    ++tally.unread;
  }
  return std::nullopt;
}

}  // namespace

void TrialTally::add(const TrialTally& part) noexcept {
  entries += part.entries;
  clear += part.clear;
  read += part.read;
  unread += part.unread;
  other += part.other;
  differences += part.differences;
  for (std::size_t i = 0; i < kTrialSchemeCount; ++i) {
    schemes[i].values += part.schemes[i].values;
    schemes[i].verified += part.schemes[i].verified;
    schemes[i].refused += part.schemes[i].refused;
    schemes[i].recovered += part.schemes[i].recovered;
    schemes[i].skipped += part.schemes[i].skipped;
    schemes[i].seconds += part.schemes[i].seconds;
  }
}

TrialResult trialBatch(const Batch& batch, const AttributeSet& attributes, const KeyRecord& keys) {
  TrialResult result;
  std::vector<Candidate> candidates;
  RecordWalker walker(batch, attributes);
  while (walker.next()) {
    if (!walker.atPassword()) continue;
    std::optional<Candidate> candidate = candidateOf(walker, keys, result.tally);
    if (candidate) candidates.push_back(std::move(*candidate));
  }
  result.tally.entries = walker.entries();
  for (std::size_t i = 0; i < kTrialSchemeCount; ++i) {
    tryScheme(*findScheme(kTrialSchemes[i]), candidates, keys, result.tally.schemes[i], result);
  }
  return result;
}

}  // namespace tool
