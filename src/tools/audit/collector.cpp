// SPDX-License-Identifier: Apache-2.0
#include "audit/collector.h"

#include <algorithm>
#include <cstdio>
#include <new>

#include "base/input.h"
#include "base/text.h"
#include "schemes/foreign_values.h"
#include "schemes/schemes.h"
#include "schemes/values.h"

namespace tool {
namespace {

constexpr const char* kNames[] = {"uid", "cn", "0.9.2342.19200300.100.1.1", "2.5.4.3"};
constexpr const char* kClassNames[] = {"objectClass", "2.5.4.0"};

// Entries of these classes are somebody's account.
constexpr const char* kAccountClasses[] = {"person",  "organizationalPerson", "inetOrgPerson",
                                           "account", "posixAccount",         "simpleSecurityObject"};

template <size_t N>
bool isOneOf(std::string_view name, const char* const (&names)[N]) noexcept {
  return std::any_of(std::begin(names), std::end(names), [&](const char* one) { return sameName(name, one); });
}

// Values of earlier passwords, with which nobody logs in.
bool isHistory(std::string_view type) noexcept {
  return sameName(type, "pwdHistory") || sameName(type, "passwordHistory");
}

Secret lowered(std::string_view text) {
  Secret low(text);
  std::transform(text.begin(), text.end(), low.data(),
                 [](char c) { return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c; });
  return low;
}

// The last RDNs of what an entry is in; equal for names that differ in case and in blanks behind commas.
std::string subtreeOf(std::string_view dn, size_t depth) {
  std::vector<std::string_view> rdns;
  for (size_t end = endOfRdn(dn); end != std::string_view::npos; end = endOfRdn(dn)) {
    dn.remove_prefix(end + 1);
    rdns.push_back(trimSpaces(dn.substr(0, endOfRdn(dn))));
  }
  std::string subtree;
  for (size_t i = rdns.size() - std::min(depth, rdns.size()); i < rdns.size(); ++i) {
    subtree += (subtree.empty() ? "" : ",") + std::string(rdns[i]);
  }
  const auto lower = [](char c) { return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c; };
  std::transform(subtree.begin(), subtree.end(), subtree.begin(), lower);
  if (subtree.size() > kMostDnBytes) return kOtherSubtrees;
  return subtree.empty() ? "(top)" : subtree;
}

// The uid or cn that the entry is named by, for exports without these attributes.
std::string nameInDn(std::string_view dn) {
  const std::string_view rdn = dn.substr(0, endOfRdn(dn));
  const size_t equals = rdn.find('=');
  if (equals == std::string_view::npos || !isOneOf(trimSpaces(rdn.substr(0, equals)), kNames)) return "";
  std::string name(trimSpaces(rdn.substr(equals + 1)));
  name.erase(std::remove(name.begin(), name.end(), '\\'), name.end());
  return name;
}

Finding findingOf(Strength strength) noexcept {
  switch (strength) {
    case Strength::kClear:
      return Finding::kClear;
    case Strength::kReversible:
      return Finding::kReversible;
    case Strength::kUnsalted:
      return Finding::kUnsalted;
    case Strength::kDesCrypt:
      return Finding::kDesCrypt;
    case Strength::kSaltedFast:
      return Finding::kSaltedFast;
    default:
      return Finding::kUnknown;
  }
}

bool isFinding(Strength strength) noexcept {
  return strength <= Strength::kSaltedFast || strength == Strength::kUnknown;
}

size_t rowOf(const Scheme& scheme) noexcept {
  return scheme.kind == Kind::kUnknown ? kSchemes.size() : indexOf(scheme);
}

}  // namespace

std::vector<std::string> auditedNames() {
  std::vector<std::string> names(std::begin(kNames), std::end(kNames));
  names.insert(names.end(), std::begin(kClassNames), std::end(kClassNames));
  return names;
}

void AuditRules::loadKnownBad(const std::string& path) {
  LineReader passwords{Input(path), kPasswordLine};
  Sha256 sha256;
  Secret line;
  while (passwords.next(line)) {
    if (!line.empty() && line.view().back() == '\r') line.resize(line.size() - 1);
    if (line.empty()) continue;
    knownBad.push_back(markKey.of(sha256, MarkKind::kPassword, line.view()));
    if (checkHashes) tried.emplace_back(line.view());
  }
  if (knownBad.empty()) throw Failure(kBadValue, path + " holds no password");
  std::sort(knownBad.begin(), knownBad.end());
}

Facts Collector::collect(RecordWalker& walker) {
  std::uint64_t record = 0;
  while (walker.next()) {
    if (walker.line().blank() || walker.entries() != record) finishEntry();
    record = walker.entries();
    if (walker.atPassword()) takeLine(walker);
  }
  finishEntry();
  facts_.entries = walker.entries();
  return std::move(facts_);
}

void Collector::takeLine(const RecordWalker& walker) {
  if (!inEntry_) entry_.dn = walker.dn();
  inEntry_ = true;
  const PasswordLine& line = walker.password();
  const std::string_view description = line.description;
  const std::string_view type = trimSpaces(description.substr(0, description.find(';')));
  const bool isName = isOneOf(type, kNames);
  if (!isName && !isOneOf(type, kClassNames)) return takePassword(walker, type);
  if (line.form != ValueForm::kBytes) return;
  if (isName) entry_.names.emplace_back(line.value.view());
  const bool account = sameName(type, "uid") || (!isName && isOneOf(line.value.view(), kAccountClasses));
  entry_.account = entry_.account || (account && !walker.modifies());
}

void Collector::takePassword(const RecordWalker& walker, std::string_view type) {
  const PasswordLine& line = walker.password();
  ++facts_.values;
  facts_.urls += line.form == ValueForm::kUrl ? 1 : 0;
  facts_.deleted += line.form == ValueForm::kDeleted ? 1 : 0;
  facts_.authPasswords += line.form == ValueForm::kAuthPassword ? 1 : 0;
  if (line.form == ValueForm::kBroken) found(Finding::kBroken);
  const bool current = !isHistory(type);
  entry_.lines.push_back({walker.lineNumber(), line.description, line.form, line.problem, Secret(), current});
  if (line.form == ValueForm::kBytes) entry_.lines.back().value.append(line.value.view());
  entry_.hasPassword = entry_.hasPassword || (line.form != ValueForm::kDeleted && current);
}

void Collector::finishEntry() {
  if (!inEntry_) return;
  Subtree subtree;
  subtree.entries = 1;
  const std::string name = nameInDn(entry_.dn);
  if (!name.empty()) entry_.names.emplace_back(name);
  for (const Secret& one : entry_.names) entry_.lowNames.insert(lowered(one.view()));
  for (const StoredLine& line : entry_.lines) {
    const Verdict verdict = judgeLine(line, subtree);
    keepFirst(firstProblem_, textOf(verdict.condition).code);
    appendLine(rules_.lines, entry_.dn, line, verdict, part_.out);
    part_.spill();
  }
  if (entry_.account && !entry_.hasPassword) found(Finding::kNoPassword);
  if (entry_.account || entry_.hasPassword) {
    ++facts_.accounts;
    facts_.subtrees[subtreeOf(entry_.dn, rules_.subtreeDepth)].add(subtree);
  }
  const std::string dn = entry_.findings.any() ? keptDn() : "";
  for (size_t i = 0; i < kFindingCount; ++i) {
    if (entry_.findings.test(i)) facts_.findings[i].note(dn, rules_.listed);
  }
  entry_ = {};
  inEntry_ = holds_ = false;
}

Verdict Collector::judgeLine(const StoredLine& line, Subtree& subtree) {
  constexpr const char* kElsewhere[] = {"", "url", "deleted", "authPassword"};
  static_assert(sizeof kElsewhere / sizeof kElsewhere[0] == static_cast<size_t>(ValueForm::kBroken));
  if (line.form == ValueForm::kBytes) return judge(line.value, line.current, subtree);
  if (line.form == ValueForm::kBroken) return {"unknown", Condition::kBroken, line.problem};
  return {kElsewhere[static_cast<size_t>(line.form)], Condition::kFine, ""};
}

// current: a value to log in with.
Verdict Collector::judge(const Secret& value, bool current, Subtree& subtree) {
  const Examined examined = examine(value);
  const bool malformed = examined.condition == Condition::kMalformed && examined.problem != nullptr;
  Verdict verdict{examined.scheme().name, examined.condition, malformed ? examined.problem : ""};
  if (examined.wrapping == Wrapping::kPadded || examined.wrapping == Wrapping::kEncoded) {
    found(Finding::kWrapped);
    judge(unwrapped(value, examined.wrapping), false, subtree);
    return verdict;
  }
  const Scheme& scheme = examined.wrapping == Wrapping::kLocked ? *findScheme("locked") : examined.scheme();
  const bool locked = scheme.strength == Strength::kLocked;
  const auto strength = static_cast<size_t>(scheme.strength);
  ++facts_.schemes[rowOf(scheme)];
  ++facts_.strengths[strength];
  ++subtree.values;
  ++subtree.strengths[strength];
  if (isFinding(scheme.strength)) found(findingOf(scheme.strength));
  if (verdict.condition == Condition::kMalformed || verdict.condition == Condition::kForeign) {
    found(Finding::kMalformed);
  }
  if (!locked && !rules_.accepted.empty() && !rules_.accepted[rowOf(scheme)]) found(Finding::kNotAccepted);
  Condition opened = Condition::kFine;
  Secret earlier;
  if (!locked && examined.problem == nullptr) {
    if (current) opened = judgeCurrent(examined);
    if (!current && rules_.valuesAreProblems) opened = open(examined, earlier);
  }
  if (verdict.condition == Condition::kFine) verdict.condition = opened;
  return verdict;
}

// kFine also for a value that is not to be opened: password is empty then.
Condition Collector::open(const Examined& value, Secret& password) const {
  const Scheme& scheme = value.scheme();
  if (scheme.open == nullptr || (scheme.needsKey() && rules_.keys.empty())) return Condition::kFine;
  const KeyRing::Opened opened = rules_.keys.open(value, 0, password);
  if (opened.status(rules_.allowBinary).ok()) return Condition::kFine;
  return opened.result == KeyRing::Opened::Result::kRefused ? Condition::kUnopened : Condition::kNotText;
}

Condition Collector::judgeCurrent(const Examined& value) {
  const Scheme& scheme = value.scheme();
  const bool opens = scheme.open != nullptr && (!scheme.needsKey() || !rules_.keys.empty());
  Secret password;
  const Condition opened = open(value, password);
  if (opens && opened == Condition::kFine) {
    judgePassword(password.view());
    return opened;
  }
  if (opens) found(Finding::kUnopened);
  // Without a salt, equal values are equal passwords.
  if (scheme.reversible() || scheme.strength == Strength::kUnsalted) {
    std::string name = scheme.name;
    name += ' ';
    Secret bytes(name);
    bytes.append(value.value.payload());
    sight(rules_.markKey.of(sha256_, MarkKind::kValue, bytes.view()));
  }
  if (rules_.checkHashes && scheme.kind == Kind::kOneWay && scheme.check != nullptr) tryNames(value);
  return opened;
}

void Collector::judgePassword(std::string_view password) {
  if (password.empty()) return found(Finding::kEmpty);
  if (entry_.lowNames.count(lowered(password)) > 0) found(Finding::kName);
  const Mark mark = rules_.markKey.of(sha256_, MarkKind::kPassword, password);
  if (std::binary_search(rules_.knownBad.begin(), rules_.knownBad.end(), mark)) found(Finding::kKnownBad);
  sight(mark);
}

// A value that cannot be checked may hide any password: one changed number in it is enough for that.
bool Collector::matches(const Examined& value, const Secret& password) {
  if (password.view().find('\0') != std::string_view::npos) return false;
  const char* impossible = crypt3PasswordProblem(password.view());
  Status status{kInternal, ""};
  try {
    status = checkValue(value, KeyRecord(), password);  // one-way values need no keys
  } catch (const Failure&) {
    // There is no library for it.
  } catch (const std::bad_alloc&) {
    // There is no memory for it.
  }
  const bool answered = status.code <= kNoMatch || (impossible != nullptr && status.text == std::string(impossible));
  if (!answered) found(Finding::kUnchecked);
  return status.ok();
}

void Collector::tryNames(const Examined& value) {
  constexpr size_t kMostNames = 32;  // tried: an entry with many of both would take names times values
  const auto last = entry_.names.begin() + static_cast<std::ptrdiff_t>(std::min(entry_.names.size(), kMostNames));
  const auto isMatch = [&](const Secret& password) { return matches(value, password); };
  if (std::any_of(entry_.names.begin(), last, isMatch)) found(Finding::kName);
  if (last != entry_.names.end()) found(Finding::kUnchecked);
  if (std::any_of(rules_.tried.begin(), rules_.tried.end(), isMatch)) found(Finding::kKnownBad);
}

// A long DN is kept by its beginning and a digest: entries that begin alike would be one otherwise.
std::string Collector::keptDn() {
  constexpr size_t kDigestBytes = 16;
  if (entry_.dn.empty()) return "(no dn)";
  if (entry_.dn.size() <= kMostDnBytes) return entry_.dn;
  char hex[2 * kDigestBytes + 1];
  const Sha256::Digest digest = sha256_.of({entry_.dn});
  for (size_t i = 0; i < kDigestBytes; ++i) snprintf(hex + 2 * i, 3, "%02x", static_cast<unsigned>(digest[i]));
  return entry_.dn.substr(0, kMostDnBytes - 2 * sizeof hex) + "... (SHA-256 " + hex + ")";
}

void Collector::sight(const Mark& mark) {
  if (!holds_) facts_.holders.push_back(keptDn());
  holds_ = true;
  facts_.sightings.push_back({mark, facts_.holders.size() - 1});
}

}  // namespace tool
