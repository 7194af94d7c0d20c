// SPDX-License-Identifier: Apache-2.0
// The table of schemes, and stored values taken apart by it. A new scheme is a row in schemes.cpp and the functions
// that its columns name; nothing else asks which scheme it has before it.
#ifndef LDAPPW_TOOLS_SCHEME_H
#define LDAPPW_TOOLS_SCHEME_H

#include <cstdint>
#include <initializer_list>
#include <string_view>

#include "failure.h"
#include "secret.h"

namespace tool {

class KeyRecord;
class StoredValue;

enum class Kind { kClear, kOneWay, kReversible, kUnknown };

// What a value is worth against somebody who reads it, the worst first. kExternal: the password is elsewhere; kLocked:
// nothing matches.
enum class Strength { kClear, kReversible, kUnsalted, kDesCrypt, kSaltedFast, kStrong, kExternal, kLocked, kUnknown };
constexpr const char* kStrengthNames[] = {"clear",  "reversible", "unsalted", "des-crypt", "salted-fast",
                                          "strong", "external",   "locked",   "unknown"};
constexpr const char* nameOf(Strength strength) {
  return kStrengthNames[static_cast<int>(strength)];
}

// What a payload has to be: check says what is wrong with one, or null. For base64, the number of bytes that it stands
// for: from least to most, in whole steps, else text is the problem.
struct PayloadRule {
  const char* (*check)(const PayloadRule& rule, std::string_view payload);  // null: any payload is accepted
  long least;
  long most;
  long step;
  const char* text;
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
  const char* name;      // "ssha"; "clear" for clear text
  std::string_view tag;  // "{SSHA}", in any case; empty for clear text. Other programs' rows: all tags, one by one
  int code;              // of enum PasswordFormat; FORMAT_NONE for what the server's check does not know
  Kind kind;
  std::size_t cutBytes;       // a password is cut to this many bytes when a value is made; 0: taken whole
  std::size_t comparedBytes;  // and this many count when it is checked; 0: all
  int keyIndex;               // 0 to 2 for the AES schemes, else -1
  bool needsProvider;
  PayloadRule payload;
  const char* foreignMarks;  // a payload that begins with one of these is of another algorithm under the same tag

  // Null: every password is accepted; values cannot be made, checked or opened. The functions are called when the
  // password, the payload and the key have been found to be in order.
  const char* (*passwordProblem)(std::string_view password);
  Status (*make)(const Scheme& scheme, const KeyRecord& key, const Costs& costs, const Secret& password, Secret& out);
  Status (*check)(const StoredValue& value, const KeyRecord& key, const Secret& password);
  Status (*open)(const StoredValue& value, const KeyRecord& key, Secret& out);

  Strength strength;
  const char* writers;  // programs that write such values
  const CostRules* costs = nullptr;
  const char* algorithm = "";  // for the functions of the row
  std::string_view prefix{};   // of the payload, where several algorithms share a tag

  bool needsKey() const noexcept { return keyIndex >= 0; }
  bool reversible() const noexcept { return kind == Kind::kReversible; }
  bool isClear() const noexcept { return kind == Kind::kClear; }
  bool cuts(std::size_t bytes) const noexcept { return cutBytes != 0 && bytes > cutBytes; }
};

// The schemes of the library, clear text first.
extern const std::initializer_list<Scheme> kSchemes;

// By name, in any case, with or without braces ("ssha", "{SSHA}", "clear"); null when there is none.
const Scheme* findScheme(std::string_view name) noexcept;

// A stored value taken apart. It refers to the bytes that it was made of.
class StoredValue {
 public:
  explicit StoredValue(const Secret& value) noexcept;

  const Secret& whole() const noexcept { return *whole_; }
  // By the tag, qveil for an untagged value wrapped in ">" and "<"; a row of foreign_schemes.h where the value is none of
  // the library's; a scheme of its own, outside the tables and of the kind kUnknown, for a tag of no known scheme;
  // otherwise clear text.
  const Scheme& scheme() const noexcept { return *scheme_; }
  // As it is spelt in the value.
  std::string_view tag() const noexcept { return whole_->view().substr(0, tagBytes_); }
  std::string_view payload() const noexcept { return whole_->view().substr(tagBytes_); }
  // What is wrong with the payload, or null when it is well formed, as clear text always is.
  const char* problem() const;
  // True for a payload that the scheme's foreignMarks mark.
  bool foreign() const noexcept;

 private:
  const Secret* whole_;
  const Scheme* scheme_;
  std::size_t tagBytes_ = 0;
};

}  // namespace tool

#endif
