// SPDX-License-Identifier: Apache-2.0
// Marks: digests under a key of this run that stand for passwords, so that equal ones are found and none is kept; and
// what is told by them, the passwords of a list and those that several entries have.
#pragma once

#include <cstdint>
#include <deque>
#include <functional>
#include <map>
#include <memory>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "audit/mark.h"
#include "base/sha256.h"

namespace tool {

// Drawn at random, wiped at the end. Used by many threads at once.
class MarkKey {
 public:
  MarkKey();  // throws Failure with kInternal
  MarkKey(const MarkKey&) = delete;
  MarkKey& operator=(const MarkKey&) = delete;
  ~MarkKey();

  Mark of(Sha256& sha256, MarkKind kind, std::string_view bytes) const;

 private:
  struct {
    char inner[64];
    char outer[64];
  } key_;
};

// DNs in little memory: the part behind the first RDN is kept once for all entries of a subtree.
class DnStore {
 public:
  using Place = std::uint64_t;

  Place add(std::string_view dn);
  std::string at(Place place) const;
  // An order of DNs, equal ones beside each other: it compares the bytes themselves.
  bool before(Place a, Place b) const noexcept { return keyAt(a) < keyAt(b); }
  bool same(Place a, Place b) const noexcept { return keyAt(a) == keyAt(b); }

 private:
  static constexpr size_t kBlockBytes = size_t{1} << 20;
  static constexpr size_t kMostParents = size_t{1} << 16;

  std::uint32_t parentOf(std::string_view& dn);
  // The number of the parent, and the rest. A DN is always cut at the same place.
  std::pair<std::uint32_t, std::string_view> keyAt(Place place) const noexcept;

  std::vector<std::unique_ptr<char[]>> blocks_;
  size_t used_ = kBlockBytes;                                  // of the last one
  std::map<std::string, std::uint32_t, std::less<>> numbers_;  // sorted: an export fills it
  std::vector<std::string> parents_{""};
};

// Entries with one password.
struct ReuseGroup {
  std::uint64_t entries = 0;
  std::vector<std::string> dns;  // the first few
};

struct Facts;

class Reuse {
 public:
  // Takes the sightings of a batch; batches come in the order of the input.
  void add(const Facts& batch);
  // The groups, the largest first; as many as most are kept, with as many DNs each. Notes their entries as a finding.
  std::vector<ReuseGroup> finish(Facts& sum, size_t most, std::uint64_t& groupCount);

 private:
  // Equal marks, from first to before last, of so many entries, the first of which is at begin.
  struct Run {
    size_t first;
    size_t last;
    std::uint64_t entries;
    DnStore::Place begin;
  };
  std::vector<DnStore::Place> membersOf(const Run& run) const;
  std::vector<Run> runs(std::vector<DnStore::Place>& shared);

  std::deque<std::pair<Mark, DnStore::Place>> sightings_;
  DnStore dns_;
};

// The longest DN that is kept whole.
constexpr size_t kMostDnBytes = 512;

// The first comma that separates RDNs, or npos.
size_t endOfRdn(std::string_view dn) noexcept;

}  // namespace tool
