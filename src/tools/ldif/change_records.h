// SPDX-License-Identifier: Apache-2.0
// LDIF change records that put new values in the place of old ones, a record a value, so that one that has changed in
// the directory meanwhile makes its own change fail and no other; and reading them back.
#pragma once

#include <cstddef>
#include <cstdint>
#include <map>
#include <string>
#include <vector>

#include "ldif/export_run.h"
#include "ldif/record.h"

namespace tool {

// The changes of one entry after the other.
class ChangeWriter {
 public:
  // Replaces old by made. Writes the records of the entry before to part.
  void replace(const RecordWalker& walker, const Secret& old, const Secret& made, ExportPart& part);
  // Deletes old, because the entry already holds made. Not isNew: old is made itself, and nothing is added.
  void drop(const RecordWalker& walker, const Secret& old, const Secret& made, bool isNew, ExportPart& part);
  void flush(ExportPart& part);

 private:
  struct Change {
    std::string description;
    std::vector<Secret> olds;
    Secret made;
    bool adds;
  };
  void startEntry(const RecordWalker& walker, ExportPart& part);
  Change& add(const RecordWalker& walker, const Secret& made, bool adds);
  Change* find(const RecordWalker& walker, const Secret& made);

  std::uint64_t entry_ = 0;
  std::string dn_;
  std::vector<Change> changes_;
  std::map<Secret, size_t, ByBytes> places_;  // of the first change to a value of an attribute
};

// New values by what they are for, of change records that an earlier run has written.
class EarlierChanges {
 public:
  // Records of which the end is missing do not count. Throws Failure.
  void load(const std::string& path, const AttributeSet& attributes);
  // The new values of an entry, by attribute and old value; null when there are none.
  using Values = std::map<Secret, Secret, ByBytes>;
  const Values* of(const std::string& dn) const;

 private:
  std::map<std::string, Values> entries_;
};

}  // namespace tool
