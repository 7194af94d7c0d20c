// SPDX-License-Identifier: Apache-2.0
// Password lines in LDIF records. Values are parsed and written by the LDAP client library; what it is lenient about is
// checked first, because a value that two readers take differently must not be replaced.
#include "ldif_record.h"

#include <ldap.h>

#include <cstdio>  // ldif.h uses FILE without including it

#include <ldif.h>

#include "common.h"

namespace tool {
namespace {

constexpr std::size_t kNone = std::string_view::npos;

char lower(char c) noexcept {
  return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c;
}

std::string_view trimSpaces(std::string_view text) noexcept {
  while (!text.empty() && text.front() == ' ') text.remove_prefix(1);
  while (!text.empty() && text.back() == ' ') text.remove_suffix(1);
  return text;
}

// Why the text behind "attribute:" is not to be taken for a value, or null.
const char* valueProblem(std::string_view text) noexcept {
  if (text.find('\0') != kNone || text.find('\r') != kNone) return "the line holds a byte that LDIF does not allow";
  if (!text.empty() && text.front() == ':') {
    return base64Bytes(trimSpaces(text.substr(1))) < 0 ? "the base64 of the line is damaged" : nullptr;
  }
  const std::size_t start = text.find_first_not_of(' ');
  if (start == kNone || (text[start] != '\t' && text[start] != '\v' && text[start] != '\f')) return nullptr;
  return "the value begins with a blank that LDIF readers do not agree about";
}

// Parses an unfolded line with a well-formed value. The line is used up.
bool parseValue(Secret& text, Secret& value) {
  value.clear();
  const std::string_view spec = text.view().substr(text.view().find(':') + 1);
  if (!spec.empty() && spec.front() == ':' && trimSpaces(spec) == ":")
    return true;  // the library refuses base64 of nothing
  berval type{};
  berval parsed{};
  int mustFree = 0;
  if (ldif_parse_line2(text.data(), &type, &parsed, &mustFree) != 0) return false;
  if (parsed.bv_val != nullptr) value.append(std::string_view(parsed.bv_val, parsed.bv_len));
  if (mustFree != 0) ber_memfree(parsed.bv_val);
  return true;
}

}  // namespace

bool equalNames(std::string_view a, std::string_view b) noexcept {
  if (a.size() != b.size()) return false;
  for (std::size_t i = 0; i < a.size(); ++i) {
    if (lower(a[i]) != lower(b[i])) return false;
  }
  return true;
}

AttributeSet::AttributeSet(std::vector<std::string> names) : names_(std::move(names)) {
  if (names_.empty()) names_ = {"userPassword", "2.5.4.35"};
}

bool AttributeSet::matches(std::string_view description) const noexcept {
  const std::string_view type = trimSpaces(description.substr(0, description.find(';')));
  for (const std::string& name : names_) {
    if (equalNames(type, name)) return true;
  }
  return false;
}

void RecordWalker::startRecord() noexcept {
  dn_.clear();
  modify_ = inBlock_ = deleting_ = false;
}

// Most lines are told to be none of ours without undoing their folding.
bool RecordWalker::matters(std::string_view description) const noexcept {
  const std::string_view name = trimSpaces(description);
  return modify_ || attributes_.matches(name) || equalNames(name, "dn") || equalNames(name, "changetype");
}

void RecordWalker::readName(std::string_view text) {
  ++entries_;
  dn_.assign(trimSpaces(text));
  if (text.empty() || text.front() != ':') return;
  unfold(line_, text_);
  Secret decoded;
  if (valueProblem(text) == nullptr && parseValue(text_, decoded)) dn_.assign(decoded.view());
}

// Follows the lines that say which record and which change the others belong to.
void RecordWalker::readControl(std::string_view name, std::string_view text) {
  if (equalNames(name, "dn")) return readName(text);
  if (equalNames(name, "changetype")) {
    modify_ = equalNames(trimSpaces(text), "modify");
    return;
  }
  if (!modify_ || inBlock_) return;
  inBlock_ = true;
  deleting_ = equalNames(name, "delete");
}

void RecordWalker::readPassword(std::string_view description) {
  unfold(line_, text_);
  password_.description.assign(description);
  const std::string_view text = text_.view().substr(description.size() + 1);
  atPassword_ = true;
  password_.problem = "";
  password_.form = ValueForm::kUrl;
  if (!text.empty() && text.front() == '<') return;
  password_.form = ValueForm::kDeleted;
  if (inBlock_ && deleting_) return;
  password_.problem = valueProblem(text);
  const bool parsed = password_.problem == nullptr && parseValue(text_, password_.value);
  if (password_.problem == nullptr) password_.problem = parsed ? "" : "the line cannot be parsed";
  password_.form = parsed ? ValueForm::kBytes : ValueForm::kBroken;
}

bool RecordWalker::next() {
  atPassword_ = false;
  if (!cursor_.next(line_)) return false;
  lineNumber_ = nextLineNumber_;
  nextLineNumber_ += line_.physicalLines;
  if (line_.blank()) startRecord();
  if (line_.blank() || line_.first.front() == '#' || line_.first.front() == ' ') return true;
  std::string_view text = line_.first;
  std::size_t colon = text.find(':');
  if (colon != kNone && !matters(text.substr(0, colon))) return true;
  Secret whole;
  if (line_.folded()) {  // a fold can stand anywhere, within the name of an attribute too
    unfold(line_, whole);
    text = whole.view();
    colon = text.find(':');
  }
  if (colon == kNone) {
    if (text == "-") inBlock_ = false;
  } else if (attributes_.matches(text.substr(0, colon))) {
    readPassword(text.substr(0, colon));
  } else {
    readControl(trimSpaces(text.substr(0, colon)), text.substr(colon + 1));
  }
  return true;
}

void writeChanged(const LogicalLine& line, const std::string& description, const Secret& value, Secret& out) {
  const bool asText = value.empty() || ldif_is_not_printable(value.c_str(), value.size()) == 0;
  Secret text;
  text.resize(LDIF_SIZE_NEEDED_WRAP(description.size(), value.size(), LDIF_LINE_WIDTH_MAX) + 1);
  char* end = text.data();
  // Folding is done below: the library would end every line in a bare newline.
  ldif_sput_wrap(&end, asText ? LDIF_PUT_TEXT : LDIF_PUT_BINARY, description.c_str(), value.c_str(), value.size(),
                 LDIF_LINE_WIDTH_MAX);
  text.resize(static_cast<std::size_t>(end - text.data()));
  std::string_view written = text.view();
  if (!written.empty() && written.back() == '\n') written.remove_suffix(1);
  if (line.folded()) {
    foldInto(written, line.firstEnd, out);
  } else {
    out.append(written);
  }
  out.append(line.lastEnd);
}

}  // namespace tool
