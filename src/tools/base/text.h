// SPDX-License-Identifier: Apache-2.0
// Questions about text that several parts ask: letter case, UTF-8, base64, and what a terminal may be shown.
#pragma once

#include <cstddef>
#include <cstdint>
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
// The number of a character that utf8Bytes() has found.
std::uint32_t codePoint(std::string_view character) noexcept;
// True for a character that is not seen as itself: a terminal acts on a control character, and one that turns the
// direction of writing or has no width makes a name read as another.
bool isUnseen(std::uint32_t point) noexcept;

// True for well-formed UTF-8 without control characters of one byte. What a wrong key makes of a value is practically
// never that, while its padding is right once in some 250 times.
bool looksLikeText(std::string_view bytes) noexcept;

// The text as a reader may be shown it, on a terminal or a page: ASCII control characters, and bytes that are not
// UTF-8, as \xNN, the other characters that are not seen as \uNNNN.
std::string printable(std::string_view text);

// The number of bytes that base64 text (RFC 4648, padded, no other characters) stands for, or -1 when it is none.
long base64Bytes(std::string_view text) noexcept;

}  // namespace tool
