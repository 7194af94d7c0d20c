// SPDX-License-Identifier: Apache-2.0
#include "audit/collector.h"

#include <algorithm>

#include "base/input.h"
#include "base/text.h"
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

std::string keptDn(const std::string& dn) {
  if (dn.empty()) return "(no dn)";
  return dn.size() <= kMostDnBytes ? dn : dn.substr(0, kMostDnBytes - 3) + "...";
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
  LineReader lines{Input(path)};
  Sha256 sha256;
  Secret line;
  while (lines.next(line)) {
    if (!line.empty() && line.view().back() == '\r') line.resize(line.size() - 1);
    if (line.empty()) continue;
    knownBad.push_back(markKey.of(sha256, MarkKind::kPassword, line.view()));
    if (checkHashes) tried.emplace_back(line.view());
  }
  if (knownBad.empty()) throw Failure(kBadValue, path + " holds no password");
  std::sort(knownBad.begin(), knownBad.end());
}

std::unique_ptr<Facts> Collector::collect(RecordWalker& walker) {
  std::uint64_t record = 0;
  while (walker.next()) {
    if (walker.line().blank() || walker.entries() != record) finishEntry();
    record = walker.entries();
    if (walker.atPassword()) takeLine(walker);
  }
  finishEntry();
  facts_->entries = walker.entries();
  return std::move(facts_);
}

void Collector::takeLine(const RecordWalker& walker) {
  inEntry_ = true;
  entry_.dn = walker.dn();
  const PasswordLine& line = walker.password();
  const std::string_view description = line.description;
  const std::string_view type = trimSpaces(description.substr(0, description.find(';')));
  const bool isName = isOneOf(type, kNames);
  if (!isName && !isOneOf(type, kClassNames)) return takePassword(line, type);
  if (line.form != ValueForm::kBytes) return;
  if (isName) entry_.names.emplace_back(line.value.view());
  const bool account = sameName(type, "uid") || (!isName && isOneOf(line.value.view(), kAccountClasses));
  entry_.account = entry_.account || (account && !walker.modifies());
}

void Collector::takePassword(const PasswordLine& line, std::string_view type) {
  ++facts_->values;
  facts_->urls += line.form == ValueForm::kUrl ? 1 : 0;
  facts_->deleted += line.form == ValueForm::kDeleted ? 1 : 0;
  facts_->authPasswords += line.form == ValueForm::kAuthPassword ? 1 : 0;
  if (line.form == ValueForm::kBroken) found(Finding::kBroken);
  if (line.form == ValueForm::kBytes)
    (isHistory(type) ? entry_.history : entry_.passwords).emplace_back(line.value.view());
  entry_.hasPassword = entry_.hasPassword || (line.form != ValueForm::kDeleted && !isHistory(type));
}

void Collector::finishEntry() {
  if (!inEntry_) return;
  Subtree subtree;
  subtree.entries = 1;
  const std::string name = nameInDn(entry_.dn);
  if (!name.empty()) entry_.names.emplace_back(name);
  for (const Secret& value : entry_.passwords) judge(value, true, subtree);
  for (const Secret& value : entry_.history) judge(value, false, subtree);
  if (entry_.account && !entry_.hasPassword) found(Finding::kNoPassword);
  if (entry_.account || entry_.hasPassword) {
    ++facts_->accounts;
    facts_->subtrees[subtreeOf(entry_.dn, rules_.subtreeDepth)].add(subtree);
  }
  const std::string dn = entry_.findings.any() ? keptDn(entry_.dn) : "";
  for (size_t i = 0; i < kFindingCount; ++i) {
    if (entry_.findings.test(i)) facts_->findings[i].note(dn, rules_.listed);
  }
  entry_ = {};
  inEntry_ = holds_ = false;
}

// current: a value to log in with.
void Collector::judge(const Secret& value, bool current, Subtree& subtree) {
  const Examined examined = examine(value);
  const Wrapping wrapping = examined.wrapping;
  if (wrapping == Wrapping::kPadded || wrapping == Wrapping::kEncoded) {
    found(Finding::kWrapped);
    return judge(unwrapped(value, wrapping), false, subtree);
  }
  const Condition condition = examined.condition;
  const Scheme& scheme = wrapping == Wrapping::kLocked ? *findScheme("locked") : examined.scheme();
  const bool locked = scheme.strength == Strength::kLocked;
  const auto strength = static_cast<size_t>(scheme.strength);
  ++facts_->schemes[rowOf(scheme)];
  ++facts_->strengths[strength];
  ++subtree.values;
  ++subtree.strengths[strength];
  if (isFinding(scheme.strength)) found(findingOf(scheme.strength));
  if (condition == Condition::kMalformed || condition == Condition::kForeign) found(Finding::kMalformed);
  if (!locked && !rules_.accepted.empty() && !rules_.accepted[rowOf(scheme)]) found(Finding::kNotAccepted);
  if (current && !locked && examined.problem == nullptr) judgeValue(examined);
}

void Collector::judgeValue(const Examined& value) {
  const Scheme& scheme = value.scheme();
  if (scheme.open != nullptr && (!scheme.needsKey() || rules_.keys)) {
    Secret password;
    const bool opened = openValue(value, rules_.keys, password).ok();
    if (opened && (scheme.strength == Strength::kClear || rules_.allowBinary || looksLikeText(password.view()))) {
      return judgePassword(password.view());
    }
    found(Finding::kUnopened);
  }
  // Without a salt, equal values are equal passwords.
  if (scheme.reversible() || scheme.strength == Strength::kUnsalted) {
    std::string name = scheme.name;
    name += ' ';
    Secret bytes(name);
    bytes.append(value.value.payload());
    sight(rules_.markKey.of(sha256_, MarkKind::kValue, bytes.view()));
  }
  if (rules_.checkHashes && scheme.kind == Kind::kOneWay && scheme.check != nullptr) tryNames(value);
}

void Collector::judgePassword(std::string_view password) {
  if (password.empty()) return found(Finding::kEmpty);
  const auto isName = [&](const Secret& name) { return sameName(name.view(), password); };
  if (std::any_of(entry_.names.begin(), entry_.names.end(), isName)) found(Finding::kName);
  const Mark mark = rules_.markKey.of(sha256_, MarkKind::kPassword, password);
  if (std::binary_search(rules_.knownBad.begin(), rules_.knownBad.end(), mark)) found(Finding::kKnownBad);
  sight(mark);
}

void Collector::tryNames(const Examined& value) {
  const auto matches = [&](const Secret& password) { return checkValue(value, rules_.keys, password).ok(); };
  if (std::any_of(entry_.names.begin(), entry_.names.end(), matches)) found(Finding::kName);
  if (std::any_of(rules_.tried.begin(), rules_.tried.end(), matches)) found(Finding::kKnownBad);
}

void Collector::sight(const Mark& mark) {
  if (!holds_) facts_->holders.push_back(keptDn(entry_.dn));
  holds_ = true;
  facts_->sightings.push_back({mark, facts_->holders.size() - 1});
}

}  // namespace tool
