// SPDX-License-Identifier: Apache-2.0
// What all schemes have in common when values are made, checked and opened; the rest is in their rows.
#include "schemes/values.h"

#include "password_schemes.h"
#include "schemes/schemes.h"

namespace tool {
namespace {

// Beyond this a password is a mistake, and stored values stay within the library's int lengths.
constexpr size_t kMaxPasswordBytes = size_t{1} << 28;
constexpr size_t kMaxValueBytes = kMaxPasswordBytes * 2;

constexpr Status kNulByte{kBadValue, "the password holds a NUL byte"};
constexpr Status kNoKey{kBadKey, "an AES value needs the key stash (--keys)"};
constexpr Status kElsewhere{kBadValue, "the password is checked by another service and cannot be computed here"};

Status problemOf(const Examined& value, const KeyRecord& key) {
  const Scheme& scheme = value.scheme();
  if (value.value.whole().size() > kMaxValueBytes) return {kBadValue, "the value is too long"};
  if (value.problem != nullptr) return {kBadValue, value.problem};
  if (scheme.check == nullptr && scheme.strength == Strength::kExternal) return kElsewhere;
  if (scheme.check == nullptr) return {kBadValue, "a value of this scheme can only be recognised"};
  if (scheme.needsKey() && !key) return kNoKey;
  return {};
}

}  // namespace

Status passwordProblem(const Scheme& scheme, std::string_view password) {
  if (scheme.make == nullptr) return {kBadValue, "values of this scheme cannot be made"};
  if (password.find('\0') != std::string_view::npos) return kNulByte;
  if (password.size() > kMaxPasswordBytes) return {kBadValue, "the password is longer than 256 MiB"};
  if (scheme.isClear() && !StoredValue(Secret(password)).scheme().isClear()) {
    return {kBadValue, "as clear text the password would be taken for a value of another scheme"};
  }
  const char* problem = scheme.passwordProblem != nullptr ? scheme.passwordProblem(password) : nullptr;
  return problem != nullptr ? Status{kBadValue, problem} : Status{};
}

Status makeValue(const Scheme& scheme, const KeyRecord& key, const Costs& costs, const Secret& password, Secret& out) {
  const Status problem = passwordProblem(scheme, password.view());
  if (!problem.ok()) return problem;
  if (scheme.needsKey() && !key) return kNoKey;
  return scheme.make(scheme, key, costs, password, out);
}

bool isCostly(const Scheme& scheme) noexcept {
  return scheme.costs != nullptr && scheme.costs->most.rounds > 0;
}

Costs completeCosts(const Scheme& scheme, const Costs& chosen) {
  constexpr CostRules kNone{};
  const CostRules& rules = scheme.costs != nullptr ? *scheme.costs : kNone;
  Costs costs = rules.usual;
  for (const CostName& cost : kCostNames) {
    const std::uint32_t number = chosen.*cost.member;
    const std::uint32_t least = rules.least.*cost.member;
    const std::uint32_t most = rules.most.*cost.member;
    if (number == 0) continue;
    if (most == 0) throw Failure(kUsage, std::string(scheme.name) + " has no " + cost.option);
    if (number < least || number > most) {
      throw Failure(kUsage, std::string(cost.option) + " of " + scheme.name + " is " + std::to_string(least) + " to " +
                                std::to_string(most));
    }
    costs.*cost.member = number;
  }
  return costs;
}

Status openValue(const Examined& value, const KeyRecord& key, Secret& out) {
  const Status problem = problemOf(value, key);
  if (!problem.ok()) return problem;
  out.clear();
  if (value.scheme().open != nullptr) return value.scheme().open(value.value, key, out);
  return {kBadValue, "the scheme is one-way: the password cannot be recovered from the value"};
}

Status checkValue(const Examined& value, const KeyRecord& key, const Secret& password) {
  const Status problem = problemOf(value, key);
  if (!problem.ok()) return problem;
  if (password.view().find('\0') != std::string_view::npos) return kNulByte;
  return value.scheme().check(value.value, key, password);
}

bool serverAccepts(const Secret& value, const KeyRecord& key, const Secret& password) noexcept {
  return verify_password(password.c_str(), static_cast<int>(password.size()), value.c_str(),
                         static_cast<int>(value.size()), 1, key.get()) == LDAPPW_SUCCESS;
}

}  // namespace tool
