// SPDX-License-Identifier: Apache-2.0
// Finding the scheme of a name or a value, and stored values taken apart.
#pragma once

#include <cstddef>
#include <string_view>

#include "schemes/scheme.h"

namespace tool {

// By name or by tag, in any case ("ssha", "{SSHA}", "clear"); of several rows of a tag one that can be made. Null when
// there is none.
const Scheme* findScheme(std::string_view name) noexcept;

// The place of a row in kSchemes.
inline size_t indexOf(const Scheme& scheme) noexcept {
  return static_cast<size_t>(&scheme - kSchemes.begin());
}

// A stored value taken apart. It refers to the bytes that it was made of.
class StoredValue {
 public:
  explicit StoredValue(const Secret& value) noexcept;

  const Secret& whole() const noexcept { return *whole_; }
  // By the tag, qveil for an untagged value wrapped in ">" and "<"; a row of other servers where the value is none of
  // the library's; a scheme of its own, outside the table and of the kind kUnknown, for a tag of no known scheme;
  // otherwise clear text.
  const Scheme& scheme() const noexcept { return *scheme_; }
  // As it is spelt in the value.
  std::string_view tag() const noexcept { return whole_->view().substr(0, tagBytes_); }
  std::string_view payload() const noexcept { return whole_->view().substr(tagBytes_); }
  // What is wrong with the payload, or null when it is well formed, as clear text always is.
  const char* problem() const;
  // True for a payload that the scheme's foreignMarks mark.
  bool foreign() const noexcept;

 private:
  const Secret* whole_;
  const Scheme* scheme_;
  size_t tagBytes_ = 0;
};

}  // namespace tool
