// SPDX-License-Identifier: Apache-2.0
// Password lines in LDIF records. Values are parsed and written by the LDAP client library; what it is lenient about is
// checked first, because a value that two readers take differently must not be replaced.
#include "ldif_record.h"

#include "ldif_library.h"
#include "text.h"

namespace tool {
namespace {

constexpr std::size_t kNone = std::string_view::npos;

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
  if (!spec.empty() && spec.front() == ':' && trimSpaces(spec) == ":") return true;  // refused by the library
  berval type{};
  berval parsed{};
  int mustFree = 0;
  if (ldifLibrary().parseLine(text.data(), &type, &parsed, &mustFree) != 0) return false;
  if (parsed.bv_val != nullptr) value.append(std::string_view(parsed.bv_val, parsed.bv_len));
  if (mustFree != 0) ldifLibrary().release(parsed.bv_val);
  return true;
}

}  // namespace

AttributeSet::AttributeSet(std::vector<std::string> names, const std::vector<std::string>& others)
    : names_(std::move(names)) {
  if (names_.empty()) names_ = {"userPassword", "2.5.4.35"};
  names_.insert(names_.end(), others.begin(), others.end());
}

bool AttributeSet::matches(std::string_view description) const noexcept {
  const std::string_view type = trimSpaces(description.substr(0, description.find(';')));
  for (const std::string& name : names_) {
    if (sameName(type, name)) return true;
  }
  return false;
}

void RecordWalker::startRecord() noexcept {
  dn_.clear();
  modify_ = inBlock_ = deleting_ = false;
}

// Most lines are found to be none of ours without undoing their folding.
bool RecordWalker::matters(std::string_view description) const noexcept {
  const std::string_view name = trimSpaces(description);
  return modify_ || attributes_.matches(name) || sameName(name, "dn") || sameName(name, "changetype");
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
  if (sameName(name, "dn")) return readName(text);
  if (sameName(name, "changetype")) {
    modify_ = sameName(trimSpaces(text), "modify");
    return;
  }
  if (!modify_ || inBlock_) return;
  inBlock_ = true;
  deleting_ = sameName(name, "delete");
}

void RecordWalker::readPassword(std::string_view description) {
  atPassword_ = true;
  unfold(line_, text_);
  password_.description.assign(description);
  password_.problem = "";
  password_.form = readValue(text_.view().substr(description.size() + 1));
}

ValueForm RecordWalker::readValue(std::string_view text) {
  if (!text.empty() && text.front() == '<') return ValueForm::kUrl;
  if (inBlock_ && deleting_) return ValueForm::kDeleted;
  const char* problem = valueProblem(text);
  if (problem == nullptr && parseValue(text_, password_.value)) return ValueForm::kBytes;
  password_.problem = problem != nullptr ? problem : "the line cannot be parsed";
  return ValueForm::kBroken;
}

bool RecordWalker::next() {
  atPassword_ = false;
  if (!takeLogicalLine(rest_, line_)) return false;
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
  const LdifLibrary& library = ldifLibrary();
  const bool asText = value.empty() || library.isNotPrintable(value.c_str(), value.size()) == 0;
  Secret text;
  text.resize(LDIF_SIZE_NEEDED_WRAP(description.size(), value.size(), LDIF_LINE_WIDTH_MAX) + 1);
  char* end = text.data();
  // Folding is done below: the library would end every line in a bare newline.
  library.putLine(&end, asText ? LDIF_PUT_TEXT : LDIF_PUT_BINARY, description.c_str(), value.c_str(), value.size(),
                  LDIF_LINE_WIDTH_MAX);
  text.resize(static_cast<std::size_t>(end - text.data()));
  std::string_view written = text.view();
  if (!written.empty() && written.back() == '\n') written.remove_suffix(1);
  line.folded() ? foldInto(written, line.firstEnd, out) : out.append(written);
  out.append(line.lastEnd);
}

}  // namespace tool
