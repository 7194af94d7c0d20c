// SPDX-License-Identifier: Apache-2.0
// The rows of the schemes, and finding the row of a name or a value.
#include "scheme.h"

#include <limits.h>

#include <algorithm>

#include "foreign_schemes.h"
#include "library_schemes.h"
#include "password_schemes.h"
#include "text.h"

namespace tool {
namespace {

constexpr int kNoKey = -1;
constexpr PayloadRule kAny{nullptr, 0, 0, 0, nullptr};
constexpr CostRules kSalt{{0, 0, 0, 4}, {0, 0, 0, 20}, {0, 0, 0, 64}};
constexpr PayloadRule kBlocks{base64Problem, 16, LONG_MAX, 16, "the payload is not a whole number of 16-byte blocks"};

// clang-format off
// Outside the table: a tag of no known scheme.
constexpr Scheme kUnknownScheme = {"unknown", "", FORMAT_NONE, Kind::kUnknown, 0, 0, kNoKey, false, kAny, "",
    nullptr, nullptr, nullptr, nullptr, Strength::kUnknown, ""};

}  // namespace

const std::initializer_list<Scheme> kSchemes = {
    // name, tag, code, kind, cut and compared bytes, key, provider, payload, foreign marks,
    //     passwords refused, made, checked, opened, strength, who writes it
    {"clear", "", FORMAT_NONE, Kind::kClear, 0, 46, kNoKey, false, kAny, "",
         clearPasswordProblem, makeClear, checkByLibrary, openClear,
         Strength::kClear, "any"},
    {"sha", "{SHA}", FORMAT_SHA, Kind::kOneWay, 0, 0, kNoKey, false,
         {base64Problem, 20, 20, 1, "the payload does not hold 20 bytes"}, "",
         shaPasswordProblem, makeByLibrary, checkByLibrary, nullptr,
         Strength::kUnsalted, "ldappw, slapd, 389-ds, Dovecot, passlib"},
    {"ssha", "{SSHA}", FORMAT_SSHA, Kind::kOneWay, 0, 0, kNoKey, true,
         {base64Problem, 20, LONG_MAX, 1, "the payload holds less than a digest of 20 bytes"}, "",
         nullptr, makeSsha, checkByLibrary, nullptr,
         Strength::kSaltedFast, "ldappw, slapd, 389-ds, Dovecot, passlib", &kSalt, "SHA1"},
    {"md5", "{MD5}", FORMAT_MD5, Kind::kOneWay, 0, 0, kNoKey, true,
         {base64Problem, 16, 16, 1, "the payload does not hold 16 bytes"}, "$",
         nullptr, makeByLibrary, checkByLibrary, nullptr,
         Strength::kUnsalted, "ldappw, slapd, 389-ds, passlib"},
    {"crypt", "{crypt}", FORMAT_CRYPT, Kind::kOneWay, 8, 8, kNoKey, false,
         {cryptProblem, 0, 0, 0, "the payload is not 13 characters of the crypt alphabet"}, "$_*!",
         nullptr, makeCrypt, checkByLibrary, nullptr,
         Strength::kDesCrypt, "ldappw, slapd, 389-ds, passlib"},
    {"qveil", "{qVEIL}", FORMAT_QVEIL, Kind::kReversible, 46, 46, kNoKey, false,
         {maskedProblem, 0, 0, 0, "the masked payload does not decode"}, "",
         nullptr, makeByLibrary, checkByLibrary, openByLibrary,
         Strength::kReversible, "ldappw"},
    {"aes128", "{AES128}", FORMAT_AES128, Kind::kReversible, 0, 0, 0, true, kBlocks, "",
         nullptr, makeByLibrary, checkByOpening, openByLibrary,
         Strength::kReversible, "ldappw"},
    {"aes192", "{AES192}", FORMAT_AES192, Kind::kReversible, 0, 0, 1, true, kBlocks, "",
         nullptr, makeByLibrary, checkByOpening, openByLibrary,
         Strength::kReversible, "ldappw"},
    {"aes256", "{AES256}", FORMAT_AES256, Kind::kReversible, 0, 0, 2, true, kBlocks, "",
         nullptr, makeByLibrary, checkByOpening, openByLibrary,
         Strength::kReversible, "ldappw"},
    {"vldl", "{VLDL}", FORMAT_VLDL, Kind::kOneWay, 0, 0, kNoKey, false, kAny, "",
         nullptr, nullptr, nullptr, nullptr,
         Strength::kUnknown, ""},
};

// clang-format on

namespace {

const Scheme* ownSchemeOf(std::string_view tag) noexcept {
  const auto* found = std::find_if(kSchemes.begin(), kSchemes.end(),
                                   [&](const Scheme& row) { return !row.isClear() && sameName(tag, row.tag); });
  return found != kSchemes.end() ? found : nullptr;
}

// Other algorithms under a tag of the library's are looked for where a value is none of the library's.
const Scheme* schemeOf(std::string_view tag, std::string_view payload) noexcept {
  const Scheme* own = ownSchemeOf(tag);
  if (own == nullptr) return foreignSchemeOf(tag, payload);
  if (*own->foreignMarks == '\0' || own->payload.check(own->payload, payload) == nullptr) return own;
  const Scheme* foreign = foreignSchemeOf(tag, payload);
  return foreign != nullptr ? foreign : own;
}

// The library knows one form without a tag.
const Scheme& schemeOfUntagged(std::string_view value) noexcept {
  const int code = check_format(value.data(), static_cast<unsigned>(std::min<std::size_t>(value.size(), INT_MAX)));
  const auto* found =
      std::find_if(kSchemes.begin(), kSchemes.end(), [&](const Scheme& row) { return row.code == code; });
  return found != kSchemes.end() ? *found : *kSchemes.begin();
}

}  // namespace

const Scheme* findScheme(std::string_view name) noexcept {
  for (const Scheme& scheme : kSchemes) {
    if (sameName(name, scheme.name) || (!scheme.isClear() && sameName(name, scheme.tag))) return &scheme;
  }
  return findForeignScheme(name);
}

StoredValue::StoredValue(const Secret& value) noexcept : whole_(&value) {
  const std::string_view text = value.view();
  const std::size_t brace = text.find('}');
  if (text.empty() || text.front() != '{' || brace == std::string_view::npos) {
    scheme_ = &schemeOfUntagged(text);
    return;
  }
  tagBytes_ = brace + 1;
  scheme_ = schemeOf(tag(), payload());
  if (scheme_ == nullptr) scheme_ = &kUnknownScheme;
}

const char* StoredValue::problem() const {
  const PayloadRule& rule = scheme_->payload;
  if (scheme_->kind == Kind::kUnknown) return "the tag is of no known scheme";
  if (rule.check == nullptr) return nullptr;
  if (payload().empty()) return "there is no payload";
  if (payload().find('\0') != std::string_view::npos) return "the payload holds a NUL byte";
  if (payload().back() == '\r') return "the payload ends in a carriage return";
  return rule.check(rule, payload());
}

bool StoredValue::foreign() const noexcept {
  return !payload().empty() &&
         std::string_view(scheme_->foreignMarks).find(payload().front()) != std::string_view::npos;
}

}  // namespace tool
