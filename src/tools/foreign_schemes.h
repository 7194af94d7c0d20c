// SPDX-License-Identifier: Apache-2.0
// The schemes that directories hold beside those of the library: a table of rows like those of scheme.h, by tag and,
// where several algorithms share a tag, by the beginning of the payload.
#ifndef LDAPPW_TOOLS_FOREIGN_SCHEMES_H
#define LDAPPW_TOOLS_FOREIGN_SCHEMES_H

#include <cstddef>
#include <initializer_list>
#include <string_view>

#include "scheme.h"

namespace tool {

extern const std::initializer_list<Scheme> kForeignSchemes;

// The row of a tag in braces and the payload behind it, or null.
const Scheme* foreignSchemeOf(std::string_view tag, std::string_view payload) noexcept;

// By name or by tag, in any case; of several rows of a tag one that can be made. Null when there is none.
const Scheme* findForeignScheme(std::string_view name) noexcept;

// The place of a row among those of kSchemes, followed by those of kForeignSchemes.
std::size_t indexOf(const Scheme& scheme) noexcept;

}  // namespace tool

#endif
