// SPDX-License-Identifier: Apache-2.0
// Adding up what an audit counts, and the table of its findings.
#include "audit/facts.h"

#include <iterator>

namespace tool {
namespace {

template <typename Numbers>
void addNumbers(Numbers& sum, const Numbers& part) noexcept {
  for (size_t i = 0; i < sum.size(); ++i) sum[i] += part[i];
}

}  // namespace

// clang-format off
// In the order of the enumeration.
const FindingText kFindings[] = {
    {"clear", "high", "The password stands in the clear.",
     "make one-way values of all of them in one pass, as changes for ldapmodify.",
     "ldappw ldif --to argon2id --changes --in EXPORT --out CHANGES"},
    {"known-bad", "high", "The password is on the list of known bad ones.", "have the passwords changed.", ""},
    {"name-as-password", "high", "The password is the uid or the cn of the entry.", "have the passwords changed.", ""},
    {"empty", "high", "The password is empty.", "set a password, or remove the value.",
     "ldappw format --scheme argon2id"},
    {"reused", "middle", "Other entries have the same password.",
     "have the passwords changed, each to its own.", "ldappw format --scheme argon2id"},
    {"reversible", "middle", "The value can be turned back into the password.",
     "make one-way values of them where the passwords need not come back.",
     "ldappw ldif --to argon2id --keys STASH --changes --in EXPORT --out CHANGES"},
    {"unsalted", "middle", "Equal passwords have equal values, and one table of digests opens them all.",
     "these cannot be converted: have the server store a strong hash at the next login or change of password.", ""},
    {"des-crypt", "middle", "The scheme uses only about 8 characters, so every password can be tried.",
     "these cannot be converted: have the passwords changed, and stored as a strong hash.", ""},
    {"malformed", "middle", "The value is damaged: no password matches it.",
     "set the password again.", "ldappw identify"},
    {"wrapped", "middle", "Blanks or base64 around a value make the server treat it as clear text.",
     "take the value out of it.", "ldappw ldif --to argon2id --fix --changes --in EXPORT --out CHANGES"},
    {"salted-fast", "low", "The salted digest is fast, so guesses are cheap.",
     "these cannot be converted: have the server store a strong hash at the next login or change of password.", ""},
    {"no-password", "low", "The account has no password.",
     "nothing, if it authenticates some other way; else set a password or remove the account.", ""},
    {"unopened", "low", "The keys do not open the value.",
     "find the stash file that belongs to the export.", "ldappw keys check STASH EXPORT"},
    {"unknown", "low", "The scheme of the value is not known.",
     "find out which program wrote it, and whether the server can check it.", "ldappw identify"},
    {"broken", "low", "A line of the entry is not well formed.",
     "have the lines and the reasons listed, and mend the export.", "ldappw ldif --audit --verbose --in EXPORT"},
    {"unchecked", "middle", "The value could not be checked: it asks for too much, or there is no library for it.",
     "have the password set again, under a scheme at its usual costs.", "ldappw verify"},
    {"not-accepted", "middle", "The scheme is none of those that are accepted.",
     "convert what can be read, have the other passwords changed.",
     "ldappw ldif --to argon2id --keys STASH --changes --in EXPORT --out CHANGES"},
};
// clang-format on
static_assert(sizeof kFindings / sizeof kFindings[0] == kFindingCount);

void DnList::note(const std::string& dn, size_t most) {
  ++count;
  if (dns.size() < most) dns.push_back(dn);
}

void DnList::add(DnList&& later, size_t most) {
  count += later.count;
  for (size_t i = 0; i < later.dns.size() && dns.size() < most; ++i) dns.push_back(std::move(later.dns[i]));
}

void Subtree::add(const Subtree& other) noexcept {
  entries += other.entries;
  values += other.values;
  addNumbers(strengths, other.strengths);
}

void Facts::add(Facts&& later, size_t most) {
  entries += later.entries;
  accounts += later.accounts;
  values += later.values;
  urls += later.urls;
  deleted += later.deleted;
  authPasswords += later.authPasswords;
  addNumbers(schemes, later.schemes);
  addNumbers(strengths, later.strengths);
  for (const auto& [name, counts] : later.subtrees) {
    const bool room = subtrees.size() < kMostSubtrees || subtrees.count(name) > 0;
    subtrees[room ? name : kOtherSubtrees].add(counts);
  }
  for (size_t i = 0; i < kFindingCount; ++i) findings[i].add(std::move(later.findings[i]), most);
}

}  // namespace tool
