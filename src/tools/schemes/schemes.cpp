// SPDX-License-Identifier: Apache-2.0
#include "schemes/schemes.h"

#include <algorithm>
#include <climits>

#include "base/text.h"
#include "password_schemes.h"

namespace tool {
namespace {

// Outside the table: a tag of no known scheme.
constexpr Scheme unknownScheme() {
  Scheme scheme;
  scheme.name = "unknown";
  scheme.kind = Kind::kUnknown;
  return scheme;
}
constexpr Scheme kUnknownScheme = unknownScheme();

// Among tags that stand one by one; "{NAME-*}" is any that begins so.
bool hasTag(std::string_view tags, std::string_view tag) noexcept {
  while (!tags.empty()) {
    const std::string_view one = tags.substr(0, tags.find('}') + 1);
    const std::string_view beginning = one.substr(0, one.find('*'));
    if (beginning.size() < one.size() ? beginsWithName(tag, beginning) : sameName(one, tag)) return true;
    tags.remove_prefix(one.size());
  }
  return false;
}

bool beginsWith(std::string_view text, std::string_view prefix) noexcept {
  return text.substr(0, prefix.size()) == prefix;
}

// The longest beginning counts. Without one a row takes whatever no other row takes, except under {crypt}: there the
// payload has to be right, as otherwise it is a malformed value of the library's own.
const Scheme* foreignSchemeOf(std::string_view tag, std::string_view payload) noexcept {
  const Scheme* found = nullptr;
  for (const Scheme& scheme : kSchemes) {
    if (scheme.own() || !hasTag(scheme.tag, tag) || !beginsWith(payload, scheme.prefix)) continue;
    const bool own = scheme.prefix.empty() && sameName(tag, "{crypt}");
    if (own && scheme.payload.check(scheme.payload, payload) != nullptr) continue;
    if (found == nullptr || scheme.prefix.size() > found->prefix.size()) found = &scheme;
  }
  return found;
}

const Scheme* ownSchemeOf(std::string_view tag) noexcept {
  const auto* found = std::find_if(kSchemes.begin(), kSchemes.end(), [&](const Scheme& row) {
    return row.own() && !row.isClear() && sameName(tag, row.tag);
  });
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
  const int code = check_format(value.data(), static_cast<unsigned>(std::min<size_t>(value.size(), INT_MAX)));
  const auto* found =
      std::find_if(kSchemes.begin(), kSchemes.end(), [&](const Scheme& row) { return row.code == code; });
  return found != kSchemes.end() ? *found : *kSchemes.begin();
}

}  // namespace

const Scheme* findScheme(std::string_view name) noexcept {
  const Scheme* found = nullptr;
  for (const Scheme& scheme : kSchemes) {
    if (sameName(name, scheme.name)) return &scheme;
    if (scheme.isClear() || !hasTag(scheme.tag, name)) continue;
    if (scheme.own()) return &scheme;
    if (found == nullptr || found->make == nullptr) found = &scheme;
  }
  return found;
}

StoredValue::StoredValue(const Secret& value) noexcept : whole_(&value) {
  const std::string_view text = value.view();
  const size_t brace = text.find('}');
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
