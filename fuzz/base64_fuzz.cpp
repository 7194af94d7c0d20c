// SPDX-License-Identifier: Apache-2.0
// Base64 over any alphabet in both directions and the compaction, against the plainest way of each: a search through
// the alphabet for every character.
#include "encoding_utils.h"
#include "fuzz_input.h"

using namespace fuzz;

namespace {

std::string plainlyEncoded(std::string_view bytes, const char* alphabet) {
  std::string text;
  for (size_t i = 0; i < bytes.size(); i += 3) {
    unsigned group = 0;
    for (size_t j = 0; j < 3; ++j)
      group = group << 8U | (i + j < bytes.size() ? static_cast<unsigned char>(bytes[i + j]) : 0U);
    for (size_t j = 0; j < 4; ++j) text += i + j <= bytes.size() ? alphabet[(group >> (18 - 6 * j)) & 63U] : '=';
  }
  return text;
}

struct Decoded {
  unsigned length = 0;
  std::string bytes;  // three for each group, whatever it counts
};

Decoded plainlyDecoded(std::string_view text, const std::string& alphabet) {
  static constexpr unsigned kBytes[] = {0, 1, 1, 2, 3};
  const std::string places = alphabet + '=';
  Decoded result;
  for (size_t i = 0; i < text.size(); i += 4) {
    size_t index[4];
    unsigned firstPad = 4;
    for (unsigned j = 4; j-- > 0;) {
      const size_t place = places.find(i + j < text.size() ? text[i + j] : '=');
      index[j] = place == std::string::npos ? places.size() : place;
      if (index[j] != 64) continue;
      index[j] = 0;
      firstPad = j;
    }
    const unsigned bytes = kBytes[firstPad];
    result.length += bytes;
    result.bytes += static_cast<char>(index[0] << 2U | ((index[1] >> 4U) & 3U));
    result.bytes += bytes >= 2 ? static_cast<char>((index[1] & 15U) << 4U | ((index[2] >> 2U) & 15U)) : '\0';
    result.bytes += bytes == 3 ? static_cast<char>((index[2] & 3U) << 6U | index[3]) : '\0';
  }
  return result;
}

void tryAlphabet(std::string_view payload, const Block& alphabet) {
  const Block text = Block::text(payload);
  const std::string used = alphabet.text();
  unsigned length = 0;
  const Made<unsigned char> decoded(stringToBinaryBlob(text.text(), &length, alphabet.text()));
  const Decoded expected = plainlyDecoded(text.text(), used);
  require(decoded != nullptr && length == expected.length);
  require(std::memcmp(decoded.get(), expected.bytes.data(), expected.bytes.size()) == 0);
  require(decoded.get()[expected.bytes.size()] == '\0');

  const Block data(payload);
  const Made<char> encoded(binaryBlobToString(data.bytes(), data.length(), alphabet.text()));
  require((encoded != nullptr) == (used.size() >= 64));
  if (encoded) require(encoded.get() == plainlyEncoded(payload, used.c_str()));

  std::string kept;
  for (const char* c = text.text(); *c != '\0'; ++c)
    kept += used.find(*c) != std::string::npos ? std::string(1, *c) : "";
  const Made<char> compacted(compactToOnlyString(text.text(), alphabet.text()));
  require((compacted != nullptr) == !kept.empty() && (!compacted || compacted.get() == kept));
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  Input input(data, size);
  const Block alphabet = Block::text(input.counted());
  const std::string_view payload = input.rest();
  tryAlphabet(payload, Block::text(pBase64));
  tryAlphabet(payload, alphabet);
  return 0;
}
