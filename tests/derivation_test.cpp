// SPDX-License-Identifier: Apache-2.0
// Random texts, key derivation and key generation. Expected bytes come from vectors that another language's digests
// made, and from OpenSSL's SHA-1.
#include <sys/resource.h>

#include "aes_salt.h"
#include "failures.h"
#include "oracle.h"

using namespace test;

namespace {

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
    for (const Operation& make : {generate, generateAlone}) {
      ASSERT_EQ(make(), 0);
      EXPECT_STREQ(reinterpret_cast<char*>(record->cryptoSync.data), sync.c_str());
      EXPECT_STREQ(reinterpret_cast<char*>(record->cryptoSalt.data), salt);
      EXPECT_EQ(taken(), (Lines{sync, saltText, key.substr(0, 16) + key.substr(0, 24) + key}));
    }
  }

  // The arguments, for rows to replace.
  void *ctx = nullptr, *digestCtx = nullptr, *digest = nullptr;
  const char *seed = "abcdefghijkl", *salt = "saltsaltsalt";
  AesKeyData *record = nullptr, **slot = &record;
  const Operation generate{"genKeyDataVal", [this] { return genKeyDataVal(ctx, digestCtx, digest, seed, salt, slot); }};
  const Operation generateAlone{"genTmpKeyDataVal", [this] { return genTmpKeyDataVal(seed, salt, slot); }};
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

TEST_F(Derivation, AFailingGeneratorEndsTheProcess) {
  const rlimit none{0, 0};  // and leave no core files
  unsigned char buffer[4];
  const testing::KilledBySignal aborted(SIGABRT);
  replacing(pQEL_RAND_bytes, [](void*, unsigned char*, int) { return 2; })([&] {
    EXPECT_EXIT((setrlimit(RLIMIT_CORE, &none), morva_rand_ascii(ctx, buffer, 4)), aborted,
                "^The PRNG is not seeded!\n$");
  });
}

// ---- Derivation ----

TEST_F(Derivation, AgreesWithTheRecordedVectors) {
  std::ifstream file(LDAPPW_TEST_DATA "/derivation.vec");
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

TEST_F(Derivation, ReportsArgumentsAndMemoryButNotTheProvider) {
  std::string key(40, '\0');
  const std::string text = "abcdefgh";
  const unsigned char *seedBytes = bytesOf(text), *saltBytes = seedBytes + 4;
  unsigned char* out = bytesOf(key);
  uint64_t length = 40;
  const uint64_t saltLength = 0x100000004;  // its low 32 bits count
  const Operation derive{
      "morva_pbkdf2",
      [&] { return morva_pbkdf2(ctx, digestCtx, digest, seedBytes, 4, saltBytes, saltLength, 2, out, length); }};
  derive.refusesNulls(ctx, digestCtx, digest, seedBytes, saltBytes, out);
  derive.fails({{1, "derivedKeyLen too long.", replacing(length, 85899345901)},
                {90, "morva_pkcs5_F() failed.", both(replacing(length, 85899345900), failingAllocation(0))},
                {90, "morva_pkcs5_F() failed.", failingAllocation(1)}});
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

TEST_F(Derivation, GenerationReportsEachStepThatFails) {
  const auto atRandom = [&](long number) {
    return both(both(replacing(seed, nullptr), replacing(salt, nullptr)), failingAllocation(number));
  };
  const std::vector<FailingStep> rows = {
      {90, "calloc() returned NULL.", atRandom(0)},    {90, "initAesKeyData() failed.", atRandom(1)},
      {90, "genKeySyncVal() failed.", atRandom(6)},    {1, "genKeySyncVal() failed.", atRandom(8)},
      {90, "growKeysFromSeed() failed.", atRandom(9)}, {90, "strdup() returned NULL.", failingAllocation(5)}};
  generate.refusesNulls(ctx, digestCtx, digest, slot);
  withQuickDigests()([&] { generate.fails(rows); });
  EXPECT_EQ(record, nullptr);
  withoutProvider()([&] { generateAlone.refusesNulls(seed, salt, slot); });
  generateAlone.fails({{1, "initQelCrypto() failed.", withoutProvider()},
                       {1, "initQelDigest() failed.", withoutDigests()},
                       {90, "genKeyDataVal() failed.", failingAllocation(6)}});
}

TEST_F(Derivation, ItsStepsReportWhatTheyLack) {
  ASSERT_EQ(initAesKeyData(&record), 0);
  const Operation grow{"growKeysFromSeed", [&] { return growKeysFromSeed(ctx, digestCtx, digest, seed, record); }};
  const Operation sync{"genKeySyncVal", [&] { return genKeySyncVal(ctx, digestCtx, digest, seed, record); }};
  for (const Operation& each : {grow, sync}) each.refusesNulls(ctx, digestCtx, digest, seed, record);
  Operation{"genKeySaltVal", [&] { return genKeySaltVal(ctx, record); }}.refusesNulls(ctx, record);
  // A digest that fails in the middle of thousands of rounds must not give other keys.
  static int rounds = 0;
  static const auto realInit = pQEL_EVP_DigestInit;
  const Failure oneRound = replacing(
      pQEL_EVP_DigestInit, [](void* c, void* d, const void* a) { return ++rounds == 7777 ? 0 : realInit(c, d, a); });
  grow.fails({{90, "morva_pbkdf2() failed.", failingAllocation(0)}, {1, "morva_pbkdf2() failed.", oneRound}});
  sync.fails({{90, "calloc(cryptoSync) returned NULL.", failingAllocation(0)},
              {90, "morva_pbkdf2() failed.", failingAllocation(1)},
              {1, "morva_pbkdf2() failed.", replacing(pQEL_EVP_DigestFinal, [](auto...) { return 0; })},
              {1, "binaryBlobToBase64() returned NULL.", failingAllocation(2)}});
  ASSERT_EQ(sync(), 0);
  const std::string own = textOf(record->cryptoSync);
  const Replaced<const char*> aliased(seed, reinterpret_cast<const char*>(record->cryptoSync.data));
  ASSERT_EQ(sync(), 0);
  const std::string ofOwn = textOf(record->cryptoSync);
  const Replaced<const char*> copied(seed, own.c_str());
  ASSERT_EQ(sync(), 0);
  EXPECT_EQ(textOf(record->cryptoSync), ofOwn);
  taken();
}

}  // namespace
