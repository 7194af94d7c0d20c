// SPDX-License-Identifier: Apache-2.0
// The masked decoder against a plain one. Behind base64 and DES a mutation of the text reaches nothing but noise, so
// most mutations are made on the opened record, its packet and its data in clear, which is then enciphered again under
// the keys that it names.
#include <algorithm>
#include <optional>

#include "encoding_utils.h"
#include "fuzz_input.h"
#include "masked/utils_masked_bits.h"
#include "masked/utils_masked_tables.h"
#include "support/utils_base64.h"

using namespace fuzz;
using namespace ldappw::masking;

extern "C" size_t LLVMFuzzerMutate(uint8_t* data, size_t size, size_t maxSize);

static unsigned draws = 1;

// In place of the system's, so that an input means the same each time. No byte of a draw is zero.
extern "C" int rand_r(unsigned*) noexcept {
  draws = draws * 1664525U + 1013904223U;
  return static_cast<int>(draws >> 1U | 0x01010101U);
}

namespace {

constexpr size_t kBefore = 47;  // data bytes before the packet
constexpr size_t kPacket = 24;  // without the two characters that stand in clear
constexpr size_t kBlockKeyAt = 10;
constexpr size_t kBlockSelectorAt = 11;
constexpr size_t kBlockAt = 16;
constexpr size_t kSelectorAt = 16;
constexpr size_t kKeyAt = 17;
constexpr size_t kWidthAt = 19;
constexpr unsigned kSelectors[] = {1, 7, 11, 0};

struct Opened {
  size_t alphabet = 0;
  bool isKnown = false;
  bool isWhole = false;
  unsigned char packet[kPacket] = {};
  std::string area = std::string(96, '\0');

  unsigned blockSelector() const { return collapseOnBitPattern(packet[kBlockSelectorAt], 0xcc); }
  unsigned selector() const { return collapseOnBitPattern(packet[kSelectorAt], 0x56); }
  unsigned width() const { return collapseOnBitPattern(packet[kWidthAt], 0x3f); }
  unsigned char* data() { return reinterpret_cast<unsigned char*>(area.data()); }
  const unsigned char* data() const { return reinterpret_cast<const unsigned char*>(area.data()); }
  void set(size_t at, unsigned value, unsigned char mask) { packet[at] = expandOnBitPattern(value, packet[at], mask); }
};

// The masks of a width, taken one after another, round and round.
unsigned nextMask(unsigned width, Cursor& cursor) {
  const unsigned char* masks = width == 1 ? scatterArray1 : (width == 2 ? scatterArray2 : scatterArray4);
  const unsigned mask = masks[cursor++];
  if (masks[cursor] == 0) cursor = 0;
  return mask;
}

unsigned gather(const unsigned char* in, Cursor& cursor, unsigned width) {
  unsigned byte = 0;
  for (unsigned at = 0; at < 8; at += width) byte |= collapseOnBitPattern(*in++, nextMask(width, cursor)) << at;
  return byte;
}

void scatter(size_t byte, unsigned char* out, Cursor& cursor, unsigned width) {
  for (unsigned at = 0; at < 8; at += width, ++out) {
    *out = expandOnBitPattern(static_cast<unsigned>(byte) >> at, *out, nextMask(width, cursor));
  }
}

bool isSelector(unsigned selector) {
  return selector == 1 || selector == 7 || selector == 11;
}

void cipher(unsigned char* data, size_t n, unsigned selector, unsigned char keyIndex, int decrypt) {
  static constexpr int kStrides[] = {-13, 7, 23, -1, -13, -17, 5, 5};
  if (!isSelector(selector) || keyIndex == 0xff) return;
  if (selector == 1) {
    const Made<char> changed(simpleCrypt(reinterpret_cast<char*>(data), static_cast<int>(n)));
    std::memcpy(data, changed.get(), n);
    return;
  }
  unsigned char key[8];
  int index = static_cast<signed char>(keyIndex);
  for (int i = 0; i < 8; index += kStrides[i++]) {
    if (index < 0) index = -index - 1;
    if (index > 76) index = 153 - index;
    key[i] = deskeys[index][7 - i];
  }
  uint32_t schedule[32];
  (selector == 7 ? deskey40 : deskey)(schedule, key, decrypt);
  for (size_t i = 0; i + 8 <= n; i += 8) des(schedule, data + i);
}

// A fresh record for a text that holds none.
Opened open(std::string_view text) {
  Opened opened;
  for (size_t i = 0; text.size() > 3 && i < 16; ++i) {
    if (text[2] != encodings[i].identifier[0]) continue;
    opened.alphabet = i;
    opened.isKnown = true;
  }
  const std::string payload(text.size() > 4 ? text.substr(3, text.size() - 4) : "");
  std::string record(ldappw::decodedRoom(payload.size()), '\0');
  auto* bytes = reinterpret_cast<unsigned char*>(record.data());
  record.resize(ldappw::decodeText(payload.data(), payload.size(), encodings[opened.alphabet].alphabet, bytes).bytes);
  opened.isWhole = record.size() >= kBefore + kPacket && record.size() % 8 == kPacket % 8;
  if (record.size() < kBefore + kPacket) return opened;
  record.copy(reinterpret_cast<char*>(opened.packet), kPacket, kBefore);
  opened.area = record.substr(0, kBefore) + record.substr(kBefore + kPacket);
  cipher(opened.packet + kBlockAt, 8, opened.blockSelector(), opened.packet[kBlockKeyAt], 1);
  cipher(opened.data(), opened.area.size() / 8 * 8, opened.selector(), opened.packet[kKeyAt], 1);
  return opened;
}

std::string closed(Opened opened) {
  cipher(opened.data(), opened.area.size(), opened.selector(), opened.packet[kKeyAt], 0);
  cipher(opened.packet + kBlockAt, 8, opened.blockSelector(), opened.packet[kBlockKeyAt], 0);
  const std::string record = opened.area.substr(0, kBefore) +
                             std::string(reinterpret_cast<char*>(opened.packet), kPacket) +
                             opened.area.substr(std::min(kBefore, opened.area.size()));
  const Encoding& encoding = encodings[opened.alphabet];
  std::string text(ldappw::encodedLength(record.size()), '\0');
  ldappw::encodeBytes(reinterpret_cast<const unsigned char*>(record.data()), record.size(), encoding.alphabet,
                      text.data());
  return ">1" + std::string(encoding.identifier) + text + "<";
}

// What a record holds, or nothing when it does not hold together.
std::optional<std::string> gathered(const Opened& opened) {
  const unsigned width = opened.width();
  if (!opened.isWhole || !isSelector(opened.blockSelector()) || !isSelector(opened.selector()) || !isWidth(width)) {
    return {};
  }
  Cursor cursor = 4;
  size_t length = gather(opened.packet, cursor, 4);
  length |= size_t{gather(opened.packet + 2, cursor, 2)} << 8U;
  length |= size_t{gather(opened.packet + 6, cursor, 2)} << 16U;
  if (length * 8 / width > opened.area.size()) return {};
  std::string bytes;
  cursor = 0;
  for (size_t i = 0; i < length; ++i) {
    bytes += static_cast<char>(gather(opened.data() + i * 8 / width, cursor, width));
  }
  return bytes;
}

// Near the most that an area holds at its width, since most lengths are far from it.
void changeLength(Opened& opened, unsigned seed) {
  const size_t most = opened.area.size() * (isWidth(opened.width()) ? opened.width() : 4) / 8;
  const size_t length = seed % 4 == 0 ? seed : most + seed / 4 % 4 - 2;
  Cursor cursor = 4;
  scatter(length, opened.packet, cursor, 4);
  scatter(length >> 8U, opened.packet + 2, cursor, 2);
  scatter(length >> 16U, opened.packet + 6, cursor, 2);
}

void change(Opened& opened, unsigned seed, size_t maxArea) {
  const unsigned value = seed / 16;
  const size_t size = opened.area.size();
  switch (seed % 12) {
    case 0:
      opened.alphabet = value % 16;
      return;
    case 1:
      opened.packet[kBlockKeyAt] = static_cast<unsigned char>(value);
      return;
    case 2:
      opened.packet[kKeyAt] = static_cast<unsigned char>(value);
      return;
    case 3:
      return opened.set(kBlockSelectorAt, kSelectors[value % 4], 0xcc);
    case 4:
      return opened.set(kSelectorAt, kSelectors[value % 4], 0x56);
    case 5:
      return opened.set(kWidthAt, 1U << (value % 4), 0x3f);
    case 6:
      LLVMFuzzerMutate(opened.packet, kPacket, kPacket);
      return;
    case 7:
      opened.area.resize(std::min(maxArea, value % 4 == 0 ? value % 512 : (size / 8 + value % 5) * 8));
      return;
    case 8:
      opened.area.resize(std::max(size, maxArea));
      opened.area.resize(LLVMFuzzerMutate(opened.data(), size, opened.area.size()) / 8 * 8);
      return;
    default:
      return changeLength(opened, value);
  }
}

}  // namespace

extern "C" size_t LLVMFuzzerCustomMutator(uint8_t* data, size_t size, size_t maxSize, unsigned seed) {
  if (seed % 8 == 0 || maxSize < 200) return LLVMFuzzerMutate(data, size, maxSize);
  Opened opened = open({reinterpret_cast<const char*>(data), size});
  change(opened, seed / 8, maxSize / 4 * 3 - kPacket - 8);
  const std::string text = closed(opened);
  return text.copy(reinterpret_cast<char*>(data), maxSize);
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  const std::string_view input(reinterpret_cast<const char*>(data), size);
  const Block text = Block::text(input);
  const std::string given = text.text();
  const bool wrapped = given.size() > 1 && given.front() == '>' && given.back() == '<';
  unsigned char* decoded = nullptr;
  int length = -1;
  const int rc = _morva_utils_decode_binary(text.text(), &decoded, &length);
  require(rc == 0 || rc == 89);
  require(text.text() == given.substr(0, given.size() - wrapped));
  if (wrapped && given[1] == '1') {
    const Opened opened = open(given);
    const std::optional<std::string> expected = gathered(opened);
    require(rc == (opened.isKnown && !expected ? 89 : 0) && (decoded != nullptr) == (opened.isKnown && expected));
    require(decoded == nullptr || *expected == std::string(decoded, decoded + length));
  }
  if (decoded != nullptr) {
    require(rc == 0 && length >= 0 && (!wrapped || decoded[length] == '\0'));
    char* masked = nullptr;  // what comes out goes in again
    unsigned char* again = nullptr;
    int lengthAgain = -1;
    require(_morva_utils_encode_binary(decoded, length, &masked) == 0);
    require(std::strlen(masked) + 1 == static_cast<size_t>(_morva_utils_getEncodedSize(length)));
    require(_morva_utils_decode_binary(masked, &again, &lengthAgain) == 0 && lengthAgain == length);
    require(std::memcmp(decoded, again, static_cast<size_t>(length)) == 0);
    _morva_utils_decode_binary_free(&again);
    _morva_utils_encode_binary_free(&masked);
  }
  _morva_utils_decode_binary_free(&decoded);
  require(decoded == nullptr);
  return 0;
}
