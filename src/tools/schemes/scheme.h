// SPDX-License-Identifier: Apache-2.0
// The table of schemes. A new scheme is a row in table.cpp and the functions that its columns name; nothing else asks
// which scheme it has before it.
#pragma once

#include <cstdint>
#include <initializer_list>
#include <string_view>

#include "base/failure.h"
#include "base/secret.h"
#include "password_schemes.h"

namespace tool {

class KeyRecord;
class StoredValue;

enum class Kind { kClear, kOneWay, kReversible, kUnknown };

// What a value is worth against somebody who reads it, the worst first. kExternal: the password is elsewhere; kLocked:
// nothing matches.
enum class Strength { kClear, kReversible, kUnsalted, kDesCrypt, kSaltedFast, kStrong, kExternal, kLocked, kUnknown };
constexpr const char* kStrengthNames[] = {"clear",  "reversible", "unsalted", "des-crypt", "salted-fast",
                                          "strong", "external",   "locked",   "unknown"};
static_assert(sizeof kStrengthNames / sizeof kStrengthNames[0] == static_cast<size_t>(Strength::kUnknown) + 1);
constexpr const char* nameOf(Strength strength) {
  return kStrengthNames[static_cast<int>(strength)];
}

// What a payload has to be: check says what is wrong with one, or null. For base64, the number of bytes that it stands
// for: from least to most, in whole steps, else text is the problem.
struct PayloadRule {
  const char* (*check)(const PayloadRule& rule, std::string_view payload) = nullptr;  // null: any is accepted
  long least = 0;
  long most = 0;
  long step = 0;
  const char* text = nullptr;
};

// What a value is to cost whoever checks it, where its scheme leaves that open; 0 for the scheme's own choice.
struct Costs {
  std::uint32_t rounds = 0;
  std::uint32_t memoryKib = 0;
  std::uint32_t parallelism = 0;
  std::uint32_t saltBytes = 0;
};
struct CostName {
  std::uint32_t Costs::*member;
  const char* option;
  const char* help;
};
constexpr CostName kCostNames[] = {
    {&Costs::rounds, "--rounds", "iterations of PBKDF2, rounds of crypt, passes of Argon2"},
    {&Costs::memoryKib, "--memory", "memory of Argon2 in KiB"},
    {&Costs::parallelism, "--parallelism", "lanes of Argon2"},
    {&Costs::saltBytes, "--salt-bytes", "bytes of salt"},
};
struct CostRules {
  Costs least;
  Costs usual;
  Costs most;  // 0: the scheme has no such cost
};

struct Scheme {
  const char* name = "";   // "ssha"; "clear" for clear text
  std::string_view tag{};  // "{SSHA}", in any case; empty for clear text. Other programs' rows: all tags, one by one
  int code = FORMAT_NONE;  // of enum PasswordFormat; FORMAT_NONE for what the server's check does not know
  Kind kind = Kind::kOneWay;
  size_t cutBytes = 0;       // a password is cut to this many bytes when a value is made; 0: taken whole
  size_t comparedBytes = 0;  // and this many count when it is checked; 0: all
  int keyIndex = -1;         // 0 to 2 for the AES schemes
  bool needsProvider = false;
  PayloadRule payload{};
  const char* foreignMarks = "";  // a payload that begins with one of these is of another algorithm under the same tag

  // Null: every password is accepted; values cannot be made, checked or opened. The functions are called when the
  // password, the payload and the key have been found to be in order.
  const char* (*passwordProblem)(std::string_view password) = nullptr;
  Status (*make)(const Scheme& scheme, const KeyRecord& key, const Costs& costs, const Secret& password,
                 Secret& out) = nullptr;
  Status (*check)(const StoredValue& value, const KeyRecord& key, const Secret& password) = nullptr;
  Status (*open)(const StoredValue& value, const KeyRecord& key, Secret& out) = nullptr;

  Strength strength = Strength::kUnknown;
  const char* writers = "";  // programs that write such values
  const CostRules* costs = nullptr;
  const char* algorithm = "";  // for the functions of the row
  std::string_view prefix{};   // of the payload, where several algorithms share a tag

  // Of the library; the others are of other servers.
  bool own() const noexcept { return code != FORMAT_NONE || isClear(); }
  bool needsKey() const noexcept { return keyIndex >= 0; }
  bool reversible() const noexcept { return kind == Kind::kReversible; }
  bool isClear() const noexcept { return kind == Kind::kClear; }
  bool cuts(size_t bytes) const noexcept { return cutBytes != 0 && bytes > cutBytes; }
};

// The schemes of the library, clear text first, then those of other servers.
extern const std::initializer_list<Scheme> kSchemes;

}  // namespace tool
