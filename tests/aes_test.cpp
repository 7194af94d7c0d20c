// SPDX-License-Identifier: Apache-2.0
// AES encryption of buffers, random texts, key derivation and key generation. Expected bytes come from OpenSSL and from
// vectors that another language's digests made. What memory and the provider can do to them stands in ledger_test.cpp.
#include <sys/resource.h>

#include <climits>

#include "aes/aes_salt.h"
#include "failures.h"
#include "oracle.h"

using namespace test;

namespace {

const std::string kKey = fromHex("2b7e151628aed2a6abf7158809cf4f3c0011223344556677fedcba9876543210");

TEST(AesBuffers, AgreeWithOpensslAndComeBack) {
  static const struct {
    const char* cipher;
    size_t keyBytes;
    std::string salt;
  } rows[] = {{"AES-192-ECB", 24, "saltsaltsalt"},
              {"AES-128-CBC", 16, "short"},
              {"AES-256-CBC", 32, "0123456789abcdefghijklmnopqrst"}};
  for (const auto& row : rows) {
    Guarded keyBytes(kKey.substr(0, row.keyBytes)), saltBytes(row.salt);
    const SecBuffer key{bytesOf(keyBytes.data()), 0};  // its length is not looked at
    const SecBuffer salt{bytesOf(saltBytes.data()), static_cast<uint32_t>(row.salt.size())};
    const std::string vector = (row.salt + std::string(16, '\0')).substr(0, 16);
    for (const size_t length : {0U, 15U, 16U, 17U, 240U, 256U, 1000U}) {
      SCOPED_TRACE(testing::Message() << row.cipher << " " << length);
      const std::string clear = letters(length).replace(0, length / 9, length / 9, '\0');
      char *text = nullptr, *back = nullptr;
      int backLength = static_cast<int>(length);
      ASSERT_EQ(aesEncryptBuffer(Guarded(clear).data(), &text, row.cipher, &key, &salt, backLength), 0);
      const CipherJob job{row.cipher, kKey.substr(0, row.keyBytes), vector, true, true};
      EXPECT_EQ(text, opensslBase64(opensslCipher(job, clear)));
      ASSERT_EQ(aesDecryptBuffer(text, &back, row.cipher, &key, &salt, &backLength), 0);
      EXPECT_EQ(std::string(back, static_cast<size_t>(backLength) + 1), clear + '\0');
      free(text);
      free(back);
    }
  }
}

// What a provider claims to have written, for the entries that the two directions end with.
template <int kCount>
constexpr auto kClaims = [](void*, void*, unsigned char*, int* count, auto...) { return *count = kCount, 1; };

TEST(AesBuffers, SurviveWhatIsWrong) {
  void* context = nullptr;
  ASSERT_EQ(initQelCrypto(&context), 0);
  std::string keyBytes = kKey;
  const SecBuffer key{bytesOf(keyBytes), 16};
  const char *name = "AES-128-ECB", *text = "AAAAAAAAAAA=";
  char* out = nullptr;
  int length = 20;
  const auto encrypt = [&] { return aesEncryptBuffer("20 bytes of the text", &out, name, &key, &key, length); };
  const auto decrypt = [&] { return aesDecryptBuffer(text, &out, name, &key, &key, &length); };
  const Failure longVector = replacing(pQEL_EVP_CIPHER_iv_length, [](auto...) { return 1000; });
  const auto calloc = [](const std::string& operation) {
    return "90 debug: Error - " + operation + ": calloc() failed.\n";
  };
  expectOutcomes("aesEncryptBuffer",
                 {{"90 debug: calloc() returned NULL.", replacing(length, INT_MAX)},
                  {"90 debug: calloc() returned NULL.", replacing(length, INT_MAX - 64)},
                  {calloc("aesEncryptBuffer"), both(longVector, failingAllocation(0))},
                  {"1 debug: QEL_EVP_EncryptUpdate() failed.", replacing(pQEL_EVP_EncryptUpdate, kClaims<2000>)},
                  {"1 debug: QEL_EVP_EncryptUpdate() failed.", replacing(pQEL_EVP_EncryptUpdate, kClaims<-1>)},
                  {"1 debug: QEL_EVP_EncryptFinal() failed.", replacing(pQEL_EVP_EncryptFinal, kClaims<2000>)}},
                 encrypt);
  expectOutcomes(
      "aesDecryptBuffer",
      {{"1 debug: base64ToBinaryBlob() returned NULL.", both(replacing(text, "AAAA-AAA"), withoutProvider())},
       {calloc("aesDecryptBuffer"), both(longVector, failingAllocation(0))},
       {"1 debug: QEL_EVP_DecryptFinal() failed.", [](const Body& body) { body(); }}},
      decrypt);
  EXPECT_EQ(out, nullptr);
  EXPECT_EQ(length, 20) << "written without a result";
  // What is not written is zeros; key wrapping adds more than a block.
  const auto widest = [](void*, void*, unsigned char* to, int* count) {
    return std::memset(to, 'w', 64), *count = 64, 1;
  };
  const auto result = [&](const Failure& failure) {
    dirtyStack();
    failure([&] { EXPECT_EQ(encrypt(), 0); });
    return opensslDecoded(taken(std::exchange(out, nullptr)));
  };
  EXPECT_EQ(result(both(replacing(pQEL_EVP_EncryptUpdate, kClaims<20>), replacing(pQEL_EVP_EncryptFinal, kClaims<0>))),
            std::string(20, '\0'));
  EXPECT_EQ(result(replacing(pQEL_EVP_EncryptFinal, widest)).substr(16), std::string(64, 'w'));
  // The slot is cleared from a stated step on.
  const auto clears = [&](const std::function<int()>& operation, const Failure& failure) {
    char* const held = out = strdup("held");
    failure([&] { EXPECT_EQ(operation(), 1); });
    if (out == held) free(held);
    return std::exchange(out, nullptr) == nullptr;
  };
  EXPECT_FALSE(clears(encrypt, withoutProvider()));
  EXPECT_TRUE(clears(encrypt, replacing(name, "AES-512-ECB")));
  EXPECT_FALSE(clears(decrypt, replacing(text, "-")));
  EXPECT_TRUE(clears(decrypt, withoutProvider()));
}

class Derivation : public testing::Test {
 protected:
  void SetUp() override {
    ASSERT_EQ(initQelCrypto(&ctx), 0);
    ASSERT_EQ(initQelDigest(ctx, &digestCtx, "SHA1", &digest), 0);
  }
  void TearDown() override {
    EXPECT_EQ(record, nullptr);
    freeQelDigest(ctx, digestCtx);
  }

  std::string pbkdf2(const std::string& seedText, const std::string& saltText, int iterations, size_t length) {
    Guarded guardedSeed(seedText), guardedSalt(saltText), key(std::string(length, '?'));
    EXPECT_EQ(morva_pbkdf2(ctx, digestCtx, digest, bytesOf(guardedSeed.data()), static_cast<uint32_t>(seedText.size()),
                           bytesOf(guardedSalt.data()), saltText.size(), static_cast<uint32_t>(iterations),
                           bytesOf(key.data()), length),
              0);
    return std::string(key.data(), length);
  }
  // What the record holds, which is dropped.
  Lines taken() {
    const std::string content = contentOf(*record), keys = content.substr(content.size() - 72);
    const Lines texts = {textOf(record->cryptoSync), textOf(record->cryptoSalt), keys};
    freeAesKeyData(std::exchange(record, nullptr));
    return texts;
  }

  void expectKey(const std::string& seedText, const std::string& saltText, int iterations, const std::string& key) {
    for (size_t length = iterations < 10 ? 0 : key.size(); length <= key.size(); ++length) {
      EXPECT_EQ(pbkdf2(seedText, saltText, iterations, length), key.substr(0, length));
    }
  }
  void expectRecord(const std::string& seedText, const std::string& saltText, const std::string& sync,
                    const std::string& key) {
    seed = seedText.c_str();
    salt = saltText.c_str();
    for (const auto& make : {generate, generateAlone}) {
      ASSERT_EQ(make(), 0);
      EXPECT_STREQ(reinterpret_cast<char*>(record->cryptoSync.data), sync.c_str());
      EXPECT_STREQ(reinterpret_cast<char*>(record->cryptoSalt.data), salt);
      EXPECT_EQ(taken(), (Lines{sync, saltText, key.substr(0, 16) + key.substr(0, 24) + key}));
    }
  }

  // The arguments, for rows to replace.
  void *ctx = nullptr, *digestCtx = nullptr, *digest = nullptr;
  const char *seed = "abcdefghijkl", *salt = "saltsaltsalt";
  AesKeyData* record = nullptr;
  const std::function<int()> generate = [this] { return genKeyDataVal(ctx, digestCtx, digest, seed, salt, &record); };
  const std::function<int()> generateAlone = [this] { return genTmpKeyDataVal(seed, salt, &record); };
};

// ---- Random texts ----

uint32_t drawn;

TEST_F(Derivation, RandomTextsAreOfTheirRangeAndEndAtTheLastByte) {
  for (const unsigned size : {1U, 2U, 3000U}) {
    Guarded buffer(std::string(size, ' '));
    EXPECT_EQ(morva_rand_ascii(ctx, bytesOf(buffer.data()), size), 0);
    EXPECT_EQ(buffer.data()[size - 1], '\0');
    for (unsigned i = 0; i + 1 < size; ++i) EXPECT_TRUE(buffer.data()[i] >= 33 && buffer.data()[i] <= 125) << i;
  }
  // Of 94 parts, the first begin at 0 and 45691142, the last but one ends at 4249276153, and the last wraps.
  static const struct {
    uint32_t drawn;
    int low, high, result;
  } rows[] = {{0, 33, 126, 33},          {45691141, 33, 126, 33},   {45691142, 33, 126, 34}, {4249276153, 33, 126, 125},
              {4249276154, 33, 126, 33}, {0xffffffff, 33, 126, 34}, {0x80000000, -5, 5, 0}};
  const Replaced<int (*)(void*, unsigned char*, int)> fixed(pQEL_RAND_bytes, [](void*, unsigned char* out, int count) {
    std::memcpy(out, &drawn, 4);
    return count == 4 ? 1 : 0;
  });
  for (const auto& row : rows) {
    drawn = row.drawn;
    EXPECT_EQ(ldappw::morva_rand_range(ctx, row.low, row.high), row.result) << row.drawn;
  }
}

TEST_F(Derivation, WithoutARandomNumberTheProcessEnds) {
  const auto prepare = [] {
    const rlimit noCoreFile{0, 0};
    setrlimit(RLIMIT_CORE, &noCoreFile);
    alarm(60);
  };
  unsigned char buffer[4];
  const testing::KilledBySignal aborted(SIGABRT);
  replacing(pQEL_RAND_bytes, [](void*, unsigned char*, int) { return 2; })(
      [&] { EXPECT_EXIT((prepare(), morva_rand_ascii(ctx, buffer, 4)), aborted, "^The PRNG is not seeded!\n$"); });
  EXPECT_EXIT((prepare(), ldappw::morva_rand_range(ctx, 5, 5)), aborted, "") << "no number to draw";
}

// ---- Derivation ----

TEST_F(Derivation, AgreesWithTheRecordedVectors) {
  std::string table = fileContent(LDAPPW_TEST_DATA "/derivation.vec");
  for (size_t fold = 0; (fold = table.find("\n  ")) != std::string::npos;) table.erase(fold, 3);
  std::istringstream file(table);
  int keys = 0, records = 0;
  for (std::string line, kind, seedText, saltText, third, hex; std::getline(file, line);) {
    std::istringstream(line) >> kind >> seedText >> saltText >> third >> hex;
    if (kind == "key") ++keys, expectKey(fromHex(seedText), fromHex(saltText), std::stoi(third), fromHex(hex));
    if (kind == "record") ++records, expectRecord(seedText, saltText, third, fromHex(hex));
  }
  EXPECT_TRUE(keys == 7 && records == 3);
  EXPECT_EQ(pbkdf2("s", "t", 0, 6000).substr(5980), opensslDigest("SHA1", std::string("ts\0\0\1\x2c", 6)));
  const TraceCapture trace;
  pbkdf2("", "", 9, 5);
  EXPECT_EQ(trace.records().size(), 12U) << "the rounds are not traced";
  for (const Record& r : trace.records()) EXPECT_TRUE(r.level == 43 && r.mask == 0x10000);
}

TEST_F(Derivation, KeepsWhatItHasAndReportsMemoryButNotTheProvider) {
  std::string key(40, '\0');
  uint64_t length = 40;
  const auto derive = [&] {  // the low 32 bits of the salt's length count
    return morva_pbkdf2(ctx, digestCtx, digest, bytesOf("abcd"), 4, bytesOf("efgh"), 0x100000004, 2, bytesOf(key),
                        length);
  };
  expectOutcomes("morva_pbkdf2",
                 {{"1 derivedKeyLen too long.", replacing(length, 85899345901)},
                  {"90 morva_pkcs5_F() failed.", both(replacing(length, 85899345900), failingAllocation(0))},
                  {"90 morva_pkcs5_F() failed.", failingAllocation(1)}},
                 derive);
  EXPECT_EQ(key, pbkdf2("abcd", "efgh", 2, 20) + std::string(20, '\0')) << "a block before the failure stays";
  replacing(pQEL_EVP_DigestFinal, [](auto...) { return 0; })([&] { EXPECT_EQ(derive(), 0); });
}

// ---- Generation ----

TEST_F(Derivation, WhatIsNotGivenIsRandomAndOddSaltsKeepTheirLength) {
  const auto made = [this] { return generate() == 0 ? taken() : Lines(3); };
  salt = nullptr;
  EXPECT_NE(made()[1], made()[1]);
  EXPECT_EQ(upToNul(made()[1]).size(), 12U);
  seed = nullptr;
  for (const char* each : {"saltsaltsalt", "", "thirty characters of salt, yes"}) {
    salt = each;
    const Lines first = made(), second = made();
    EXPECT_EQ(first[1], salt);
    EXPECT_EQ(first[0].size(), 16U);
    for (const size_t i : {0U, 2U}) EXPECT_NE(first[i], second[i]);
  }
}

// A digest that fails in the middle of thousands of rounds must not give other keys; the seed may be the sync text.
TEST_F(Derivation, StepsAreWholeOrFail) {
  ASSERT_EQ(initAesKeyData(&record), 0);
  static int rounds = 0;
  static const auto realInit = pQEL_EVP_DigestInit;
  const auto oneRound = [](void* c, void* d, const void* a) { return ++rounds == 7777 ? 0 : realInit(c, d, a); };
  replacing(pQEL_EVP_DigestInit,
            +oneRound)([&] { EXPECT_EQ(growKeysFromSeed(ctx, digestCtx, digest, seed, record), 1); });
  const auto syncOf = [&](const char* text) {
    EXPECT_EQ(genKeySyncVal(ctx, digestCtx, digest, text, record), 0);
    return textOf(record->cryptoSync);
  };
  const std::string own = syncOf(seed);
  const std::string ofOwn = syncOf(reinterpret_cast<const char*>(record->cryptoSync.data));
  EXPECT_EQ(ofOwn, syncOf(own.c_str()));
  taken();
}

}  // namespace
