// SPDX-License-Identifier: Apache-2.0
// Base64 (RFC 4648, section 4) over the standard or any other alphabet of 64 characters, and the compaction of texts to
// an alphabet.
#include <climits>
#include <cstdio>
#include <cstring>

#include "base64.h"
#include "encoding_utils.h"
#include "owners.h"

namespace ldappw {
namespace {

constexpr char kStandard[] = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
constexpr char kStandardWithPad[] = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/=";
constexpr size_t kSymbols = 64;
constexpr char kPad = '=';
constexpr uint16_t kPadIndex = 64;

// The place of each character in an alphabet with "=" after it: the first, where there are several. NUL counts as "=",
// and what is nowhere has the place after the last.
struct PlaceTable {
  uint16_t places[256];
};

constexpr PlaceTable placesOf(const char* alphabet, size_t length) {
  PlaceTable table{};
  const size_t none = length + 1;
  for (uint16_t& place : table.places) place = static_cast<uint16_t>(none);
  table.places[static_cast<unsigned char>(kPad)] = static_cast<uint16_t>(length);
  for (size_t i = length; i-- > 0;) table.places[static_cast<unsigned char>(alphabet[i])] = static_cast<uint16_t>(i);
  table.places[0] = table.places[static_cast<unsigned char>(kPad)];
  return table;
}

constexpr PlaceTable kStandardPlaces = placesOf(kStandard, kSymbols);

bool isStandard(const char* alphabet) noexcept {
  return alphabet == kStandard || std::strncmp(alphabet, kStandard, kSymbols + 1) == 0;
}

inline void encodeWholeGroup(const unsigned char* in, char* out, const char* alphabet) noexcept {
  const unsigned first = in[0];
  const unsigned second = in[1];
  const unsigned third = in[2];
  out[0] = alphabet[first >> 2U];
  out[1] = alphabet[(first & 3U) << 4U | second >> 4U];
  out[2] = alphabet[(second & 15U) << 2U | third >> 6U];
  out[3] = alphabet[third & 63U];
}

// The group of the last one or two bytes.
void encodeShortGroup(const unsigned char* in, char* out, size_t remaining, const char* alphabet) noexcept {
  const unsigned second = remaining == 2 ? in[1] : 0;
  out[0] = alphabet[in[0] >> 2U];
  out[1] = alphabet[(in[0] & 3U) << 4U | second >> 4U];
  out[2] = remaining == 2 ? alphabet[(second & 15U) << 2U] : kPad;
  out[3] = kPad;
}

// Decodes one group and returns the number of bytes that it gives.
unsigned decodeGroup(const char* in, unsigned char* out, const PlaceTable& table, bool& isClean) noexcept {
  static constexpr unsigned char kBytesByFirstPad[5] = {0, 1, 1, 2, 3};
  unsigned index[4];
  unsigned firstPad = 4;
  for (unsigned i = 4; i-- > 0;) {
    index[i] = table.places[static_cast<unsigned char>(in[i])];
    isClean &= index[i] <= kPadIndex;
    if (index[i] == kPadIndex) {
      index[i] = 0;
      firstPad = i;
    }
  }
  const unsigned bytes = kBytesByFirstPad[firstPad];
  out[0] = static_cast<unsigned char>(index[0] << 2U | ((index[1] >> 4U) & 3U));
  if (bytes >= 2) out[1] = static_cast<unsigned char>((index[1] & 15U) << 4U | ((index[2] >> 2U) & 15U));
  if (bytes == 3) out[2] = static_cast<unsigned char>((index[2] & 3U) << 6U | index[3]);
  return bytes;
}

// Whole groups without a pad or a foreign character take the short way; the first other group ends it.
size_t decodeCleanGroups(const char* text, size_t groups, unsigned char* out, const PlaceTable& table) noexcept {
  size_t group = 0;
  for (; group < groups; ++group, text += 4, out += 3) {
    const unsigned a = table.places[static_cast<unsigned char>(text[0])];
    const unsigned b = table.places[static_cast<unsigned char>(text[1])];
    const unsigned c = table.places[static_cast<unsigned char>(text[2])];
    const unsigned d = table.places[static_cast<unsigned char>(text[3])];
    if ((a | b | c | d) >= kSymbols) break;
    // Big-endian, in one store: the fourth byte is the next group's, or the terminator's.
    const uint32_t bytes = __builtin_bswap32(a << 26U | b << 20U | c << 14U | d << 8U);
    std::memcpy(out, &bytes, sizeof bytes);
  }
  return group;
}

DecodedText decodeGroups(const char* text, size_t length, unsigned char* out, const PlaceTable& table) noexcept {
  const size_t clean = decodeCleanGroups(text, length / 4, out, table);
  DecodedText result{clean * 3, true};
  out += clean * 3;
  size_t at = clean * 4;
  for (; at + 4 <= length; at += 4, out += 3) result.bytes += decodeGroup(text + at, out, table, result.isClean);
  if (at < length) {
    char group[4] = {};  // what a short last group lacks counts as the terminator
    std::memcpy(group, text + at, length - at);
    result.bytes += decodeGroup(group, out, table, result.isClean);
  }
  return result;
}

}  // namespace

DecodedText decodeText(const char* text, size_t length, const char* alphabet, unsigned char* out) noexcept {
  if (isStandard(alphabet)) return decodeGroups(text, length, out, kStandardPlaces);
  return decodeGroups(text, length, out, placesOf(alphabet, std::strlen(alphabet)));
}

size_t encodeBytes(const unsigned char* data, size_t bytes, const char* alphabet, char* out) noexcept {
  const char* const begin = out;
  size_t at = 0;
  for (; at + 3 <= bytes; at += 3, out += 4) encodeWholeGroup(data + at, out, alphabet);
  if (at < bytes) {
    encodeShortGroup(data + at, out, bytes - at, alphabet);
    out += 4;
  }
  *out = '\0';
  return static_cast<size_t>(out - begin);
}

bool isWholeAlphabet(const char* alphabet) noexcept {
  return std::memchr(alphabet, '\0', kSymbols) == nullptr;
}

}  // namespace ldappw

using namespace ldappw;

extern "C" {

// Documented in encoding_utils.h.

const char* pBase64 = kStandard;
const char* pBase64Find = kStandardWithPad;

char* binaryBlobToString(const unsigned char* data, int length, const char* alphabet) noexcept {
  if (alphabet == nullptr || (data == nullptr && length > 0) || !isWholeAlphabet(alphabet)) return nullptr;
  const size_t bytes = length > 0 ? static_cast<size_t>(length) : 0;
  char* text = static_cast<char*>(std::malloc(encodedRoom(bytes)));
  if (text != nullptr) encodeBytes(data, bytes, alphabet, text);
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
  auto* data = zeroedBytes<unsigned char>(size);
  if (data != nullptr) *outLength = static_cast<unsigned int>(decodeText(text, length, alphabet, data).bytes);
  return data;
}

unsigned char* base64ToBinaryBlob(const char* text, unsigned int* outLength) noexcept {
  return stringToBinaryBlob(text, outLength, pBase64);
}

char* compactToOnlyString(const char* text, const char* alphabet) noexcept {
  if (text == nullptr || alphabet == nullptr) return nullptr;
  const char* from = std::strpbrk(text, alphabet);
  if (from == nullptr) {
    std::printf("No base64 characters found in input buf %s\n", text);
    return nullptr;
  }
  const size_t rest = std::strlen(from);
  char* result = static_cast<char*>(std::malloc(rest + 1));
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
