// SPDX-License-Identifier: Apache-2.0
#include "base/text.h"

#include <algorithm>
#include <array>
#include <cstdint>
#include <cstdio>

namespace tool {
namespace {

char lower(char c) noexcept {
  return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c;
}

std::uint32_t byteAt(std::string_view text, size_t i) noexcept {
  return static_cast<unsigned char>(text[i]);
}

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
  std::uint32_t point = first & (0x7FU >> bytes);
  for (size_t i = 1; i < bytes; ++i) {
    if ((byteAt(text, i) & 0xC0U) != 0x80U) return 0;
    point = (point << 6) | (byteAt(text, i) & 0x3FU);
  }
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

bool isControl(std::string_view character) noexcept {
  const std::uint32_t first = byteAt(character, 0);
  if (character.size() == 1) return first < 0x20 || first == 0x7F;
  return first == 0xC2 && byteAt(character, 1) < 0xA0;
}

bool looksLikeText(std::string_view bytes) noexcept {
  return std::none_of(bytes.begin(), bytes.end(),
                      [](char byte) {
                        return isControl({&byte, 1});
                      }) &&
         wellFormedUtf8(bytes);
}

std::string printable(std::string_view text) {
  std::string shown;
  for (size_t i = 0; i < text.size();) {
    const size_t bytes = utf8Bytes(text.substr(i));
    if (bytes > 0 && !isControl(text.substr(i, bytes))) {
      shown += text.substr(i, bytes);
      i += bytes;
      continue;
    }
    char hex[5];
    snprintf(hex, sizeof hex, "\\x%02X", static_cast<unsigned>(byteAt(text, i)));
    shown += hex;
    ++i;
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
