// SPDX-License-Identifier: Apache-2.0
// Base64 between buffers of the caller's, for the modules that need no allocation of the result.
#pragma once

#include <cstddef>

namespace ldappw {

// The size of a buffer for the bytes of a text of so many characters, and for the text of so many bytes with its NUL.
constexpr size_t decodedRoom(size_t characters) {
  return characters / 4 * 3 + 4;
}
constexpr size_t encodedRoom(size_t bytes) {
  return bytes / 3 * 4 + 5;
}

// What a text gave.
struct DecodedText {
  size_t bytes;
  bool isClean;  // each character was of the alphabet or "="
};

// Decodes a text into decodedRoom(length) bytes.
DecodedText decodeText(const char* text, size_t length, const char* alphabet, unsigned char* out) noexcept;

// Encodes bytes, without a NUL after them, and returns the number of characters.
size_t encodeBytes(const unsigned char* data, size_t bytes, const char* alphabet, char* out) noexcept;

// Whether an alphabet has all its 64 characters.
bool isWholeAlphabet(const char* alphabet) noexcept;

}  // namespace ldappw
