// SPDX-License-Identifier: Apache-2.0
// What an audit counts and lists: schemes, strengths, subtrees and findings. Passwords are not part of it.
#pragma once

#include <array>
#include <cstdint>
#include <map>
#include <string>
#include <vector>

#include "audit/mark.h"
#include "schemes/schemes.h"

namespace tool {

enum class Finding {
  kClear,
  kKnownBad,
  kName,
  kEmpty,
  kReused,
  kReversible,
  kUnsalted,
  kDesCrypt,
  kMalformed,
  kWrapped,
  kSaltedFast,
  kNoPassword,
  kUnopened,
  kUnknown,
  kBroken,
  kUnchecked,
  kNotAccepted
};
struct FindingText {
  const char* name;     // as --fail-on takes it
  const char* weight;   // "high", "middle" or "low"
  const char* text;     // what is wrong with the entries
  const char* advice;   // what to do next
  const char* command;  // what helps with that, or ""
};
extern const FindingText kFindings[];
constexpr size_t kFindingCount = static_cast<size_t>(Finding::kNotAccepted) + 1;
constexpr size_t kStrengthCount = sizeof kStrengthNames / sizeof kStrengthNames[0];

// The DNs of the entries that something is true of: all are counted, the first few are listed.
struct DnList {
  std::uint64_t count = 0;
  std::vector<std::string> dns;

  void note(const std::string& dn, size_t most);
  void add(DnList&& later, size_t most);
};

using Strengths = std::array<std::uint64_t, kStrengthCount>;  // values by strength

struct Subtree {
  std::uint64_t entries = 0;
  std::uint64_t values = 0;
  Strengths strengths{};

  void add(const Subtree& other) noexcept;
};

struct Facts {
  std::uint64_t entries = 0;
  std::uint64_t accounts = 0;  // entries that have a password or are expected to
  std::uint64_t values = 0;
  std::uint64_t urls = 0;
  std::uint64_t deleted = 0;
  std::uint64_t authPasswords = 0;
  std::vector<std::uint64_t> schemes =  // by indexOf; the last one counts tags of no known scheme
      std::vector<std::uint64_t>(kSchemes.size() + 1);
  Strengths strengths{};
  std::map<std::string, Subtree> subtrees;
  std::array<DnList, kFindingCount> findings;
  std::vector<std::string> holders;
  std::vector<Sighting> sightings;

  DnList& of(Finding finding) { return findings[static_cast<size_t>(finding)]; }
  const DnList& of(Finding finding) const { return findings[static_cast<size_t>(finding)]; }
  // Holders and sightings are not added.
  void add(Facts&& later, size_t most);
};

// Whole subtrees beyond so many are counted under this name.
constexpr size_t kMostSubtrees = 10000;
constexpr char kOtherSubtrees[] = "(others)";

}  // namespace tool
