// SPDX-License-Identifier: Apache-2.0
// Base64 (RFC 4648, section 4) over the standard or any other alphabet of 64 characters, and the compaction of texts to
// an alphabet.
#include "utils_base64.h"

#include <climits>
#include <cstdio>
#include <cstring>

#include "cancellation.h"
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

// The standard alphabet's two characters for each 12 bits.
struct PairTable {
  char pairs[kSymbols * kSymbols][2];
};

constexpr PairTable pairsOf(const char* alphabet) {
  PairTable table{};
  for (size_t i = 0; i < kSymbols * kSymbols; ++i) {
    table.pairs[i][0] = alphabet[i / kSymbols];
    table.pairs[i][1] = alphabet[i % kSymbols];
  }
  return table;
}

constexpr PairTable kStandardPairs = pairsOf(kStandard);

// The 24 bits of a whole group.
inline unsigned groupOf(const unsigned char* in) noexcept {
  return unsigned{in[0]} << 16U | unsigned{in[1]} << 8U | in[2];
}

inline void encodeStandardGroup(const unsigned char* in, char* out) noexcept {
  const unsigned group = groupOf(in);
  std::memcpy(out, kStandardPairs.pairs[group >> 12U], 2);
  std::memcpy(out + 2, kStandardPairs.pairs[group & 4095U], 2);
}

inline void encodeWholeGroup(const unsigned char* in, char* out, const char* alphabet) noexcept {
  const unsigned group = groupOf(in);
  out[0] = alphabet[group >> 18U];
  out[1] = alphabet[(group >> 12U) & 63U];
  out[2] = alphabet[(group >> 6U) & 63U];
  out[3] = alphabet[group & 63U];
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
  const unsigned second = (index[1] & 15U) << 4U | ((index[2] >> 2U) & 15U);
  const unsigned third = (index[2] & 3U) << 6U | index[3];
  out[0] = static_cast<unsigned char>(index[0] << 2U | ((index[1] >> 4U) & 3U));
  out[1] = static_cast<unsigned char>(bytes >= 2 ? second : 0);  // a group that gives less leaves a gap of zeros
  out[2] = static_cast<unsigned char>(bytes == 3 ? third : 0);
  return bytes;
}

// Decodes what follows the groups that are done already.
DecodedText decodeGroups(const char* text, size_t length, unsigned char* out, const PlaceTable& table,
                         size_t done) noexcept {
  DecodedText result{done * 3, true};
  out += done * 3;
  size_t at = done * 4;
  for (; at + 4 <= length; at += 4, out += 3) result.bytes += decodeGroup(text + at, out, table, result.isClean);
  if (at < length) {
    char group[4] = {};  // what a short last group lacks counts as the terminator
    std::memcpy(group, text + at, length - at);
    result.bytes += decodeGroup(group, out, table, result.isClean);
  }
  return result;
}

// What each character of the standard alphabet adds to a group of 24 bits, for its four positions. The flags above
// those tell what is no character of it, and where a pad is.
struct GroupTable {
  uint32_t parts[4][256];
};

constexpr uint32_t kForeign = 1U << 24U;
constexpr uint32_t kPadAtThird = 1U << 25U;
constexpr uint32_t kPadAtFourth = 1U << 26U;

constexpr GroupTable partsOf(const PlaceTable& table) {
  GroupTable groups{};
  for (unsigned position = 0; position < 4; ++position) {
    for (unsigned c = 0; c < 256; ++c) {
      const uint32_t place = table.places[c];
      groups.parts[position][c] = place < kSymbols ? place << (6 * (3 - position)) : kForeign;
    }
  }
  groups.parts[2][static_cast<unsigned char>(kPad)] = kPadAtThird;
  groups.parts[3][static_cast<unsigned char>(kPad)] = kPadAtFourth;
  return groups;
}

constexpr GroupTable kStandardGroups = partsOf(kStandardPlaces);

inline uint32_t groupAt(const char* text) noexcept {
  const auto* in = reinterpret_cast<const unsigned char*>(text);
  const auto& parts = kStandardGroups.parts;
  return parts[0][in[0]] | parts[1][in[1]] | parts[2][in[2]] | parts[3][in[3]];
}

// Big-endian, in one store: the fourth byte is the next group's, or the terminator's.
inline void storeGroup(uint32_t group, unsigned char* out) noexcept {
  const uint32_t bytes = __builtin_bswap32(group << 8U);
  std::memcpy(out, &bytes, sizeof bytes);
}

// Texts of the standard alphabet: whole groups and a last one with its pads take the short way, all else the long one.
DecodedText decodeStandard(const char* text, size_t length, unsigned char* out) noexcept {
  const size_t groups = length / 4;
  size_t done = 0;
  uint32_t group = 0;
  for (; done < groups; ++done) {
    group = groupAt(text + done * 4);
    if (group >= kForeign) break;
    storeGroup(group, out + done * 3);
  }
  if (done * 4 == length) return {done * 3, true};
  if ((done + 1) * 4 == length && (group & ~0xffffffU) == kPadAtFourth) {
    storeGroup(group & 0xffff00U, out + done * 3);
    return {done * 3 + 2, true};
  }
  if ((done + 1) * 4 == length && (group & ~0xffffffU) == (kPadAtThird | kPadAtFourth)) {
    storeGroup(group & 0xff0000U, out + done * 3);
    return {done * 3 + 1, true};
  }
  return decodeGroups(text, length, out, kStandardPlaces, done);
}

}  // namespace

DecodedText decodeText(const char* text, size_t length, const char* alphabet, unsigned char* out) noexcept {
  if (!isStandard(alphabet)) return decodeGroups(text, length, out, placesOf(alphabet, std::strlen(alphabet)), 0);
  return decodeStandard(text, length, out);
}

size_t encodeBytes(const unsigned char* data, size_t bytes, const char* alphabet, char* out) noexcept {
  const char* const begin = out;
  const bool standard = isStandard(alphabet);
  size_t at = 0;
  for (; at + 3 <= bytes; at += 3, out += 4) {
    if (standard) {
      encodeStandardGroup(data + at, out);
    } else {
      encodeWholeGroup(data + at, out, alphabet);
    }
  }
  if (at < bytes) {
    encodeShortGroup(data + at, out, bytes - at, alphabet);
    out += 4;
  }
  return static_cast<size_t>(out - begin);
}

bool isWholeAlphabet(const char* alphabet) noexcept {
  return isStandard(alphabet) || std::memchr(alphabet, '\0', kSymbols) == nullptr;
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
  const size_t room = encodedRoom(bytes);
  char* text = static_cast<char*>(std::malloc(room));
  if (text == nullptr) return nullptr;
  const size_t written = encodeBytes(data, bytes, alphabet, text);
  std::memset(text + written, 0, room - written);
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
  const NoCancellation uncancelled;
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
