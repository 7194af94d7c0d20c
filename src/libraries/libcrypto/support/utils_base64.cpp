// SPDX-License-Identifier: Apache-2.0
// Base64 (RFC 4648, section 4) over the standard or any other alphabet of 64 characters, and the compaction of texts to
// an alphabet.
#include "support/utils_base64.h"

#include <climits>
#include <cstdio>
#include <cstring>

#include "encoding_utils.h"
#include "support/cancellation.h"
#include "support/owners.h"

namespace ldappw {
namespace {

constexpr char kStandardWithPad[] = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/=";

}  // namespace
}  // namespace ldappw

using namespace ldappw;

extern "C" {

// Documented in encoding_utils.h.

const char* pBase64 = kStandard;
const char* pBase64Find = kStandardWithPad;

char* binaryBlobToString(const unsigned char* data, int length, const char* alphabet) noexcept {
  if (alphabet == nullptr || (data == nullptr && length > 0) || !isWholeAlphabet(alphabet)) return nullptr;
  const size_t bytes = length > 0 ? static_cast<size_t>(length) : 0;
  const size_t room = encodedRoom(bytes);
  char* text = newBytes<char>(room);
  if (text == nullptr) return nullptr;
  for (size_t i = 1; i <= encodedRoom(0); ++i) text[room - i] = '\0';  // the NUL, and what is behind it
  encodeBytes(data, bytes, alphabet, text);
  return text;
}

char* binaryBlobToBase64(const unsigned char* data, int length) noexcept {
  return binaryBlobToString(data, length, pBase64);
}

unsigned char* stringToBinaryBlob(const char* text, unsigned int* outLength, const char* alphabet) noexcept {
  if (text == nullptr || outLength == nullptr || alphabet == nullptr) return nullptr;
  const size_t length = std::strlen(text);
  const size_t size = decodedRoom(length);
  if (size > UINT_MAX) return nullptr;
  auto* data = newBytes<unsigned char>(size);
  if (data != nullptr) *outLength = static_cast<unsigned int>(decodeText(text, length, alphabet, data).bytes);
  return data;
}

unsigned char* base64ToBinaryBlob(const char* text, unsigned int* outLength) noexcept {
  return stringToBinaryBlob(text, outLength, pBase64);
}

char* compactToOnlyString(const char* text, const char* alphabet) noexcept {
  if (text == nullptr || alphabet == nullptr) return nullptr;
  const NoCancellation uncancelled;
  const char* from = std::strpbrk(text, alphabet);
  if (from == nullptr) {
    std::printf("No base64 characters found in input buf %s\n", text);
    return nullptr;
  }
  const size_t rest = std::strlen(from);
  char* result = newBytes<char>(rest + 1);
  if (result == nullptr) {
    std::printf("Could not malloc buffer of size %d.\n", static_cast<int>(rest));
    return nullptr;
  }
  char* out = result;
  while (*from != '\0') {
    const size_t run = std::strspn(from, alphabet);
    std::memcpy(out, from, run);
    out += run;
    from += run;
    from += std::strcspn(from, alphabet);
  }
  *out = '\0';
  return result;
}

char* compactToOnlyBase64(const char* text) noexcept {
  return compactToOnlyString(text, pBase64);
}

}  // extern "C"
