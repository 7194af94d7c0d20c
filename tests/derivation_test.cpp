// SPDX-License-Identifier: Apache-2.0
// Random texts, key derivation and key generation. Expected bytes come from a model over OpenSSL's SHA-1, and from
// vectors that another language's digests made.
#include <gtest/gtest.h>
#include <sys/resource.h>

#include <fstream>
#include <sstream>

#include "aes_internal.h"
#include "failures.h"
#include "oracle.h"

namespace {

using ldappw::morva_rand_range;
using test::both;
using test::bytesOf;
using test::failingAllocation;
using test::fromHex;
using test::Guarded;
using test::Lines;
using test::opensslDigest;
using test::Replaced;
using test::replacing;
using test::textOf;
using test::TraceCapture;

std::string derived(const std::string& seed, const std::string& salt, unsigned iterations, size_t length) {
  std::string key;
  for (unsigned index = 1; key.size() < length; ++index) {
    const char number[4] = {0, 0, static_cast<char>(index >> 8), static_cast<char>(index)};
    std::string u = opensslDigest("SHA1", salt + seed + std::string(number, 4));
    std::string block = u;
    for (unsigned i = 1; i < iterations; ++i) {
      u = opensslDigest("SHA1", u);
      for (size_t k = 0; k < 20; ++k) block[k] = static_cast<char>(block[k] ^ u[k]);
    }
    key += block;
  }
  return key.substr(0, length);
}

// The rows of one kind in the vector file, as their fields.
std::vector<Lines> vectors(const std::string& kind) {
  std::ifstream file(LDAPPW_TEST_DATA "/derivation.vec");
  std::vector<Lines> rows;
  for (std::string line; std::getline(file, line);) {
    std::istringstream fields(line);
    std::string field;
    fields >> field;
    if (field != kind) continue;
    rows.emplace_back();
    while (fields >> field) rows.back().push_back(field);
  }
  EXPECT_FALSE(rows.empty());
  return rows;
}

class Derivation : public testing::Test {
 protected:
  void SetUp() override {
    ASSERT_EQ(initQelCrypto(&ctx), 0);
    ASSERT_EQ(initQelDigest(ctx, &digestCtx_, "SHA1", &digest), 0);
    digestCtx = digestCtx_;
  }
  void TearDown() override { freeQelDigest(ctx, digestCtx_); }

  std::string pbkdf2(const std::string& seedText, const std::string& saltText, unsigned iterations, size_t length) {
    Guarded guardedSeed(seedText);
    Guarded guardedSalt(saltText);
    Guarded key(std::string(length, '?'));
    EXPECT_EQ(morva_pbkdf2(ctx, digestCtx, digest, bytesOf(guardedSeed.data()), static_cast<uint32_t>(seedText.size()),
                           bytesOf(guardedSalt.data()), saltText.size(), iterations, bytesOf(key.data()), length),
              0);
    return std::string(key.data(), length);
  }
  int generate() { return genKeyDataVal(ctx, digestCtx, digest, seed, salt, slot); }

  void* digestCtx_ = nullptr;
  // The arguments, for rows to replace.
  void* ctx = nullptr;
  void* digestCtx = nullptr;
  void* digest = nullptr;
  const char* seed = "abcdefghijkl";
  const char* salt = "saltsaltsalt";
  AesKeyData* record = nullptr;
  AesKeyData** slot = &record;
};

// ---- Random texts ----

TEST_F(Derivation, RandomTextsFillTheBufferUpToTheLastByte) {
  for (const unsigned size : {1U, 2U, 13U, 3000U}) {
    Guarded buffer(std::string(size, ' '));
    EXPECT_EQ(morva_rand_ascii(ctx, bytesOf(buffer.data()), size), 0);
    EXPECT_EQ(buffer.data()[size - 1], '\0');
    for (unsigned i = 0; i + 1 < size; ++i) EXPECT_TRUE(buffer.data()[i] >= 33 && buffer.data()[i] <= 125) << i;
  }
}

uint32_t drawn;

TEST_F(Derivation, RandomNumbersWrapBeforeTheHighBound) {
  static const struct {
    uint32_t drawn;
    int low, high, result;
  } rows[] = {
      {0xffffffff, 33, 126, 34},                                                       // 94, of which 93 are taken off
      {0, 33, 126, 33},           {45691141, 33, 126, 33},   {45691142, 33, 126, 34},  // around 1 of 94 parts
      {4249276153, 33, 126, 125},  // just below 93 parts: the largest result there is
      {4249276154, 33, 126, 33},  {0xfffffffe, 33, 126, 33}, {0xffffffff, 0, 1, 0},   {0x80000000, -5, 5, 0},
  };
  const Replaced<int (*)(void*, unsigned char*, int)> fixed(pQEL_RAND_bytes, [](void*, unsigned char* out, int count) {
    EXPECT_EQ(count, 4);
    std::memcpy(out, &drawn, 4);
    return 1;
  });
  for (const auto& row : rows) {
    drawn = row.drawn;
    EXPECT_EQ(morva_rand_range(ctx, row.low, row.high), row.result) << row.drawn;
  }
  for (uint64_t number = 0; number <= 0xffffffff; number += 655211) {
    drawn = static_cast<uint32_t>(number);
    ASSERT_EQ(morva_rand_range(ctx, 33, 126), static_cast<int>(number * 94 / 4294967295 % 93) + 33) << number;
  }
}

void withoutCoreFiles() {
  const rlimit none{0, 0};
  setrlimit(RLIMIT_CORE, &none);
}

TEST_F(Derivation, AFailingGeneratorOrWrongBoundsEndTheProcess) {
  unsigned char buffer[4];
  const testing::KilledBySignal aborted(SIGABRT);
  for (const auto entry :
       {+[](void*, unsigned char*, int) { return 0; }, +[](void*, unsigned char*, int) { return 2; }}) {
    const Replaced<int (*)(void*, unsigned char*, int)> failing(pQEL_RAND_bytes, entry);
    EXPECT_EXIT((withoutCoreFiles(), morva_rand_ascii(ctx, buffer, 4)), aborted, "^The PRNG is not seeded!\n$");
  }
  EXPECT_EXIT((withoutCoreFiles(), morva_rand_range(ctx, 5, 5)), aborted, "");
  EXPECT_EXIT((withoutCoreFiles(), morva_rand_range(ctx, 5, 4)), aborted, "");
}

// ---- Derivation ----

TEST_F(Derivation, AgreesWithTheModelAndTheRecordedVectors) {
  for (const unsigned iterations : {0U, 1U, 2U, 3U, 10U}) {
    for (size_t length = 0; length <= 100; ++length) {
      ASSERT_EQ(pbkdf2("the seed", "its salt", iterations, length),
                derived("the seed", "its salt", iterations, length));
    }
  }
  EXPECT_EQ(pbkdf2("", "", 2, 30), derived("", "", 2, 30));
  EXPECT_EQ(pbkdf2("s", "t", 1, 20),
            opensslDigest("SHA1", std::string("ts\0\0\0\1", 6)));  // the salt first, the number big-endian
  EXPECT_EQ(pbkdf2("s", "t", 1, 300 * 20), derived("s", "t", 1, 300 * 20));
  for (const Lines& row : vectors("key")) {
    const std::string key = fromHex(row.at(3));
    EXPECT_EQ(pbkdf2(fromHex(row[0]), fromHex(row[1]), static_cast<unsigned>(std::stoul(row[2])), key.size()), key);
  }
}

TEST_F(Derivation, ReportsArgumentsAndMemoryButNotTheProvider) {
  std::string key(40, '\0');
  const std::string text = "abcdefgh";
  const unsigned char* seedBytes = bytesOf(text);
  const unsigned char* saltBytes = seedBytes + 4;
  unsigned char* out = bytesOf(key);
  uint64_t saltLength = 0x100000004;  // its low 32 bits count
  uint64_t length = 40;
  const Lines memory = {"Error - morva_pkcs5_F: calloc() failed. rc = 90\n"};
  const auto call = [&] {
    return morva_pbkdf2(ctx, digestCtx, digest, seedBytes, 4, saltBytes, saltLength, 2, out, length);
  };
  test::expectFailures(
      test::Rows("morva_pbkdf2")
          .refuses({replacing(ctx, nullptr), replacing(digestCtx, nullptr), replacing(digest, nullptr),
                    replacing(seedBytes, nullptr), replacing(saltBytes, nullptr), replacing(out, nullptr)})
          .fails(1, "derivedKeyLen too long.", replacing(length, 85899345901))
          .fails(90, "morva_pkcs5_F() failed.", both(replacing(length, 85899345900), failingAllocation(0)), memory)
          .fails(90, "morva_pkcs5_F() failed.", failingAllocation(1), memory),
      LDTR_ERROR, call);
  EXPECT_EQ(key, derived("abcd", "efgh", 2, 20) + std::string(20, '\0')) << "a block before the failure stays";
  const auto failing = [](auto...) { return 0; };
  both(replacing(pQEL_EVP_DigestInit, failing),
       both(replacing(pQEL_EVP_DigestUpdate, failing), replacing(pQEL_EVP_DigestFinal, failing)))(
      [&] { EXPECT_EQ(call(), 0); });
}

TEST_F(Derivation, TracesEachBlockButNotTheRounds) {
  const TraceCapture trace;
  pbkdf2("abcd", "efgh", 9, 5);
  EXPECT_EQ(test::outlineOf(trace),
            ">morva_pbkdf2: Entering. qelCtx = #, digestCtx = #, digest = #, seed = #, salt = #, derivedKey = #\n"
            ">morva_pkcs5_F: Entering. qelCtx = #, digestCtx = #, digest = #, seed = #, salt = #, outBuff = #\n"
            ">morva_pkcs5_initial_prf: Entering. qelCtx = #, digestCtx = #, digest = #, buffer = #, outBuff = #, "
            "outLen = #\nmorva_pkcs5_initial_prf: Leaving. rc = 0\n<"
            "morva_pkcs5_F: Leaving. rc = 0\n<morva_pbkdf2: Leaving. rc = 0\n<");
  for (const test::Record& r : trace.records()) EXPECT_TRUE(r.level == 43 && r.mask == 0x10000);
}

// ---- Generation ----

TEST_F(Derivation, RecordsFollowFromSeedAndSalt) {
  for (const Lines& row : vectors("record")) {
    SCOPED_TRACE(row[0].substr(0, 20));
    const std::string key = fromHex(row.at(3));
    AesKeyData* own = nullptr;
    ASSERT_EQ(genKeyDataVal(ctx, digestCtx, digest, row[0].c_str(), row[1].c_str(), &record), 0);
    ASSERT_EQ(genTmpKeyDataVal(row[0].c_str(), row[1].c_str(), &own), 0);
    for (const AesKeyData* each : {record, own}) {
      EXPECT_EQ(textOf(each->cryptoSync), row[2]);
      EXPECT_STREQ(reinterpret_cast<char*>(each->cryptoSync.data), row[2].c_str());
      EXPECT_EQ(textOf(each->cryptoSalt), row[1]);
      EXPECT_STREQ(reinterpret_cast<char*>(each->cryptoSalt.data), row[1].c_str());
      for (const size_t i : {0U, 1U, 2U}) EXPECT_EQ(textOf(each->aesKeys[i]), key.substr(0, 16 + 8 * i));
    }
    freeAesKeyData(own);
    freeAesKeyData(std::exchange(record, nullptr));
  }
}

TEST_F(Derivation, WhatIsNotGivenIsRandomAndOddSaltsKeepTheirLength) {
  AesKeyData* first = nullptr;
  salt = nullptr;
  ASSERT_EQ(generate(), 0);
  first = std::exchange(record, nullptr);
  ASSERT_EQ(generate(), 0);
  EXPECT_NE(textOf(first->cryptoSalt), textOf(record->cryptoSalt));
  EXPECT_EQ(std::strlen(reinterpret_cast<char*>(record->cryptoSalt.data)), 12U);
  freeAesKeyData(first);
  freeAesKeyData(std::exchange(record, nullptr));
  seed = nullptr;
  for (const char* each : {"saltsaltsalt", "", "thirty characters of salt, yes"}) {
    salt = each;
    ASSERT_EQ(generate(), 0);
    EXPECT_EQ(textOf(record->cryptoSalt), salt);
    EXPECT_EQ(record->cryptoSync.length, 16U);
    first = std::exchange(record, nullptr);
    ASSERT_EQ(generate(), 0);
    EXPECT_NE(textOf(first->cryptoSync), textOf(record->cryptoSync));
    EXPECT_NE(textOf(first->aesKeys[2]), textOf(record->aesKeys[2]));
    freeAesKeyData(first);
    freeAesKeyData(std::exchange(record, nullptr));
  }
}

TEST_F(Derivation, GenerationReportsEachStepThatFails) {
  const auto random = both(replacing(seed, nullptr), replacing(salt, nullptr));
  const auto atRandom = [&](long number) { return both(random, failingAllocation(number)); };
  const auto rows = test::Rows("genKeyDataVal")
                        .refuses({replacing(ctx, nullptr), replacing(digestCtx, nullptr), replacing(digest, nullptr),
                                  replacing(slot, nullptr)})
                        .fails(90, "calloc() returned NULL.", atRandom(0))
                        .fails(90, "initAesKeyData() failed.", atRandom(1))
                        .fails(90, "genKeySyncVal() failed.", atRandom(6),
                               {"Error - genKeySyncVal: calloc(cryptoSync) returned NULL. rc = 90\n"})
                        .fails(90, "genKeySyncVal() failed.", atRandom(7),
                               {"Error - genKeySyncVal: morva_pbkdf2() failed. rc = 90\n"})
                        .fails(1, "genKeySyncVal() failed.", atRandom(8),
                               {"Error - genKeySyncVal: binaryBlobToBase64() returned NULL. rc = 1\n"})
                        .fails(90, "growKeysFromSeed() failed.", atRandom(9),
                               {"Error - growKeysFromSeed: morva_pbkdf2() failed. rc = 90\n"})
                        .fails(90, "strdup() returned NULL.", failingAllocation(5));
  test::withQuickDigests()([&] { test::expectFailures(rows, LDTR_ERROR, [&] { return generate(); }); });
  EXPECT_EQ(record, nullptr);
}

TEST_F(Derivation, TheStepsRefuseNulls) {
  ASSERT_EQ(initAesKeyData(&record), 0);
  const auto missing = {replacing(ctx, nullptr), replacing(digestCtx, nullptr), replacing(digest, nullptr),
                        replacing(seed, nullptr), replacing(record, nullptr)};
  test::expectFailures(test::Rows("growKeysFromSeed").refuses(missing), LDTR_ERROR,
                       [&] { return growKeysFromSeed(ctx, digestCtx, digest, seed, record); });
  test::expectFailures(test::Rows("genKeySyncVal").refuses(missing), LDTR_ERROR,
                       [&] { return genKeySyncVal(ctx, digestCtx, digest, seed, record); });
  test::expectFailures(test::Rows("genKeySaltVal").refuses({replacing(ctx, nullptr), replacing(record, nullptr)}),
                       LDTR_ERROR, [&] { return genKeySaltVal(ctx, record); });
  freeAesKeyData(record);
}

TEST_F(Derivation, TemporaryRecordsReportWhatTheyLack) {
  const auto noDigest = [](void*, const char*) -> const void* { return nullptr; };
  test::expectFailures(test::Rows("genTmpKeyDataVal")
                           .refuses({replacing(seed, nullptr), replacing(slot, nullptr),
                                     both(replacing(salt, nullptr), test::withoutProvider())})
                           .fails(1, "initQelCrypto() failed.", test::withoutProvider())
                           .fails(1, "initQelDigest() failed.", replacing(pQEL_EVP_get_digestbyname, noDigest))
                           .fails(90, "genKeyDataVal() failed.", failingAllocation(6)),
                       LDTR_ERROR, [&] { return genTmpKeyDataVal(seed, salt, slot); });
  EXPECT_EQ(record, nullptr);
}

}  // namespace
