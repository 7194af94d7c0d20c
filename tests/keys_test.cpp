// SPDX-License-Identifier: Apache-2.0
// Key data records and the process-wide key state.
#include "failures.h"
#include "oracle.h"

using namespace test;

namespace {

TEST(KeyRecords, StartAsZerosAndAreCopiedWhole) {
  AesKeyData *empty = nullptr, *copy = nullptr;
  ASSERT_EQ(initAesKeyData(&empty), 0);
  EXPECT_EQ(contentOf(*empty), std::string(12 + 16 + 24 + 32, '\0'));
  EXPECT_EQ(empty->cryptoSync.data, nullptr);
  AesKeyData* const record = fixedRecord();
  ASSERT_EQ(copyAesKeyData(record, &copy), 0);
  EXPECT_EQ(contentOf(*copy), fixedContent());
  EXPECT_STREQ(reinterpret_cast<char*>(copy->cryptoSync.data), "c3luYw==");
  EXPECT_STREQ(reinterpret_cast<char*>(copy->cryptoSalt.data), "saltsaltsalt");
  freeAesKeyData(copy);
  record->aesKeys[1].length = 20;  // the copy's length is the key's own
  ASSERT_EQ(copyAesKeyData(record, &copy), 0);
  EXPECT_EQ(textOf(copy->aesKeys[1]), textOf(record->aesKeys[1]) + std::string(4, '\0'));
  copy->cryptoSync.data[0] = copy->cryptoSalt.data[0] = 'X';
  for (AesKeyData* each : {record, copy, std::exchange(empty, nullptr), empty}) EXPECT_EQ(freeAesKeyData(each), 0);
}

TEST(KeyRecords, ReportWhatTheyLack) {
  AesKeyData *const record = fixedRecord(), *out = nullptr, **slot = &out;
  const AesKeyData* source = record;
  const Operation init{"initAesKeyData", [&] { return initAesKeyData(slot); }};
  const Operation copy{"copyAesKeyData", [&] { return copyAesKeyData(source, slot); }};
  init.refusesNulls(slot);
  init.fails({{90, "calloc(keyData) returned NULL.", failingAllocation(0)},
              {90, "calloc(cryptoSalt) returned NULL.", failingAllocation(1)},
              {90, "calloc(aesKeys) returned NULL.", failingAllocation(2)},
              {90, "calloc(aesKeys) returned NULL.", failingAllocation(4)}});
  copy.refusesNulls(source, slot, record->cryptoSync.data, record->cryptoSalt.data, record->aesKeys[2].data);
  copy.fails({{90, "calloc(keyDataCopy) returned NULL.", failingAllocation(0)},
              {90, "calloc(cryptoSalt) returned NULL.", failingAllocation(1)},
              {90, "calloc(cryptoSalt) returned NULL.", failingAllocation(2)},
              {90, "calloc(aesKeys) returned NULL.", failingAllocation(3)},
              {90, "calloc(aesKeys) returned NULL.", failingAllocation(5)}});
  EXPECT_EQ(out, nullptr);
  freeAesKeyData(record);
}

TEST(KeyRecords, AreComparedBySyncTextAndSalt) {
  AesKeyData* const record = fixedRecord();
  const AesKeyData* subject = record;
  const char *sync = "c3luYw==", *salt = "saltsaltsalt";
  int match = 7, *answer = &match, type = 0;
  const Operation check{"checkKeyStashFile", [&] { return checkKeyStashFile(type, subject, sync, salt, answer); }};
  check.refusesNulls(subject, sync, salt, answer);
  EXPECT_EQ(match, 7);
  const auto expectMatch = [&](int expected) { EXPECT_EQ(check() + match, expected) << type << sync << salt; };
  for (type = 0; type < 2; ++type) {
    expectMatch(1);
    for (const char* wrong : {"c3luYx==", "c3luYw=", "c3luYw===", ""}) {
      replacing(sync, wrong)([&] { expectMatch(0); });
    }
    replacing(salt, "saltsaltsalT")([&] { expectMatch(1 - type); });  // looked at for the second type alone
  }
  match = 7;
  const TraceCapture trace;
  EXPECT_EQ(check(), 1);  // there is no third type
  EXPECT_EQ(match, 0);
  EXPECT_EQ(trace.messages(), Lines{});
  freeAesKeyData(record);
}

class KeyState : public testing::Test {
 protected:
  void SetUp() override {
    putFile(good, fixedFile());
    g_CipherName[0] = nullptr;
  }
  const TempFolder folder;
  const std::string good = folder.file("good"), missing = folder.file("missing");
  const char* path = good.c_str();
};

TEST_F(KeyState, IsSetOnceAndOnlyByASoundFile) {
  const struct {
    int (*set)(const char*);
    AesKeyData* (*get)();
    AesKeyData*& global;
  } rows[] = {{setCfgKeyDataGlobal, getCfgKeyDataGlobal, g_CfgKeyData},
              {setDirKeyDataGlobal, getDirKeyDataGlobal, g_DirKeyData}};
  for (const auto& row : rows) {
    EXPECT_EQ(row.set(missing.c_str()), 1);
    for (long number = 0; number < 6; ++number) failingAllocation(number)([&] { EXPECT_EQ(row.set(path), 90); });
    EXPECT_EQ(row.get(), nullptr);
    EXPECT_EQ(g_CipherName[0], nullptr);
    EXPECT_EQ(row.set(path), 0);
    AesKeyData* const first = row.global;
    for (const char* later : {path, missing.c_str()}) EXPECT_EQ(row.set(later), 0);
    ASSERT_EQ(row.get(), first);
    EXPECT_EQ(contentOf(*first), fixedContent());
    EXPECT_EQ(Lines(g_CipherName, g_CipherName + 3), (Lines{"AES-128-ECB", "AES-192-ECB", "AES-256-ECB"}));
    freeAesKeyData(std::exchange(row.global, nullptr));
    g_CipherName[0] = nullptr;
  }
}

TEST_F(KeyState, KeepsTheFirstSyncTextAndCipherNames) {
  const TraceCapture trace;
  EXPECT_EQ(setCfgCryptoSyncGlobal(nullptr), 1);
  failingAllocation(0)([] { EXPECT_EQ(setCfgCryptoSyncGlobal("first"), 90); });
  for (std::string text : {"first", "second"}) EXPECT_EQ(setCfgCryptoSyncGlobal(text.c_str()), 0);
  EXPECT_STREQ(g_CfgCryptoSync, "first");
  g_CipherName[0] = "own";
  EXPECT_EQ(setCipherNameGlobal(), 0);
  EXPECT_STREQ(g_CipherName[0], "own");
  EXPECT_EQ(trace.messages(), Lines{});
  for (const Record& r : trace.records()) EXPECT_TRUE(r.level == 33 && r.mask == 0x1000);
  free(std::exchange(g_CfgCryptoSync, nullptr));
}

TEST_F(KeyState, OwnRecordsComeFromFilesToo) {
  AesKeyData *record = nullptr, **slot = &record;
  const auto set = [&] { return setAESKeyData(path, slot); };
  Operation{"setAESKeyData", set}.refusesNulls(slot);
  Operation{"readKeyStashFile", set}.fails({{1, "fopen() failed.", replacing(path, missing.c_str())}});
  EXPECT_EQ(record, nullptr);
  EXPECT_EQ(set(), 0);
  EXPECT_STREQ(g_CipherName[0], "AES-128-ECB");
  EXPECT_EQ(contentOf(*record), fixedContent());
  freeAesKeyData(record);
}

}  // namespace
