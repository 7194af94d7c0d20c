// SPDX-License-Identifier: Apache-2.0
// The masked encoding: recorded texts under fixed draws, records that name no key, damage and other hostile input.
#include <gtest/gtest.h>

#include <climits>
#include <random>

#include "encoding_utils.h"
#include "oracle.h"

static std::mt19937 numbers(1);
static int fixedDraw = 0;  // 0: random numbers

// In place of the system's, for the product's draws of background, keys and alphabets.
extern "C" int rand_r(unsigned*) noexcept {
  return fixedDraw != 0 ? fixedDraw : static_cast<int>(numbers() >> 1U);
}

namespace {

struct Result {
  int rc;
  int length;
  std::string data;  // with the byte behind it; "(null)" for none
};

Result decoded(std::string text) {
  const bool wrapped = text.size() > 1 && text.front() == '>' && text.back() == '<';
  Result result{-1, -1, "(null)"};
  unsigned char* data = nullptr;
  result.rc = _morva_utils_decode_binary(text.data(), &data, &result.length);
  // clear text counts its terminator
  if (data != nullptr) result.data.assign(reinterpret_cast<char*>(data), static_cast<size_t>(result.length + wrapped));
  EXPECT_EQ(std::strlen(text.c_str()), text.size() - wrapped) << "a wrapped text loses its last character";
  _morva_utils_decode_binary_free(&data);
  EXPECT_EQ(data, nullptr);
  return result;
}

std::string encoded(const std::string& data) {
  char* text = nullptr;
  EXPECT_EQ(_morva_utils_encode_binary(test::bytesOf(data), static_cast<int>(data.size()), &text), 0);
  const std::string copy = test::taken(text);
  EXPECT_EQ(copy.size() + 1, static_cast<size_t>(_morva_utils_getEncodedSize(static_cast<int>(data.size()))));
  return copy;
}

std::string digestOf(const std::string& data) {
  const std::string digest = test::opensslDigest("SHA1", data);
  return test::toHex(digest.data(), digest.size());
}

// A second implementation took these texts apart before their digests were recorded.
TEST(Masking, TextsAreTheRecordedOnes) {
  static const struct {
    const char* name;
    int selector;
    size_t length;
    int draws;  // as many texts, each under another draw
    const char* digest;
  } rows[] = {
      {"the most for width 1, every key and alphabet", 11, 12, 77, "b1f16cce492a71cbc62bd7f4fa9d8d5f79e19db0"},
      {"the least for width 2", 11, 13, 1, "55c989fcc7fad2b26bd01f46ce32eb9ef884caa7"},
      {"the most for width 2", 11, 24, 1, "8f24d28051898b3f09a1d932669e7a366e63ff1d"},
      {"the least for width 4", 11, 25, 1, "c7d818968e1b196faebf140f4d2537278c7aecbf"},
      {"the most in the smallest area", 11, 48, 1, "363a39c527cc2e088b610ce8e4fbe9b1c3f7043f"},
      {"the least in a larger area", 11, 49, 1, "4fe907921f822fad4c9705394c8800c3182f34d7"},
      {"a length of three bytes", 11, 70000, 1, "feb2e50055c13a4806e657b2667a1b2ebaa05b28"},
      {"reduced reading", 7, 20, 1, "5c03b3213f539e021c26c0da625e7d9b86ba5042"},
      {"no key", 1, 20, 16, "23a75f3fe3cdc4d7d6201bc66428fcc29f85be7a"},
  };
  for (const auto& row : rows) {
    SCOPED_TRACE(row.name);
    const test::Replaced<int> chosen(encryptionType, row.selector);
    const std::string data = test::letters(row.length);
    std::string texts;
    for (int i = 0; i < row.draws; ++i) {
      const test::Replaced<int> draw(fixedDraw, 0x17002a5b + i * 0x10001);  // the first holds a NUL, as no background
      const std::string text = encoded(data);
      EXPECT_EQ(decoded(text).data == data + '\0', row.selector != 7);  // what 7 masks is read with another schedule
      texts += text;
    }
    EXPECT_EQ(digestOf(texts), row.digest);
  }
}

using Patches = std::vector<std::pair<size_t, int>>;  // a byte of the packet, from 2 on, and its value

// A record that names no key, so that its bytes stand in clear: data bytes of zero, of which 10 count, with their
// packet between them; changed and cut or filled up to the size.
std::string textOf(const Patches& patches, size_t size = 120) {
  std::string record(size, '\0');
  Patches all = {{2, 0x42}, {12, 0xff}, {13, 0x8c}, {18, 0x46}, {19, 0xff}, {21, 4}};
  all.insert(all.end(), patches.begin(), patches.end());
  for (const auto& [at, value] : all) {
    if (at + 45 < size) record[at + 45] = static_cast<char>(value);
  }
  return ">10" + test::opensslBase64(record) + "<";
}

TEST(Masking, DecodesOrRefuses) {
  static const struct {
    const char* name;
    std::string text;
    int rc = 0;
    int length = 0;
    std::string data = "(null)";
  } rows[] = {
      {"nothing", "", 0, 1, ""},
      {"not closed", ">1abc", 0, 6, ">1abc"},
      {"plain base64", ">xQUJD<", 0, 3, "ABC"},
      {"older form", ">0Fl0ECgFC<", 0, 6, "secret"},
      {"older form with padding inside", ">0Fg==Fl0E<", 0, 4, "s8gn"},
      {"plain base64 with padding inside", ">x=z==<", 0, 0, ""},
      {"no alphabet", ">1<"},
      {"unknown alphabet", ">1?QUJD<"},
      {"empty record", ">10<", 89},
      {"shortest record", textOf({}, 72), 0, 10, ""},
      {"all that width 4 holds", textOf({{2, 0x00}, {3, 0x18}}), 0, 48, ""},
      {"all that width 2 holds", textOf({{2, 0x40}, {3, 0x08}, {21, 2}}), 0, 24, ""},
      {"all that width 1 holds", textOf({{2, 0x48}, {21, 1}}), 0, 12, ""},
      {"one more than width 4 holds", textOf({{2, 0x01}, {3, 0x18}}), 89},
      {"one more than width 1 holds", textOf({{2, 0x49}, {21, 1}}), 89},
      {"a length of three bytes", textOf({{8, 0x02}}), 89},
      {"width 3", textOf({{21, 3}}), 89},
      {"selector 0", textOf({{18, 0x00}}), 89},
      {"block selector 10", textOf({{13, 0x88}}), 89},
      {"a byte short", textOf({}, 119), 89},
      {"a byte long", textOf({}, 121), 89},
      {"a cut packet", textOf({}, 64), 89},
  };
  for (const auto& row : rows) {
    SCOPED_TRACE(row.name);
    const Result result = decoded(row.text);
    EXPECT_EQ(result.rc, row.rc);
    EXPECT_EQ(result.length, row.length);
    EXPECT_EQ(result.data.c_str(), row.data);
  }
}

// Recorded as the texts above were. The key indexes that no encoder draws are reflected into the table.
TEST(Masking, DeciphersUnderEveryKeyIndex) {
  std::string data;
  for (const int selector : {0x02, 0x16, 0x46}) {
    for (int key = 0; key < 256; ++key) {
      data += decoded(textOf({{2, 0}, {3, 0x18}, {18, selector}, {19, key}})).data.substr(0, 48);
    }
  }
  EXPECT_EQ(digestOf(data), "fd427472fdf3f06953349409487296e17b619221");
}

TEST(Masking, EveryLengthComesBackAndDamageIsSurvived) {
  for (size_t length = 0; length <= 300; ++length) {
    const std::string data = test::randomBytes(numbers, length);
    const std::string sound = encoded(data);
    EXPECT_EQ(decoded(sound).data, data + '\0') << length;
    for (int round = 0; round < 60; ++round) {
      std::string text = sound;
      for (size_t n = numbers() % 4; n > 0; --n) text[numbers() % text.size()] = static_cast<char>(numbers());
      if (numbers() % 4 == 0) text.erase(numbers() % text.size(), numbers() % 40);
      if (numbers() % 4 == 0) text.insert(numbers() % (text.size() + 1), test::randomBytes(numbers, numbers() % 8));
      const Result result = decoded(text.c_str());
      ASSERT_TRUE(result.rc == 0 || (result.rc == 89 && result.data == "(null)")) << result.rc;
    }
  }
}

TEST(Masking, RefusesLengthsAndSelectors) {
  char* out = nullptr;
  EXPECT_EQ(_morva_utils_encode_buffer(std::string(16777215, 'x').c_str(), &out), 80);
  EXPECT_EQ(_morva_utils_encode_binary(test::bytesOf("x"), 16777216, &out), 80);
  for (const int selector : {0, 2, 12, -1}) {
    const test::Replaced<int> chosen(encryptionType, selector);
    EXPECT_EQ(_morva_utils_encode_buffer("x", &out), 89);
  }
  EXPECT_EQ(out, nullptr);
  EXPECT_EQ(_morva_utils_getEncodedSize(16777215), 44739281);  // ceil((33554432 + 24) / 3) * 4 + 5
  EXPECT_EQ(_morva_utils_getEncodedSize(INT_MIN) + _morva_utils_getEncodedSize(-1), 2 * 165);
  EXPECT_EQ(_morva_utils_getEncodedSize(805306352), 2147483645);
  EXPECT_EQ(_morva_utils_getEncodedSize(805306353) + _morva_utils_getEncodedSize(INT_MAX), 0);
}

}  // namespace
