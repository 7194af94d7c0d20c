// SPDX-License-Identifier: Apache-2.0
// Finding password values in LDIF records: the attributes that hold them, the entry and the change that a line belongs
// to, the value that a line stands for, and writing a changed value in the line's place.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "base/secret.h"
#include "ldif/lines.h"

namespace tool {

// The attributes whose values are passwords. A name covers what has its type and at least its options: "userPassword"
// covers "userPassword;x-tag".
class AttributeSet {
 public:
  static constexpr size_t kMost = 64;  // names
  static constexpr size_t kNone = kMost;

  // No names mean those that servers keep passwords in; others are covered as well. Throws Failure (kUsage) for a text
  // that is no attribute description (RFC 4512, section 2.5), and for too many.
  explicit AttributeSet(const std::vector<std::string>& names, const std::vector<std::string>& others = {});
  // The place of the name that covers the description, or kNone.
  size_t find(std::string_view description) const noexcept;
  const std::string& name(size_t place) const { return names_[place]; }
  // Number of names the caller gave; 0 for the defaults.
  size_t given() const noexcept { return given_; }

 private:
  std::vector<std::string> names_;
  std::vector<std::string> types_;  // the names without options, as each line of an export is compared with all
  size_t given_;
};

// A longer DN is refused, like a record that is too large: it is repeated wherever its entry is named.
constexpr size_t kLongestDn = size_t{64} << 10;

// A DN as messages name it: cut where it is long.
std::string shownDn(const std::string& dn);

// The order of secrets in a sorted table. An export fills such tables, and whoever writes it can choose keys that an
// unkeyed hash puts into one place.
struct ByBytes {
  bool operator()(const Secret& a, const Secret& b) const noexcept { return a.view() < b.view(); }
};
// The key of a value under an attribute, whose case does not count.
Secret keyOf(std::string_view description, std::string_view value);

enum class ValueForm {
  kBytes,         // the value is there
  kUrl,           // "attribute:< url": the value is elsewhere
  kDeleted,       // in a delete block of a change record, where it names what is stored and must stay what it is
  kAuthPassword,  // a value of authPassword, "scheme$info$value" (RFC 3112): one-way, under schemes of its own
  kBroken         // not what RFC 2849 or the attribute allows; problem says why
};

// One line of a wanted attribute.
struct PasswordLine {
  ValueForm form = ValueForm::kBroken;
  const char* problem = "";
  std::string description;  // the attribute and its options as spelt
  std::string history;      // of a pwdHistory value: its first two fields, "time#syntax#"
  Secret value;             // of kBytes, where of a pwdHistory value it is the last field; of kDeleted

  // What stands in the entry when value becomes this one.
  Secret whole(const Secret& changed) const;
};

// Walks over a batch. Views stay valid until the next step.
class RecordWalker {
 public:
  RecordWalker(const Batch& batch, const AttributeSet& attributes) noexcept
      : rest_(batch.text.view()), attributes_(attributes), nextLineNumber_(batch.firstLine) {}

  // False at the end of the batch.
  bool next();

  bool atPassword() const noexcept { return atPassword_; }
  const PasswordLine& password() const noexcept { return password_; }
  bool inChange() const noexcept { return place_ >= Place::kChange; }  // the record is not an entry but a change of one
  const LogicalLine& line() const noexcept { return line_; }
  std::uint64_t lineNumber() const noexcept { return lineNumber_; }
  const std::string& dn() const noexcept { return dn_; }  // decoded; empty when the record has none
  std::uint64_t entries() const noexcept { return entries_; }
  bool modifies() const noexcept { return place_ >= Place::kModify; }  // it changes parts of an entry
  // Counts the entries, and the blocks of change records: equal values within one are refused by servers.
  std::uint64_t group() const noexcept { return group_; }
  // The first of each run of lines that belong to no entry; none of them is looked at for passwords.
  const std::vector<std::uint64_t>& outside() const noexcept { return outside_; }
  // A bit for each name of the attributes that has occurred.
  std::uint64_t seen() const noexcept { return seen_; }

 private:
  // Where in a record the next line stands. The order counts: all from kEntry on are in an entry, all from kChange on
  // in a change record, and all from kModify on in one that modifies.
  enum class Place {
    kOutside,   // before the dn
    kStrayed,   // the same, and the record has begun with another line, which has been noted
    kEntry,     // behind the dn
    kChange,    // behind a changetype
    kModify,    // behind "changetype: modify", between blocks
    kBlock,     // between "add: ..." or "replace: ..." and "-"
    kDeleting,  // between "delete: ..." and "-"
  };

  void startRecord() noexcept;
  void readLine(std::string_view text);
  bool beginsEntry(std::string_view name);
  void endBlock() noexcept;
  bool matters(std::string_view description) const noexcept;
  void readControl(std::string_view name, std::string_view text);
  void readName(std::string_view text);
  void readPassword(std::string_view description);
  ValueForm readValue(std::string_view text);
  ValueForm readFields(std::string_view type);

  void requireShortDn() const;

  std::string_view rest_;
  const AttributeSet& attributes_;
  std::uint64_t nextLineNumber_;
  std::uint64_t lineNumber_ = 0;
  std::uint64_t entries_ = 0;
  std::uint64_t group_ = 0;
  std::uint64_t seen_ = 0;
  std::vector<std::uint64_t> outside_;
  LogicalLine line_;
  Secret text_;
  std::string dn_;
  PasswordLine password_;
  bool atPassword_ = false;
  Place place_ = Place::kOutside;
};

// Appends a line of an attribute, unfolded, as text or base64 as the value needs.
void appendAttribute(const std::string& description, const Secret& value, Secret& out);

// Appends the line that stands for value in place of line: with the attribute as spelt, as text or base64 as the value
// needs, folded only when line was, with the line ends of line.
void writeChanged(const LogicalLine& line, const std::string& description, const Secret& value, Secret& out);

}  // namespace tool
