// SPDX-License-Identifier: Apache-2.0
#include "base/text.h"

#include <algorithm>
#include <array>
#include <cstdio>
#include <iterator>

namespace tool {
namespace {

char lower(char c) noexcept {
  return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c;
}

std::uint32_t byteAt(std::string_view text, size_t i) noexcept {
  return static_cast<unsigned char>(text[i]);
}

// Unicode 15: the control characters, the separators of lines, and what has the property
// Default_Ignorable_Code_Point, in order.
constexpr struct {
  std::uint32_t first;
  std::uint32_t last;
} kUnseen[] = {
    {0x0000, 0x001F}, {0x007F, 0x009F},   {0x00AD, 0x00AD},   {0x034F, 0x034F},   {0x061C, 0x061C},
    {0x115F, 0x1160}, {0x17B4, 0x17B5},   {0x180B, 0x180F},   {0x200B, 0x200F},   {0x2028, 0x202E},
    {0x2060, 0x206F}, {0x3164, 0x3164},   {0xFE00, 0xFE0F},   {0xFEFF, 0xFEFF},   {0xFFA0, 0xFFA0},
    {0xFFF0, 0xFFFB}, {0x1BCA0, 0x1BCA3}, {0x1D173, 0x1D17A}, {0xE0000, 0xE0FFF},
};

constexpr auto kIsBase64 = [] {
  std::array<bool, 256> digits{};
  for (const char c : std::string_view("ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/")) {
    digits[static_cast<unsigned char>(c)] = true;
  }
  return digits;
}();

}  // namespace

bool sameName(std::string_view a, std::string_view b) noexcept {
  return a.size() == b.size() && beginsWithName(a, b);
}

bool beginsWithName(std::string_view text, std::string_view name) noexcept {
  return text.size() >= name.size() && std::equal(name.begin(), name.end(), text.begin(),
                                                  [](char a, char b) { return a == b || lower(a) == lower(b); });
}

std::string_view trimSpaces(std::string_view text) noexcept {
  while (!text.empty() && text.front() == ' ') text.remove_prefix(1);
  while (!text.empty() && text.back() == ' ') text.remove_suffix(1);
  return text;
}

size_t utf8Bytes(std::string_view text) noexcept {
  const std::uint32_t first = byteAt(text, 0);
  if (first < 0x80) return 1;
  const size_t bytes = first >= 0xF0 ? 4 : first >= 0xE0 ? 3 : 2;
  if (first < 0xC2 || first > 0xF4 || text.size() < bytes) return 0;
  for (size_t i = 1; i < bytes; ++i) {
    if ((byteAt(text, i) & 0xC0U) != 0x80U) return 0;
  }
  const std::uint32_t point = codePoint(text.substr(0, bytes));
  const std::uint32_t least = bytes == 4 ? 0x10000 : bytes == 3 ? 0x800 : 0x80;
  const bool surrogate = point >= 0xD800 && point <= 0xDFFF;
  return point < least || point > 0x10FFFF || surrogate ? 0 : bytes;
}

bool wellFormedUtf8(std::string_view text) noexcept {
  while (!text.empty()) {
    const size_t bytes = utf8Bytes(text);
    if (bytes == 0) return false;
    text.remove_prefix(bytes);
  }
  return true;
}

std::uint32_t codePoint(std::string_view character) noexcept {
  std::uint32_t point = byteAt(character, 0) & (character.size() > 1 ? 0x7FU >> character.size() : 0x7FU);
  for (size_t i = 1; i < character.size(); ++i) point = (point << 6) | (byteAt(character, i) & 0x3FU);
  return point;
}

bool isUnseen(std::uint32_t point) noexcept {
  const auto* row = std::upper_bound(std::begin(kUnseen), std::end(kUnseen), point,
                                     [](std::uint32_t value, const auto& range) { return value < range.first; });
  return row != std::begin(kUnseen) && point <= (row - 1)->last;
}

bool looksLikeText(std::string_view bytes) noexcept {
  return wellFormedUtf8(bytes) &&
         std::none_of(bytes.begin(), bytes.end(), [](char byte) { return byte == 0x7F || (byte >= 0 && byte < 0x20); });
}

std::string printable(std::string_view text) {
  std::string shown;
  for (size_t i = 0; i < text.size();) {
    const size_t bytes = std::max(utf8Bytes(text.substr(i)), size_t{1});
    const std::string_view character = text.substr(i, bytes);
    const bool isByte = bytes == 1 && byteAt(text, i) >= 0x80;
    const std::uint32_t point = isByte ? byteAt(text, i) : codePoint(character);
    if (!isByte && !isUnseen(point)) {
      shown += character;
    } else {
      char code[12];
      snprintf(code, sizeof code, bytes == 1 ? "\\x%02X" : "\\u%04X", static_cast<unsigned>(point));
      shown += code;
    }
    i += bytes;
  }
  return shown;
}

long base64Bytes(std::string_view text) noexcept {
  if (text.size() % 4 != 0) return -1;
  size_t pads = 0;
  while (pads < 2 && pads < text.size() && text[text.size() - 1 - pads] == '=') ++pads;
  const std::string_view digits = text.substr(0, text.size() - pads);
  if (!std::all_of(digits.begin(), digits.end(), [](char c) { return kIsBase64[static_cast<unsigned char>(c)]; }))
    return -1;
  return static_cast<long>(text.size() / 4 * 3 - pads);
}

}  // namespace tool
