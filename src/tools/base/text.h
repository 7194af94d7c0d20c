// SPDX-License-Identifier: Apache-2.0
// Questions about text that several parts ask: letter case, UTF-8, base64, and what a terminal may be shown.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace tool {

// Without regard to the case of ASCII letters.
bool sameName(std::string_view a, std::string_view b) noexcept;
bool beginsWithName(std::string_view text, std::string_view name) noexcept;

std::string_view trimSpaces(std::string_view text) noexcept;

// The bytes of the well-formed UTF-8 character (RFC 3629) at the beginning of a text that is not empty, or 0.
size_t utf8Bytes(std::string_view text) noexcept;
bool wellFormedUtf8(std::string_view text) noexcept;
// True for a control character, those of two bytes included: a terminal acts on it.
bool isControl(std::string_view character) noexcept;

// True for well-formed UTF-8 without control characters of one byte. What a wrong key makes of a value is practically
// never that, while its padding is right once in some 250 times.
bool looksLikeText(std::string_view bytes) noexcept;

// The text with control characters, and bytes that are not UTF-8, as \xNN.
std::string printable(std::string_view text);

// The number of bytes that base64 text (RFC 4648, padded, no other characters) stands for, or -1 when it is none.
long base64Bytes(std::string_view text) noexcept;

}  // namespace tool
