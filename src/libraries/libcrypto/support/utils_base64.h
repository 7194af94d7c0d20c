// SPDX-License-Identifier: Apache-2.0
// Base64 between buffers of the caller's, for the modules that need no allocation of the result.
#pragma once

#include <cstddef>
#include <cstring>

#include "support/processor.h"

namespace ldappw {

constexpr size_t kSymbols = 64;  // of an alphabet
constexpr char kPad = '=';

// The standard alphabet, known by its address.
inline constexpr char kStandard[] = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
inline bool isStandard(const char* alphabet) noexcept {
  return alphabet == kStandard;
}

// Whether an alphabet has all its 64 characters.
inline bool isWholeAlphabet(const char* alphabet) noexcept {
  return isStandard(alphabet) || (alphabet != nullptr && std::memchr(alphabet, '\0', kSymbols) == nullptr);
}

// The size of a buffer for the bytes of a text of so many characters, and for the text of so many bytes with its NUL.
constexpr size_t decodedRoom(size_t characters) {
  return characters / 4 * 3 + 4;
}
constexpr size_t encodedRoom(size_t bytes) {
  return bytes / 3 * 4 + 5;
}

// The characters that so many bytes give.
constexpr size_t encodedLength(size_t bytes) {
  return (bytes + 2) / 3 * 4;
}

// What a text gave.
struct DecodedText {
  size_t bytes;
  bool isClean;  // each character was of the alphabet or "="
};

// The two for any processor, and the reference of the others.
void encodePlainly(const unsigned char* data, size_t bytes, const char* alphabet, char* out) noexcept;
DecodedText decodePlainly(const char* text, size_t length, const char* alphabet, unsigned char* out) noexcept;

// Goes on behind characters that are done, whole groups without a pad.
DecodedText decodeRest(const char* text, size_t length, const char* alphabet, size_t done, unsigned char* out) noexcept;

// For those that have SSE4.1: sixteen characters at a time, and the plain way from where a text or an alphabet is odd.
void encodeWithVectors(const unsigned char* data, size_t bytes, const char* alphabet, char* out) noexcept;
DecodedText decodeWithVectors(const char* text, size_t length, const char* alphabet, unsigned char* out) noexcept;

// Encodes bytes over a whole alphabet, without a NUL after them.
inline void encodeBytes(const unsigned char* data, size_t bytes, const char* alphabet, char* out) noexcept {
  (processor.hasSse41 ? encodeWithVectors : encodePlainly)(data, bytes, alphabet, out);
}

// Decodes a text into decodedRoom(length) bytes, of which it writes each. Without an alphabet nothing is clean.
inline DecodedText decodeText(const char* text, size_t length, const char* alphabet, unsigned char* out) noexcept {
  if (alphabet == nullptr) return {0, false};
  return (processor.hasSse41 ? decodeWithVectors : decodePlainly)(text, length, alphabet, out);
}

}  // namespace ldappw
