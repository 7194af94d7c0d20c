// SPDX-License-Identifier: Apache-2.0
// Base64 and DES, against published vectors and OpenSSL's answers.
#include "encoding_utils.h"

#include <array>

#include "crypt/crypto_des.h"
#include "masked/utils_masked_tables.h"
#include "oracle.h"
#include "support.h"
#include "support/utils_base64.h"

using namespace std::string_literals;
using namespace test;

namespace {

const std::string kStandard = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";

TEST(Base64, AgreesWithOpensslInAnyAlphabetAtEveryLength) {
  std::mt19937 random(1);
  EXPECT_EQ(pBase64Find, kStandard + "=");
  const std::string reversed(kStandard.rbegin(), kStandard.rend());
  for (const std::string& alphabet : {kStandard, reversed, std::string(ldappw::masking::encodings[5].alphabet)}) {
    const Replaced<const char*> exchanged(pBase64, alphabet.c_str());  // read at call time
    for (size_t n = 0; n <= 200; ++n) {
      SCOPED_TRACE(n);
      const std::string data = randomBytes(random, n);
      std::string text = opensslBase64(data);
      for (char& c : text) c = c == '=' ? c : alphabet[kStandard.find(c)];
      Guarded guarded(data);
      char* encoded = binaryBlobToBase64(bytesOf(guarded.data()), static_cast<int>(n));
      EXPECT_EQ(std::string(encoded, n / 3 * 4 + 5), text + std::string(n / 3 * 4 + 5 - text.size(), '\0'));
      free(encoded);
      unsigned length = 0;
      unsigned char* blob = base64ToBinaryBlob(text.c_str(), &length);
      EXPECT_EQ(std::string(reinterpret_cast<char*>(blob), length + 1), data + '\0');
      free(blob);
    }
  }
}

TEST(Base64, DecodesOddTextsByTheirPlaces) {
  const struct {
    const char* text;
    unsigned length;
    const char* buffer;
    std::string alphabet;
  } rows[] = {
      {"", 0, "00000000", kStandard},                        // a usable buffer all the same
      {"A===", 1, "00", kStandard},                          // a pad in the second place leaves one byte
      {"ZA=A", 1, "64", kStandard},                          // so does one in the third, whatever follows
      {"=/AA", 0, "030000", kStandard},                      // the first byte is written, the count is 0
      {"QQ==QUI=QUJD", 6, "410000414200414243", kStandard},  // a pad within the text leaves a gap behind its group
      {"Z", 1, "64", kStandard},                             // what a short group lacks counts as "="
      {"A-AA", 3, "001000", kStandard},                      // a foreign character is 65, whose bits spill over
      {"\xff\xfe\n A", 4, "04104100", kStandard},            //
      {"AA--", 1, "00", kStandard + "-"},                    // the 65th place is that of the pad, whatever stands there
      {"AAA=", 3, "000041", kStandard + "-"},                // and the pad comes after it
      {"AAA=", 3, "00003f", kStandard.substr(0, 63)},        //
      {"BAAA", 3, "040000", "ABAB"},                         // the first of several places counts
  };
  for (const auto& row : rows) {
    SCOPED_TRACE(row.text);
    unsigned length = 99;
    Guarded text(row.text + std::string(1, '\0'));
    unsigned char* blob = stringToBinaryBlob(text.data(), &length, row.alphabet.c_str());
    EXPECT_EQ(length, row.length);
    EXPECT_EQ(toHex(blob, std::strlen(row.buffer) / 2), row.buffer);  // behind the length too
    free(blob);
  }
}

std::string encoded(decltype(ldappw::encodeBytes) encode, const std::string& data, const char* alphabet) {
  Guarded guarded(data);
  std::string out(ldappw::encodedLength(data.size()) + 1, '!');
  encode(bytesOf(guarded.data()), data.size(), alphabet, out.data());
  return out;
}

std::string decoded(decltype(ldappw::decodeText) decode, const std::string& text, const char* alphabet) {
  Guarded guarded(text);
  std::string out(ldappw::decodedRoom(text.size()), '!');
  const auto [bytes, isClean] = decode(guarded.data(), text.size(), alphabet, bytesOf(out));
  return toHex(out.data(), out.size()) + (isClean ? " clean " : " odd ") + std::to_string(bytes);
}

TEST(Base64, IsThatOfThePlainWayWhateverTextAndAlphabet) {
  const std::string rest = kStandard.substr(1);
  const std::string others[] = {kStandard,     rest + '\x80',      rest + '=',
                                '\x1f' + rest, rest + "\x7f more", std::string(64, 'a')};
  std::vector<const char*> alphabets{pBase64, ldappw::masking::encodings[5].alphabet};
  for (const std::string& other : others) alphabets.push_back(other.c_str());
  const std::string odd = "=-_ \n\x1f\x7f\x80\xff"s + '\0';
  std::mt19937 random(2);
  for (size_t round = 0; round < 9000; ++round) {
    const char* alphabet = alphabets[round % alphabets.size()];
    const std::string data = randomBytes(random, random() % 90);
    std::string text = encoded(ldappw::encodePlainly, data, alphabet);
    EXPECT_EQ(encoded(ldappw::encodeBytes, data, alphabet), text);
    text.resize(text.size() - 1 - (round % 3 == 0 && !data.empty() ? random() % 4 : 0));
    for (size_t faults = random() % 3; faults > 0 && !text.empty(); --faults)
      text[random() % text.size()] = odd[random() % odd.size()];
    EXPECT_EQ(decoded(ldappw::decodeText, text, alphabet), decoded(ldappw::decodePlainly, text, alphabet)) << text;
  }
}

TEST(Base64, CompactsAndTellsOnStandardOutput) {
  testing::internal::CaptureStdout();
  EXPECT_EQ(taken(compactToOnlyBase64("=ab=c\ndef=")), "abcdef");
  EXPECT_EQ(taken(compactToOnlyString("hello world", "lo")), "llool");
  EXPECT_EQ(compactToOnlyBase64("=="), nullptr);
  for (const int length : {0, -1}) EXPECT_EQ(taken(binaryBlobToBase64(nullptr, length)), "");
  EXPECT_EQ(binaryBlobToString(bytesOf("a"), 1, kStandard.substr(1).c_str()), nullptr);
  const AllocationWatch watch(0);
  EXPECT_EQ(compactToOnlyBase64("=\nab=c"), nullptr);
  EXPECT_EQ(testing::internal::GetCapturedStdout(),
            "No base64 characters found in input buf ==\nCould not malloc buffer of size 4.\n");
}

using Schedule = std::array<uint32_t, 32>;

Schedule scheduleOf(decltype(&deskey) builder, const std::string& key, int decrypt) {
  Guarded guarded(key);
  Schedule schedule;
  builder(schedule.data(), bytesOf(guarded.data()), decrypt);
  return schedule;
}

std::string crypted(const Schedule& schedule, std::string block) {
  des(schedule.data(), bytesOf(block));
  return block;
}

TEST(Des, AgreesWithOpensslSingleAndTriple) {
  std::mt19937 random(3);
  for (int round = 0; round < 200; ++round) {
    const std::string keys = randomBytes(random, 24);
    const std::string clear = randomBytes(random, 8);
    const std::string key = keys.substr(0, 8);
    const std::string cipher = opensslDes(key, clear, true);
    EXPECT_EQ(crypted(scheduleOf(deskey, key, 0), clear), cipher);
    EXPECT_EQ(crypted(scheduleOf(deskey56, key, -3), cipher), clear);
    for (const int decrypt : {0, 1}) {
      std::array<Schedule, 3> three;
      Guarded guarded(keys);
      des3key(three[0].data(), bytesOf(guarded.data()), decrypt);
      const std::string result = crypted(three[2], crypted(three[1], crypted(three[0], clear)));
      EXPECT_EQ(result, opensslDes(keys, clear, decrypt == 0));
    }
  }
}

TEST(Des, BlocksSideBySideAreBlocksAlone) {
  std::mt19937 random(4);
  for (size_t count = 0; count <= 20; ++count) {
    const std::string key = randomBytes(random, 8);
    const std::string clear = randomBytes(random, 8 * count);
    Guarded blocks(clear);
    ldappw::desBlocks(scheduleOf(deskey, key, 0).data(), bytesOf(blocks.data()), count);
    EXPECT_EQ(std::string(blocks.data(), 8 * count), opensslDes(key, clear, true)) << count;
  }
}

TEST(Des, SchedulesLieAsPromised) {
  const std::string key = fromHex("133457799bbcdff1");
  // The round keys 1 and 16 of a worked example that many text books print.
  const Schedule full = scheduleOf(deskey, key, 0);
  const std::array<uint32_t, 4> ends = {full[0], full[1], full[30], full[31]};
  EXPECT_EQ(ends, (std::array<uint32_t, 4>{0x060b3f01, 0x302f0732, 0x3236031f, 0x330b2135}));
  for (const auto builder : {deskey, deskey56, deskey40}) {
    const Schedule forwards = scheduleOf(builder, key, 0);
    const Schedule backwards = scheduleOf(builder, key, 1);
    const Replaced<int> scaling(Asmversion, 7);  // for byte offsets
    const Schedule scaled = scheduleOf(builder, key, 0);
    for (size_t i = 0; i < 32; ++i) {
      EXPECT_EQ(backwards[i], forwards[(15 - i / 2) * 2 + i % 2]) << i;
      EXPECT_EQ(scaled[i], forwards[i] * 4) << i;
    }
  }
  // Nothing else has the reduced form: what it makes of a block in a hundred rounds, each the key of the next.
  std::string block = key;
  for (int round = 0; round < 100; ++round) block = crypted(scheduleOf(deskey40, block, 0), block);
  EXPECT_EQ(toHex(block.data(), 8), "48b0d2d132d05788");
}

TEST(SimpleCrypt, EntersTheKeyTextAtItsFifthCharacter) {
  Guarded zeros(std::string(60, '\0'));
  EXPECT_EQ(taken(simpleCrypt(zeros.data(), 60)), "e8gxd6ncf10epf91dhodzdoc9is0j8ht9lgmx&9edn581u33xtplpfujzde8");
}

}  // namespace
