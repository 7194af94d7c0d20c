// SPDX-License-Identifier: Apache-2.0
// A slow model of the masked encoding, over the product's tables and OpenSSL's DES: it puts records together, sound or
// not, and takes texts apart.
#pragma once

#include <gtest/gtest.h>

#include <functional>
#include <string>

#include "encoding_utils.h"
#include "masking_tables.h"
#include "oracle.h"

namespace test {

namespace masking = ldappw::masking;

constexpr size_t kDataBefore = 47;
constexpr size_t kPacket = 24;  // without the two characters that the text shows

// What a record says; the values that the encoder uses.
struct Fields {
  unsigned length = 0;
  unsigned width = 4;
  unsigned selector = 11;
  unsigned blockSelector = 11;
  int key = 5;
  int blockKey = 70;
  unsigned constant = 39;
};

inline unsigned char byteAt(const std::string& bytes, size_t at) {
  return static_cast<unsigned char>(bytes[at]);
}

inline void place(std::string& bytes, size_t at, unsigned value, unsigned mask) {
  unsigned byte = byteAt(bytes, at);
  for (unsigned bit = 0; bit < 8; ++bit) {
    if ((mask >> bit & 1) == 0) continue;
    byte = (byte & ~(1U << bit)) | (value & 1) << bit;
    value >>= 1;
  }
  bytes[at] = static_cast<char>(byte);
}

inline unsigned picked(const std::string& bytes, size_t at, unsigned mask) {
  unsigned value = 0;
  for (unsigned bit = 8; bit-- > 0;) {
    if ((mask >> bit & 1) != 0) value = value << 1 | (byteAt(bytes, at) >> bit & 1);
  }
  return value;
}

// Visits the places of a scattered byte: which byte, under which mask, from which bit of the value on.
using Visit = std::function<void(size_t at, unsigned mask, unsigned shift)>;
inline void scattered(size_t at, unsigned width, size_t& cursor, const Visit& visit) {
  const unsigned char* table = width == 1   ? masking::scatterArray1
                               : width == 2 ? masking::scatterArray2
                                            : masking::scatterArray4;
  const size_t masks = width == 1 ? 12 : width == 2 ? 26 : 39;
  for (unsigned k = 0; k < 8 / width; ++k) visit(at + k, table[cursor++ % masks], width * k);
}

inline void scatteredLength(const Visit& visit) {
  size_t cursor = 4;
  scattered(2, 4, cursor, visit);
  scattered(4, 2, cursor, [&](size_t at, unsigned mask, unsigned shift) { visit(at, mask, shift + 8); });
  scattered(8, 2, cursor, [&](size_t at, unsigned mask, unsigned shift) { visit(at, mask, shift + 16); });
}

inline std::string modelKey(int index) {
  static const int strides[8] = {-13, 7, 23, -1, -13, -17, 5, 5};
  std::string key(8, '\0');
  for (unsigned i = 0; i < 8; ++i) {
    if (index < 0) index = -index - 1;
    if (index > 76) index = 153 - index;
    key[i] = static_cast<char>(masking::deskeys[index][7 - i]);
    index += strides[i];
  }
  return key;
}

inline std::string modelCipher(unsigned selector, int key, std::string data, bool encrypts) {
  if (key == -1) return data;
  if (selector == 11) return opensslDes(modelKey(key), data, encrypts);
  if (selector == 7) {
    uint32_t schedule[32];
    deskey40(schedule, bytesOf(modelKey(key)), encrypts ? 0 : 1);
    for (size_t i = 0; i < data.size(); i += 8) des(schedule, bytesOf(data) + i);
  } else {
    for (size_t i = 0; i < data.size(); ++i) data[i] = static_cast<char>(data[i] ^ pEncrypt[(i + 4) % 58]);
  }
  return data;
}

inline size_t modelArea(size_t length) {
  size_t area = 96;
  while (area < 2 * length) area += 32;
  return area;
}

inline std::string recordOf(const std::string& data, const Fields& fields) {
  std::string area(modelArea(data.size()), '\x5a');
  size_t cursor = 0;
  for (size_t i = 0; i < data.size(); ++i) {
    scattered(8 / fields.width * i, fields.width, cursor, [&](size_t at, unsigned mask, unsigned shift) {
      place(area, at, static_cast<unsigned>(byteAt(data, i)) >> shift, mask);
    });
  }
  area = modelCipher(fields.selector, fields.key, area, true);
  std::string packet(26, '\xa5');
  scatteredLength([&](size_t at, unsigned mask, unsigned shift) { place(packet, at, fields.length >> shift, mask); });
  packet[12] = static_cast<char>(fields.blockKey);
  place(packet, 13, fields.blockSelector, 0xcc);
  place(packet, 18, fields.selector, 0x56);
  packet[19] = static_cast<char>(fields.key);
  place(packet, 20, fields.constant, 0x3f);
  place(packet, 21, fields.width, 0x3f);
  packet = packet.substr(0, 18) + modelCipher(fields.blockSelector, fields.blockKey, packet.substr(18), true);
  return area.substr(0, kDataBefore) + packet.substr(2) + area.substr(kDataBefore);
}

inline std::string textOf(const std::string& record, size_t encoding = 3) {
  const masking::Encoding& chosen = masking::encodings[encoding];
  char* text = binaryBlobToString(bytesOf(record), static_cast<int>(record.size()), chosen.alphabet);
  return std::string(">1") + chosen.identifier + taken(text) + "<";
}

// Takes a text of the encoder apart; fails the test where it is not made as it should be.
inline std::string unmasked(const std::string& text, Fields& fields) {
  const masking::Encoding* encoding = masking::encodings;
  while (encoding->alphabet != nullptr && encoding->identifier[0] != text[2]) ++encoding;
  EXPECT_NE(encoding->alphabet, nullptr);
  EXPECT_EQ(text.substr(0, 2) + text.back(), ">1<");
  unsigned bytes = 0;
  const std::string payload = text.substr(3, text.size() - 4);
  unsigned char* blob = stringToBinaryBlob(payload.c_str(), &bytes, encoding->alphabet);
  const std::string record(reinterpret_cast<char*>(blob), bytes);
  free(blob);
  std::string packet = "1" + text.substr(2, 1) + record.substr(kDataBefore, kPacket);
  fields.blockKey = static_cast<signed char>(packet[12]);
  fields.blockSelector = picked(packet, 13, 0xcc);
  packet = packet.substr(0, 18) + modelCipher(fields.blockSelector, fields.blockKey, packet.substr(18), false);
  fields.selector = picked(packet, 18, 0x56);
  fields.key = static_cast<signed char>(packet[19]);
  fields.constant = picked(packet, 20, 0x3f);
  fields.width = picked(packet, 21, 0x3f);
  fields.length = 0;
  scatteredLength(
      [&](size_t at, unsigned mask, unsigned shift) { fields.length |= picked(packet, at, mask) << shift; });
  const std::string area = modelCipher(fields.selector, fields.key,
                                       record.substr(0, kDataBefore) + record.substr(kDataBefore + kPacket), false);
  EXPECT_EQ(area.size(), modelArea(fields.length));
  std::string data(fields.length, '\0');
  size_t cursor = 0;
  for (size_t i = 0; i < data.size(); ++i) {
    unsigned byte = 0;
    scattered(8 / fields.width * i, fields.width, cursor,
              [&](size_t at, unsigned mask, unsigned shift) { byte |= picked(area, at, mask) << shift; });
    data[i] = static_cast<char>(byte);
  }
  const std::string background = packet.substr(14, 4) + packet.substr(22) + area.substr(8 / fields.width * data.size());
  EXPECT_EQ(background.find('\0'), std::string::npos) << "background is never zero";
  return data;
}

}  // namespace test
