// SPDX-License-Identifier: Apache-2.0
// Base64 a group at a time, for any processor, alphabet and text.
#include "support/utils_base64.h"

#include <cstdint>
#include <cstring>

namespace ldappw {
namespace {

constexpr unsigned kPadIndex = 64;

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

inline void encodeWholeGroup(const unsigned char* in, char* out, const char* alphabet) noexcept {
  const unsigned group = unsigned{in[0]} << 16U | unsigned{in[1]} << 8U | in[2];
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

// Decodes a group that holds something else than 64 symbols, and returns the number of bytes that it gives.
unsigned decodeOddGroup(const unsigned (&places)[4], unsigned char* out, bool& isClean) noexcept {
  static constexpr unsigned char kBytesByFirstPad[5] = {0, 1, 1, 2, 3};
  unsigned index[4];
  unsigned firstPad = 4;
  for (unsigned i = 4; i-- > 0;) {
    isClean &= places[i] <= kPadIndex;
    index[i] = places[i];
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

inline unsigned decodeGroup(const char* text, unsigned char* out, const PlaceTable& table, bool& isClean) noexcept {
  const auto* in = reinterpret_cast<const unsigned char*>(text);
  const unsigned places[4] = {table.places[in[0]], table.places[in[1]], table.places[in[2]], table.places[in[3]]};
  if ((places[0] | places[1] | places[2] | places[3]) >= kSymbols) return decodeOddGroup(places, out, isClean);
  const unsigned group = places[0] << 18U | places[1] << 12U | places[2] << 6U | places[3];
  out[0] = static_cast<unsigned char>(group >> 16U);
  out[1] = static_cast<unsigned char>(group >> 8U);
  out[2] = static_cast<unsigned char>(group);
  return 3;
}

DecodedText decodeOver(const PlaceTable& table, const char* text, size_t length, size_t done,
                       unsigned char* out) noexcept {
  DecodedText result{done / 4 * 3, true};
  out += result.bytes;
  size_t at = done;
  for (; at + 4 <= length; at += 4, out += 3) result.bytes += decodeGroup(text + at, out, table, result.isClean);
  if (at < length) {
    char group[4] = {};  // what a short last group lacks counts as the terminator
    std::memcpy(group, text + at, length - at);
    result.bytes += decodeGroup(group, out, table, result.isClean);
    out[3] = 0;
  } else {
    std::memset(out, 0, decodedRoom(0));
  }
  return result;
}

}  // namespace

void encodePlainly(const unsigned char* data, size_t bytes, const char* alphabet, char* out) noexcept {
  size_t at = 0;
  for (; at + 3 <= bytes; at += 3, out += 4) encodeWholeGroup(data + at, out, alphabet);
  if (at < bytes) encodeShortGroup(data + at, out, bytes - at, alphabet);
}

DecodedText decodeRest(const char* text, size_t length, const char* alphabet, size_t done,
                       unsigned char* out) noexcept {
  if (isStandard(alphabet)) return decodeOver(kStandardPlaces, text, length, done, out);
  return decodeOver(placesOf(alphabet, std::strlen(alphabet)), text, length, done, out);
}

DecodedText decodePlainly(const char* text, size_t length, const char* alphabet, unsigned char* out) noexcept {
  return decodeRest(text, length, alphabet, 0, out);
}

}  // namespace ldappw
