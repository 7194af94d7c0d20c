// SPDX-License-Identifier: Apache-2.0
// LDIF change records that put new values in the place of old ones, a record a value, so that one that has changed in
// the directory meanwhile makes its own change fail and no other; and reading them back.
#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "ldif/record.h"

namespace tool {

// The changes of one entry after the other.
class ChangeWriter {
 public:
  // old becomes made. Records of the entry before are written to out.
  void replace(const RecordWalker& walker, const Secret& old, const Secret& made, Secret& out);
  // old comes to made, which the entry has already: old goes. Not isNew: old is made itself, which need not be added.
  void drop(const RecordWalker& walker, const Secret& old, const Secret& made, bool isNew, Secret& out);
  void flush(Secret& out);

 private:
  struct Change {
    std::string description;
    std::vector<Secret> olds;
    Secret made;
    bool adds;
  };
  void startEntry(const RecordWalker& walker, Secret& out);
  Change* find(const RecordWalker& walker, const Secret& made) noexcept;

  std::uint64_t entry_ = 0;
  std::string dn_;
  std::vector<Change> changes_;
};

// New values by what they are for, of change records that an earlier run has written.
class EarlierChanges {
 public:
  // Records of which the end is missing do not count. Throws Failure.
  void load(const std::string& path, const AttributeSet& attributes);
  bool empty() const noexcept { return values_.empty(); }
  // The new value for old in the entry and attribute of the walker, or null.
  const Secret* find(const RecordWalker& walker, const Secret& old) const;

 private:
  struct SameBytes {
    size_t operator()(const Secret& key) const noexcept { return std::hash<std::string_view>{}(key.view()); }
    bool operator()(const Secret& a, const Secret& b) const noexcept { return a.view() == b.view(); }
  };
  std::unordered_map<Secret, Secret, SameBytes, SameBytes> values_;  // the old values are secrets too
};

}  // namespace tool
