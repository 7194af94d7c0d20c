// SPDX-License-Identifier: Apache-2.0
// Finding password values in LDIF records: the attributes that hold them, the entry and the change that a line belongs
// to, the value that a line stands for, and writing a changed value in the line's place.
#ifndef LDAPPW_TOOLS_LDIF_RECORD_H
#define LDAPPW_TOOLS_LDIF_RECORD_H

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "ldif_lines.h"
#include "secret.h"

namespace tool {

// The attributes whose values are passwords. A description matches by its type: "userPassword;x-tag" is userPassword.
class AttributeSet {
 public:
  // No names mean userPassword, which is also known as 2.5.4.35.
  // others are covered as well.
  explicit AttributeSet(std::vector<std::string> names, const std::vector<std::string>& others = {});
  bool matches(std::string_view description) const noexcept;

 private:
  std::vector<std::string> names_;
};

enum class ValueForm {
  kBytes,    // the value is there
  kUrl,      // "attribute:< url": the value is elsewhere
  kDeleted,  // in a delete block of a change record, where it names what is stored and must stay what it is
  kBroken    // not what RFC 2849 allows; problem says why
};

// One line of a wanted attribute.
struct PasswordLine {
  ValueForm form = ValueForm::kBroken;
  const char* problem = "";
  std::string description;  // the attribute and its options as spelt
  Secret value;             // of kBytes
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
  const LogicalLine& line() const noexcept { return line_; }
  std::uint64_t lineNumber() const noexcept { return lineNumber_; }
  const std::string& dn() const noexcept { return dn_; }  // decoded; empty when the record has none
  std::uint64_t entries() const noexcept { return entries_; }
  bool modifies() const noexcept { return modify_; }  // the record changes an entry and does not describe it

 private:
  void startRecord() noexcept;
  bool matters(std::string_view description) const noexcept;
  void readControl(std::string_view name, std::string_view text);
  void readName(std::string_view text);
  void readPassword(std::string_view description);
  ValueForm readValue(std::string_view text);

  std::string_view rest_;
  const AttributeSet& attributes_;
  std::uint64_t nextLineNumber_;
  std::uint64_t lineNumber_ = 0;
  std::uint64_t entries_ = 0;
  LogicalLine line_;
  Secret text_;
  std::string dn_;
  PasswordLine password_;
  bool atPassword_ = false;
  bool modify_ = false;    // a record with "changetype: modify"
  bool inBlock_ = false;   // between "add: ..." and "-"
  bool deleting_ = false;  // the block is a "delete: ..." one
};

// Appends the line that stands for value in place of line: with the attribute as spelt, as text or base64 as the value
// needs, folded only when line was, with the line ends of line.
void writeChanged(const LogicalLine& line, const std::string& description, const Secret& value, Secret& out);

}  // namespace tool

#endif
