// SPDX-License-Identifier: Apache-2.0
// Password lines in LDIF records. Values are parsed and written by the LDAP client library; what it is lenient about is
// checked first, because a value that two readers take differently must not be replaced.
#include "ldif/record.h"

#include <iterator>

#include "base/failure.h"
#include "base/text.h"
#include "ldif/library.h"

namespace tool {
namespace {

constexpr size_t kNone = std::string_view::npos;

// userPassword by name and number, the passwords that it had before, those of slapd's and 389's own administrators, and
// the attribute of RFC 3112.
constexpr const char* kDefaultNames[] = {"userPassword", "2.5.4.35",       "pwdHistory",
                                         "olcRootPW",    "nsslapd-rootpw", "authPassword"};

constexpr std::string_view kNameCharacters = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789-";
constexpr size_t kLetters = 52;
constexpr std::string_view kDigits = kNameCharacters.substr(kLetters, 10);

std::string_view typeOf(std::string_view description) noexcept {
  return trimSpaces(description.substr(0, description.find(';')));
}

// Cuts the part before the next separator off the text.
std::string_view takePart(std::string_view& text, char separator) noexcept {
  const size_t end = text.find(separator);
  const std::string_view part = text.substr(0, end);
  text.remove_prefix(end == kNone ? text.size() : end + 1);
  return part;
}

bool hasOptions(std::string_view description, std::string_view wanted) noexcept {
  takePart(wanted, ';');
  while (!wanted.empty()) {
    const std::string_view option = takePart(wanted, ';');
    std::string_view rest = description;
    takePart(rest, ';');
    bool found = false;
    while (!found && !rest.empty()) found = sameName(trimSpaces(takePart(rest, ';')), option);
    if (!found) return false;
  }
  return true;
}

bool isWord(std::string_view text, std::string_view characters) noexcept {
  return !text.empty() && text.find_first_not_of(characters) == kNone;
}

// RFC 4512, section 2.5: a name or a dotted number, and options.
bool isDescription(std::string_view text) noexcept {
  std::string_view type = text.substr(0, text.find(';'));
  const bool named = isWord(type, kNameCharacters) && isWord(type.substr(0, 1), kNameCharacters.substr(0, kLetters));
  if (!named && (type.empty() || type.back() == '.' || type.find('.') == kNone)) return false;
  while (!named && !type.empty()) {
    if (!isWord(takePart(type, '.'), kDigits)) return false;
  }
  if (text.back() == ';') return false;
  for (takePart(text, ';'); !text.empty();) {
    if (!isWord(takePart(text, ';'), kNameCharacters)) return false;
  }
  return true;
}

// Why the text behind "attribute:" is not to be taken for a value, or null.
const char* valueProblem(std::string_view text) noexcept {
  if (text.find('\0') != kNone || text.find('\r') != kNone) return "the line holds a byte that LDIF does not allow";
  if (!text.empty() && text.front() == ':') {
    return base64Bytes(trimSpaces(text.substr(1))) < 0 ? "the base64 of the line is damaged" : nullptr;
  }
  const size_t start = text.find_first_not_of(' ');
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

AttributeSet::AttributeSet(const std::vector<std::string>& names, const std::vector<std::string>& others)
    : names_(names.empty() ? std::vector<std::string>(std::begin(kDefaultNames), std::end(kDefaultNames)) : names),
      given_(names.size()) {
  for (const std::string& name : names_) {
    if (!isDescription(name)) throw Failure(kUsage, "'" + name + "' is no attribute description");
  }
  names_.insert(names_.end(), others.begin(), others.end());
  if (names_.size() > kMost) throw Failure(kUsage, "more than " + std::to_string(kMost) + " attributes are given");
  for (const std::string& name : names_) types_.emplace_back(typeOf(name));
}

size_t AttributeSet::find(std::string_view description) const noexcept {
  const std::string_view type = typeOf(description);
  for (size_t i = 0; i < types_.size(); ++i) {
    if (sameName(type, types_[i]) && hasOptions(description, names_[i])) return i;
  }
  return kNone;
}

std::string shownDn(const std::string& dn) {
  constexpr size_t kMostShown = 512;
  if (dn.empty()) return "(no dn)";
  return dn.size() <= kMostShown ? dn : dn.substr(0, kMostShown) + "...";
}

Secret keyOf(std::string_view description, std::string_view value) {
  Secret key;
  for (const char c : description) key.append(c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c);
  key.append('\0');
  key.append(value);
  return key;
}

Secret PasswordLine::whole(const Secret& changed) const {
  Secret text(history);
  if (!history.empty()) text.append(std::to_string(changed.size()) + "#");
  text.append(changed.view());
  return text;
}

void RecordWalker::startRecord() noexcept {
  dn_.clear();
  ++group_;
  place_ = Place::kOutside;
}

// Outside an entry its dn is awaited, and the lines that frame an export or the answer to a search are let through.
bool RecordWalker::beginsEntry(std::string_view name) {
  if (sameName(name, "dn")) {
    place_ = Place::kEntry;
    return true;
  }
  const bool frame = sameName(name, "version") || sameName(name, "search") || sameName(name, "result");
  if (!frame && place_ == Place::kOutside) {
    outside_.push_back(lineNumber_);
    place_ = Place::kStrayed;
  }
  return false;
}

// Most lines are found to be none of ours without undoing their folding.
bool RecordWalker::matters(std::string_view description) const noexcept {
  const std::string_view name = trimSpaces(description);
  return place_ < Place::kEntry || modifies() || attributes_.find(name) != AttributeSet::kNone ||
         sameName(name, "dn") || sameName(name, "changetype");
}

void RecordWalker::readName(std::string_view text) {
  ++entries_;
  dn_.assign(trimSpaces(text));
  if (text.empty() || text.front() != ':') return requireShortDn();
  unfold(line_, text_);
  Secret decoded;
  if (valueProblem(text) == nullptr && parseValue(text_, decoded)) dn_.assign(decoded.view());
  requireShortDn();
}

void RecordWalker::requireShortDn() const {
  if (dn_.size() <= kLongestDn) return;
  throw Failure(kBadValue, "the dn in line " + std::to_string(lineNumber_) + " is longer than 64 KiB");
}

// Follows the lines that say which record and which change the others belong to.
void RecordWalker::readControl(std::string_view name, std::string_view text) {
  if (sameName(name, "dn")) return readName(text);
  if (sameName(name, "changetype") && place_ < Place::kBlock) {
    place_ = sameName(trimSpaces(text), "modify") ? Place::kModify : Place::kChange;
    return;
  }
  if (place_ == Place::kModify) place_ = sameName(name, "delete") ? Place::kDeleting : Place::kBlock;
}

void RecordWalker::readPassword(std::string_view description) {
  atPassword_ = true;
  unfold(line_, text_);
  password_.description.assign(description);
  password_.problem = "";
  password_.history.clear();
  password_.form = readValue(text_.view().substr(text_.view().find(':') + 1));
  if (password_.form == ValueForm::kBytes) password_.form = readFields(typeOf(description));
}

// Attributes whose values have fields.
ValueForm RecordWalker::readFields(std::string_view type) {
  std::string_view rest = password_.value.view();
  if (sameName(type, "authPassword")) {
    takePart(rest, '$');
    if (rest.find('$') != kNone) return ValueForm::kAuthPassword;
    password_.problem = "the value is not of the form scheme$info$value";
    return ValueForm::kBroken;
  }
  if (!sameName(type, "pwdHistory")) return ValueForm::kBytes;
  takePart(rest, '#');
  takePart(rest, '#');
  password_.history.assign(password_.value.view().substr(0, password_.value.size() - rest.size()));
  const std::string_view length = takePart(rest, '#');
  if (length != std::to_string(rest.size())) {
    password_.problem = "the value is not of the form time#syntax#length#password";
    return ValueForm::kBroken;
  }
  password_.value = Secret(rest);
  return ValueForm::kBytes;
}

ValueForm RecordWalker::readValue(std::string_view text) {
  if (!text.empty() && text.front() == '<') return ValueForm::kUrl;
  const char* problem = valueProblem(text);
  const bool parsed = problem == nullptr && parseValue(text_, password_.value);
  if (place_ == Place::kDeleting) return ValueForm::kDeleted;
  if (parsed) return ValueForm::kBytes;
  password_.problem = problem != nullptr ? problem : "the line cannot be parsed";
  return ValueForm::kBroken;
}

// Ends a block of a change record.
void RecordWalker::endBlock() noexcept {
  if (place_ > Place::kModify) place_ = Place::kModify;
  ++group_;
}

void RecordWalker::readLine(std::string_view text) {
  if (text.empty() || text.front() == '#') return;
  size_t colon = text.find(':');
  if (colon != kNone && !matters(text.substr(0, colon))) return;
  Secret whole;
  if (line_.folded()) {  // a fold can stand anywhere, within the name of an attribute too
    unfold(line_, whole);
    text = whole.view().substr(static_cast<size_t>(text.data() - line_.first.data()));
    colon = text.find(':');
  }
  const std::string_view name = text.substr(0, colon);
  if (place_ < Place::kEntry && !beginsEntry(trimSpaces(name))) return;
  if (colon == kNone) {
    if (text == "-") endBlock();
    return;
  }
  const size_t found = attributes_.find(name);
  if (found == AttributeSet::kNone) return readControl(trimSpaces(name), text.substr(colon + 1));
  seen_ |= std::uint64_t{1} << found;
  readPassword(name);
}

bool RecordWalker::next() {
  atPassword_ = false;
  if (!takeLogicalLine(rest_, line_)) return false;
  lineNumber_ = nextLineNumber_;
  nextLineNumber_ += line_.physicalLines;
  if (line_.blank()) startRecord();
  std::string_view text = line_.first;
  const bool marked = lineNumber_ == 1 && text.substr(0, kByteOrderMark.size()) == kByteOrderMark;
  if (marked) text.remove_prefix(kByteOrderMark.size());
  readLine(text);
  return true;
}

void appendAttribute(const std::string& description, const Secret& value, Secret& out) {
  const LdifLibrary& library = ldifLibrary();
  const bool asText = value.empty() || library.isNotPrintable(value.c_str(), value.size()) == 0;
  Secret text;
  text.resize(LDIF_SIZE_NEEDED_WRAP(description.size(), value.size(), LDIF_LINE_WIDTH_MAX) + 1);
  char* end = text.data();
  library.putLine(&end, asText ? LDIF_PUT_TEXT : LDIF_PUT_BINARY, description.c_str(), value.c_str(), value.size(),
                  LDIF_LINE_WIDTH_MAX);
  out.append(text.view().substr(0, static_cast<size_t>(end - text.data())));
}

// Folding is done here: the library would end every line in a bare newline.
void writeChanged(const LogicalLine& line, const std::string& description, const Secret& value, Secret& out) {
  Secret text;
  appendAttribute(description, value, text);
  std::string_view written = text.view();
  if (!written.empty() && written.back() == '\n') written.remove_suffix(1);
  line.folded() ? foldInto(written, line.firstEnd, out) : out.append(written);
  out.append(line.lastEnd);
}

}  // namespace tool
