// SPDX-License-Identifier: Apache-2.0
// Base64 and DES. Expected values are published vectors, OpenSSL's answers, or those of slow models written here bit by
// bit.
#include "encoding_utils.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <random>

#include "masking_tables.h"
#include "oracle.h"
#include "support.h"

namespace {

using test::AllocationWatch;
using test::bytesOf;
using test::fromHex;
using test::Guarded;
using test::opensslDes;
using test::randomBytes;
using test::Replaced;
using test::taken;
using test::toHex;
namespace masking = ldappw::masking;

// ---- Base64 ----

struct Blob {
  unsigned length;
  std::string buffer;  // all of it: what lies behind the length too
};

Blob decoded(const std::string& text, const char* alphabet = nullptr) {
  unsigned length = 99;
  Guarded guarded(text + '\0');
  unsigned char* data = alphabet == nullptr ? base64ToBinaryBlob(guarded.data(), &length)
                                            : stringToBinaryBlob(guarded.data(), &length, alphabet);
  Blob blob{length, std::string(reinterpret_cast<char*>(data), text.size() / 4 * 3 + 4)};
  free(data);
  return blob;
}

// Group by group, each character's place found by a search of the alphabet.
Blob modelDecoded(const std::string& text, const std::string& alphabet) {
  Blob blob{0, std::string(text.size() / 4 * 3 + 4, '\0')};
  const std::string withPad = alphabet + "=";
  for (size_t i = 0, j = 0; i < text.size(); i += 4, j += 3) {
    size_t index[4];
    size_t firstPad = 4;
    for (size_t k = 4; k-- > 0;) {
      const char c = i + k < text.size() ? text[i + k] : '=';
      index[k] = std::min(withPad.find(c), withPad.size());
      if (index[k] != 64) continue;
      index[k] = 0;
      firstPad = k;
    }
    const unsigned yields = firstPad == 4 ? 3 : firstPad == 3 ? 2 : firstPad == 0 ? 0 : 1;
    blob.length += yields;
    blob.buffer[j] = static_cast<char>(index[0] << 2 | (index[1] >> 4 & 3));
    if (yields >= 2) blob.buffer[j + 1] = static_cast<char>((index[1] & 15) << 4 | (index[2] >> 2 & 15));
    if (yields == 3) blob.buffer[j + 2] = static_cast<char>((index[2] & 3) << 6 | index[3]);
  }
  return blob;
}

TEST(Base64, AgreesWithOpensslAtEveryLength) {
  std::mt19937 random(1);
  for (int length = 0; length <= 200; ++length) {
    SCOPED_TRACE(length);
    const std::string data = randomBytes(random, static_cast<size_t>(length));
    const std::string expected = test::opensslBase64(data);
    Guarded guarded(data);
    const auto* in = reinterpret_cast<unsigned char*>(guarded.data());
    EXPECT_EQ(taken(binaryBlobToBase64(in, length)), expected);
    const Blob blob = decoded(expected);
    EXPECT_EQ(blob.buffer.substr(0, blob.length), data);
    EXPECT_EQ(blob.buffer.find_first_not_of('\0', blob.length), std::string::npos) << "not terminated";
  }
}

TEST(Base64, DecodesOddTextsByTheirPlaces) {
  static const struct {
    const char* text;
    unsigned length;
    const char* buffer;
  } rows[] = {
      {"", 0, "00000000"},              // a usable buffer all the same
      {"Zm9vYmFy", 6, "666f6f626172"},  // RFC 4648, section 10; so the next two
      {"Zm9vYg==", 4, "666f6f62"},      //
      {"Zm9vYmE=", 5, "666f6f6261"},    //
      {"A===", 1, "00"},                // a pad in the second place leaves one byte
      {"ZA=A", 1, "64"},                // so does one in the third, whatever follows
      {"====", 0, "000000"},            // the first byte is written, the count is 0
      {"=/AA", 0, "030000"},            // with the bits of the second character
      {"QQ==QUJD", 4, "410000414243"},  // a pad within the text leaves a gap behind its group
      {"Z", 1, "64"},                   // what a short group lacks counts as "="
      {"Zg", 1, "66"},                  //
      {"Zm8", 2, "666f"},               //
      {"Zm9vYm", 4, "666f6f62"},        //
      {"A-AA", 3, "001000"},            // a foreign character is 65, whose bits spill over
      {"---A", 3, "041040"},            //
      {"AAA-", 3, "000041"},            //
      {"\xff\xfe\n A", 4, "04104100"}   //
  };
  for (const auto& row : rows) {
    SCOPED_TRACE(row.text);
    const Blob blob = decoded(row.text);
    EXPECT_EQ(blob.length, row.length);
    const std::string start = fromHex(row.buffer);
    EXPECT_EQ(toHex(blob.buffer.data(), start.size()), row.buffer);
  }
}

TEST(Base64, TakesAnyAlphabet) {
  std::mt19937 random(2);
  const std::string standard = pBase64;
  EXPECT_EQ(standard, "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/");
  EXPECT_EQ(standard + "=", pBase64Find);
  const std::string symbols = standard + "=-\n";
  const std::string alphabets[] = {standard,
                                   std::string(standard.rbegin(), standard.rend()),
                                   standard + "-_more",
                                   std::string(pBase64Find),
                                   masking::encodings[5].alphabet,
                                   standard.substr(0, 63)};
  for (const std::string& alphabet : alphabets) {
    SCOPED_TRACE(alphabet);
    for (int round = 0; round < 300; ++round) {
      std::string text;
      for (size_t n = random() % 20; n > 0; --n) text += symbols[random() % (round % 2 != 0 ? 64 : symbols.size())];
      const Blob blob = decoded(text, alphabet.c_str());
      const Blob expected = modelDecoded(text, alphabet);
      ASSERT_EQ(blob.length, expected.length) << text;
      ASSERT_EQ(blob.buffer, expected.buffer) << text;
    }
    char* text = binaryBlobToString(bytesOf(standard), 48, alphabet.c_str());
    ASSERT_EQ(text == nullptr, alphabet.size() < 64);
    if (text != nullptr) {
      EXPECT_EQ(decoded(text, alphabet.c_str()).buffer.substr(0, 48), standard.substr(0, 48));
    }
    free(text);
  }
  const Replaced<const char*> other(pBase64, alphabets[1].c_str());  // read at call time
  EXPECT_EQ(taken(binaryBlobToBase64(bytesOf("\xff\xff\xff"), 3)), "AAAA");
  EXPECT_EQ(decoded("AAAA").buffer.substr(0, 3), "\xff\xff\xff");
}

TEST(Base64, RefusesWhatIsMissing) {
  unsigned length = 7;
  EXPECT_EQ(taken(binaryBlobToBase64(nullptr, 0)), "");
  EXPECT_EQ(taken(binaryBlobToBase64(bytesOf("a"), -1)), "");
  EXPECT_EQ(binaryBlobToBase64(nullptr, 1), nullptr);
  EXPECT_EQ(binaryBlobToString(bytesOf("a"), 1, nullptr), nullptr);
  EXPECT_EQ(base64ToBinaryBlob(nullptr, &length), nullptr);
  EXPECT_EQ(base64ToBinaryBlob("AAAA", nullptr), nullptr);
  EXPECT_EQ(stringToBinaryBlob("AAAA", &length, nullptr), nullptr);
  EXPECT_EQ(compactToOnlyString(nullptr, pBase64), nullptr);
  EXPECT_EQ(compactToOnlyString("A", nullptr), nullptr);
  const AllocationWatch watch(0);
  EXPECT_EQ(binaryBlobToBase64(bytesOf("a"), 1), nullptr);
  const AllocationWatch again(0);
  EXPECT_EQ(base64ToBinaryBlob("AAAA", &length), nullptr);
}

TEST(Base64, CompactsAndTellsOnStandardOutput) {
  static const struct {
    const char *text, *result, *output;
    long failing;
  } rows[] = {
      {"ab=c\ndef", "abcdef", "", -1},
      {"==a=", "a", "", -1},
      {"==", "(null)", "No base64 characters found in input buf ==\n", -1},
      {"", "(null)", "No base64 characters found in input buf \n", -1},
      {"=\nab=c", "(null)", "Could not malloc buffer of size 4.\n", 0},
  };
  for (const auto& row : rows) {
    SCOPED_TRACE(row.text);
    testing::internal::CaptureStdout();
    char* result = nullptr;
    {
      const AllocationWatch watch(row.failing);
      result = compactToOnlyBase64(row.text);
    }
    EXPECT_EQ(testing::internal::GetCapturedStdout(), row.output);
    EXPECT_EQ(taken(result), row.result);
  }
  EXPECT_EQ(taken(compactToOnlyString("hello world", "lo")), "llool");
}

// ---- DES ----

using Schedule = std::array<uint32_t, 32>;
using Builder = void (*)(uint32_t*, const unsigned char*, int);

Schedule scheduleOf(Builder builder, const std::string& key, int decrypt) {
  Guarded guarded(key);
  Schedule schedule;
  builder(schedule.data(), reinterpret_cast<unsigned char*>(guarded.data()), decrypt);
  return schedule;
}

std::string crypted(const Schedule& schedule, std::string block) {
  for (size_t i = 0; i < block.size(); i += 8) des(schedule.data(), reinterpret_cast<unsigned char*>(&block[i]));
  return block;
}

TEST(Des, GivesThePublishedAnswers) {
  static const struct {
    const char *source, *key, *clear, *cipher;
  } rows[] = {
      {"SP 800-17 table 1", "0101010101010101", "8000000000000000", "95f8a5e5dd31d900"},
      {"SP 800-17 table 1, last", "0101010101010101", "0000000000000001", "166b40b44aba4bd6"},
      {"SP 800-17 table 2", "8001010101010101", "0000000000000000", "95a8d72813daa94d"},
      {"SP 800-17 table 3", "1046913489980131", "0000000000000000", "88d55e54f54c97b4"},
      {"SP 800-17 table 4", "7ca110454a1a6e57", "01a1d6d039776742", "690f5b0d9a26939b"},
      {"FIPS 81, table B1", "0123456789abcdef", "4e6f772069732074", "3fa40e8a984d4815"},
  };
  for (const auto& row : rows) {
    SCOPED_TRACE(row.source);
    const std::string key = fromHex(row.key);
    const std::string cipher = crypted(scheduleOf(deskey, key, 0), fromHex(row.clear));
    EXPECT_EQ(toHex(cipher.data(), 8), row.cipher);
    EXPECT_EQ(crypted(scheduleOf(deskey, key, 1), cipher), fromHex(row.clear));
  }
}

TEST(Des, AgreesWithOpensslSingleAndTriple) {
  std::mt19937 random(3);
  for (int round = 0; round < 200; ++round) {
    const std::string keys = randomBytes(random, 24);
    const std::string clear = randomBytes(random, 8);
    const std::string key = keys.substr(0, 8);
    EXPECT_EQ(crypted(scheduleOf(deskey, key, 0), clear), opensslDes(key, clear, true));
    for (const int decrypt : {0, 1}) {
      std::array<Schedule, 3> three;
      Guarded guarded(keys);
      des3key(three[0].data(), reinterpret_cast<unsigned char*>(guarded.data()), decrypt);
      const std::string result = crypted(three[2], crypted(three[1], crypted(three[0], clear)));
      EXPECT_EQ(result, opensslDes(keys, clear, decrypt == 0));
    }
  }
}

// The key schedule of FIPS 46-3 bit by bit, with as many key bits and round key bits as asked for.
Schedule modelSchedule(const std::string& key, unsigned keyBits, unsigned roundKeyBits) {
  static const unsigned pc1[56] = {57, 49, 41, 33, 25, 17, 9,  1,  58, 50, 42, 34, 26, 18, 10, 2,  59, 51, 43,
                                   35, 27, 19, 11, 3,  60, 52, 44, 36, 63, 55, 47, 39, 31, 23, 15, 7,  62, 54,
                                   46, 38, 30, 22, 14, 6,  61, 53, 45, 37, 29, 21, 13, 5,  28, 20, 12, 4};
  static const unsigned pc2[48] = {14, 17, 11, 24, 1,  5,  3,  28, 15, 6,  21, 10, 23, 19, 12, 4,
                                   26, 8,  16, 7,  27, 20, 13, 2,  41, 52, 31, 37, 47, 55, 30, 40,
                                   51, 45, 33, 48, 44, 49, 39, 56, 34, 53, 46, 42, 50, 36, 29, 32};
  static const unsigned shifts[16] = {1, 1, 2, 2, 2, 2, 2, 2, 1, 2, 2, 2, 2, 2, 2, 1};
  std::vector<bool> selected(56);
  for (unsigned j = 0; j < keyBits; ++j) {
    selected[j] = (static_cast<unsigned char>(key[(pc1[j] - 1) / 8]) >> (7 - (pc1[j] - 1) % 8) & 1) != 0;
  }
  Schedule schedule{};
  unsigned rotation = 0;
  for (unsigned round = 0; round < 16; ++round) {
    rotation += shifts[round];
    std::vector<bool> rotated(56);
    for (unsigned j = 0; j < keyBits; ++j) {
      unsigned from = j + rotation;
      if (from >= (j < 28 ? 28 : keyBits)) from -= 28;
      rotated[j] = selected[from];
    }
    for (unsigned n = 0; n < roundKeyBits; ++n) {
      const unsigned group = n / 6;
      if (rotated[pc2[n] - 1]) schedule[2 * round + group % 2] |= 1U << (24 - group / 2 * 8 + 5 - n % 6);
    }
  }
  return schedule;
}

Schedule backwards(const Schedule& schedule) {
  Schedule result;
  for (unsigned i = 0; i < 32; ++i) result[i] = schedule[(15 - i / 2) * 2 + i % 2];
  return result;
}

TEST(Des, SchedulesAreThoseOfTheModel) {
  std::mt19937 random(4);
  for (int round = 0; round < 200; ++round) {
    const std::string key = randomBytes(random, 8);
    std::string otherParity = key;
    for (char& byte : otherParity) byte = static_cast<char>(byte ^ 1);
    const Schedule full = modelSchedule(key, 56, 48);
    const Schedule reduced = modelSchedule(key, 40, 32);
    EXPECT_EQ(scheduleOf(deskey, otherParity, 0), full);
    EXPECT_EQ(scheduleOf(deskey56, key, 0), full);
    EXPECT_EQ(scheduleOf(deskey56, key, -3), backwards(full));
    EXPECT_EQ(scheduleOf(deskey40, otherParity, 0), reduced);
    EXPECT_EQ(scheduleOf(deskey40, key, 1), backwards(reduced));
  }
  // The round keys 1 and 16 of this key are those of a worked example that many text books print.
  const Schedule known = scheduleOf(deskey, fromHex("133457799bbcdff1"), 0);
  EXPECT_EQ(known[0], 0x060b3f01U);
  EXPECT_EQ(known[1], 0x302f0732U);
  EXPECT_EQ(known[30], 0x3236031fU);
  EXPECT_EQ(known[31], 0x330b2135U);
}

TEST(Des, ScalesEveryWordForByteOffsets) {
  const std::string key = fromHex("133457799bbcdff1133457799bbcdff2133457799bbcdff4");
  std::array<uint32_t, 128> plain;
  std::array<uint32_t, 128> scaled;
  const auto build = [&key](std::array<uint32_t, 128>& words) {
    des3key(words.data(), bytesOf(key), 0);
    deskey40(&words[96], bytesOf(key), 1);
  };
  build(plain);
  const Replaced<int> scaling(Asmversion, 7);
  build(scaled);
  for (size_t i = 0; i < 128; ++i) EXPECT_EQ(scaled[i], plain[i] * 4) << i;
}

TEST(SimpleCrypt, EntersTheKeyTextAtItsFifthCharacter) {
  EXPECT_STREQ(pEncrypt, "ujzde8gxd6ncf10epf91dhodzdoc9is0j8ht9lgmx&9edn581u33xtplpf");
  const std::string stream = "e8gxd6ncf10epf91dhodzdoc9is0j8ht9lgmx&9edn581u33xtplpfujzde8";
  ASSERT_EQ(stream.size(), 60U);
  Guarded zeros(std::string(60, '\0'));
  EXPECT_EQ(taken(simpleCrypt(zeros.data(), 60)), stream);
  char* undone = simpleCrypt(stream.data(), 60);
  EXPECT_EQ(std::string(undone, 61), std::string(61, '\0'));
  free(undone);
  EXPECT_EQ(taken(simpleCrypt("abc", 0)), "");
  EXPECT_EQ(taken(simpleCrypt(nullptr, -1)), "");
  EXPECT_EQ(simpleCrypt(nullptr, 1), nullptr);
  const AllocationWatch watch(0);
  EXPECT_EQ(simpleCrypt("abc", 3), nullptr);
}

}  // namespace
