// SPDX-License-Identifier: Apache-2.0
// Key data records and the process-wide key state.
#include <gtest/gtest.h>

#include "failures.h"
#include "oracle.h"

namespace {

using test::contentOf;
using test::failingAllocation;
using test::fixedFile;
using test::fixedRecord;
using test::Lines;
using test::putFile;
using test::Replaced;
using test::replacing;
using test::TempFolder;
using test::textOf;
using test::TraceCapture;

constexpr char kSalt[] = "saltsaltsalt";

// ---- Records ----

TEST(KeyRecords, StartAsZerosAndAreCopiedWhole) {
  AesKeyData* empty = nullptr;
  ASSERT_EQ(initAesKeyData(&empty), 0);
  EXPECT_EQ(empty->cryptoSync.data, nullptr);
  EXPECT_EQ(empty->cryptoSync.length, 0U);
  EXPECT_EQ(textOf(empty->cryptoSalt), std::string(12, '\0'));
  EXPECT_EQ(empty->cryptoSalt.data[12], 0);
  for (const size_t i : {0U, 1U, 2U}) EXPECT_EQ(textOf(empty->aesKeys[i]), std::string(16 + 8 * i, '\0'));
  AesKeyData* record = fixedRecord();
  AesKeyData* copy = nullptr;
  ASSERT_EQ(copyAesKeyData(record, &copy), 0);
  EXPECT_EQ(contentOf(*copy), test::fixedContent());
  EXPECT_STREQ(reinterpret_cast<char*>(copy->cryptoSync.data), "c3luYw==");
  EXPECT_STREQ(reinterpret_cast<char*>(copy->cryptoSalt.data), kSalt);
  freeAesKeyData(copy);
  record->aesKeys[1].length = 20;  // the copy's length is the key's own
  ASSERT_EQ(copyAesKeyData(record, &copy), 0);
  EXPECT_EQ(textOf(copy->aesKeys[1]), textOf(record->aesKeys[1]) + std::string(4, '\0'));
  for (AesKeyData* each : {empty, record, copy}) EXPECT_EQ(freeAesKeyData(each), 0);
  EXPECT_EQ(freeAesKeyData(nullptr), 0);
}

TEST(KeyRecords, ReportWhatTheyLack) {
  AesKeyData* const record = fixedRecord();
  AesKeyData* empty = nullptr;
  ASSERT_EQ(initAesKeyData(&empty), 0);
  const AesKeyData* source = record;
  AesKeyData* out = nullptr;
  AesKeyData** slot = &out;
  test::expectFailures(test::Rows("initAesKeyData")
                           .refuses({replacing(slot, nullptr)})
                           .fails(90, "calloc(keyData) returned NULL.", failingAllocation(0))
                           .fails(90, "calloc(cryptoSalt) returned NULL.", failingAllocation(1))
                           .fails(90, "calloc(aesKeys) returned NULL.", failingAllocation(2))
                           .fails(90, "calloc(aesKeys) returned NULL.", failingAllocation(4)),
                       LDTR_ERROR, [&] { return initAesKeyData(slot); });
  test::expectFailures(
      test::Rows("copyAesKeyData")
          .refuses({replacing(source, nullptr), replacing(source, empty), replacing(slot, nullptr)})
          .fails(90, "calloc(keyDataCopy) returned NULL.", failingAllocation(0))
          .fails(90, "calloc(cryptoSalt) returned NULL.", failingAllocation(1))  // of the sync text too
          .fails(90, "calloc(cryptoSalt) returned NULL.", failingAllocation(2))
          .fails(90, "calloc(aesKeys) returned NULL.", failingAllocation(3))
          .fails(90, "calloc(aesKeys) returned NULL.", failingAllocation(5)),
      LDTR_ERROR, [&] { return copyAesKeyData(source, slot); });
  EXPECT_EQ(out, nullptr);
  freeAesKeyData(record);
  freeAesKeyData(empty);
}

TEST(KeyRecords, AreComparedBySyncTextAndSalt) {
  static const struct {
    int type;
    const char *sync, *salt;
    int rc, match;
  } rows[] = {
      {0, "c3luYw==", kSalt, 0, 1},          {0, "c3luYw==", "wrong", 0, 1}, {0, "c3luYx==", kSalt, 0, 0},
      {0, "c3luYw=", kSalt, 0, 0},           {0, "c3luYw===", kSalt, 0, 0},  {1, "c3luYw==", kSalt, 0, 1},
      {1, "c3luYw==", "saltsaltsalT", 0, 0}, {1, "", kSalt, 0, 0},           {2, "c3luYw==", kSalt, 1, 0},
  };
  AesKeyData* const record = fixedRecord();
  for (const auto& row : rows) {
    int match = 7;
    const TraceCapture trace;
    EXPECT_EQ(checkKeyStashFile(row.type, record, row.sync, row.salt, &match), row.rc);
    EXPECT_EQ(match, row.match) << row.type << row.sync << row.salt;
    EXPECT_EQ(trace.messages(), Lines{});
  }
  const AesKeyData* subject = record;
  const char* sync = "c3luYw==";
  const char* salt = kSalt;
  int match = 7;
  int* answer = &match;
  test::expectFailures(test::Rows("checkKeyStashFile")
                           .refuses({replacing(subject, nullptr), replacing(sync, nullptr), replacing(salt, nullptr),
                                     replacing(answer, nullptr)}),
                       LDTR_ERROR, [&] { return checkKeyStashFile(0, subject, sync, salt, answer); });
  EXPECT_EQ(match, 7);
  freeAesKeyData(record);
}

// ---- The process-wide state ----

TEST(KeyState, IsSetOnceAndOnlyByASoundFile) {
  const TempFolder folder;
  const std::string good = folder.file("good");
  const std::string other = folder.file("other");
  putFile(good, fixedFile());
  putFile(other, fixedFile().replace(4, 1, "X"));
  const struct {
    int (*set)(const char*);
    AesKeyData* (*get)();
    AesKeyData*& global;
  } rows[] = {{setCfgKeyDataGlobal, getCfgKeyDataGlobal, g_CfgKeyData},
              {setDirKeyDataGlobal, getDirKeyDataGlobal, g_DirKeyData}};
  for (const auto& row : rows) {
    const Replaced<const char*> names(g_CipherName[0], nullptr);
    EXPECT_EQ(row.set(folder.file("missing").c_str()), 1);
    EXPECT_EQ(row.set(nullptr), 1);
    for (long failing = 0; failing < 6; ++failing) {
      failingAllocation(failing)([&] { EXPECT_EQ(row.set(good.c_str()), 90); });
    }
    EXPECT_EQ(row.get(), nullptr);
    EXPECT_EQ(g_CipherName[0], nullptr);
    EXPECT_EQ(row.set(good.c_str()), 0);
    AesKeyData* const first = row.get();
    ASSERT_EQ(first, row.global);
    EXPECT_EQ(row.set(other.c_str()), 0);
    EXPECT_EQ(row.set(nullptr), 0);
    EXPECT_EQ(row.get(), first);
    EXPECT_EQ(contentOf(*first), test::fixedContent());
    EXPECT_STREQ(g_CipherName[0], "AES-128-ECB");
    EXPECT_STREQ(g_CipherName[1], "AES-192-ECB");
    EXPECT_STREQ(g_CipherName[2], "AES-256-ECB");
    freeAesKeyData(std::exchange(row.global, nullptr));
  }
}

TEST(KeyState, KeepsTheFirstSyncTextAndCipherNames) {
  const TraceCapture trace;
  EXPECT_EQ(setCfgCryptoSyncGlobal(nullptr), 1);
  failingAllocation(0)([] { EXPECT_EQ(setCfgCryptoSyncGlobal("first"), 90); });
  const std::string text = "first";
  EXPECT_EQ(setCfgCryptoSyncGlobal(text.c_str()), 0);
  EXPECT_NE(g_CfgCryptoSync, text.c_str());
  EXPECT_EQ(setCfgCryptoSyncGlobal("second"), 0);
  EXPECT_STREQ(g_CfgCryptoSync, "first");
  const Replaced<const char*> own(g_CipherName[0], "own");
  EXPECT_EQ(setCipherNameGlobal(), 0);
  EXPECT_STREQ(g_CipherName[0], "own");
  EXPECT_EQ(trace.messages(), Lines{});
  for (const test::Record& r : trace.records()) EXPECT_TRUE(r.level == 33 && r.mask == 0x1000);
  free(std::exchange(g_CfgCryptoSync, nullptr));
}

TEST(KeyState, OwnRecordsComeFromFilesToo) {
  const TempFolder folder;
  const std::string good = folder.file("good");
  const std::string missing = folder.file("missing");
  putFile(good, fixedFile());
  const Replaced<const char*> names(g_CipherName[0], nullptr);
  AesKeyData* record = nullptr;
  AesKeyData** slot = &record;
  const char* path = good.c_str();
  test::expectFailures({{1, {"Error - setAESKeyData: Invalid parameter. rc = 1\n"}, replacing(slot, nullptr)},
                        {1, {"Error - readKeyStashFile: fopen() failed. rc = 1\n"}, replacing(path, missing.c_str())},
                        {1, {"Error - readKeyStashFile: Invalid parameter. rc = 1\n"}, replacing(path, nullptr)}},
                       LDTR_ERROR, [&] { return setAESKeyData(path, slot); });
  EXPECT_EQ(record, nullptr);
  EXPECT_EQ(setAESKeyData(path, slot), 0);
  EXPECT_STREQ(g_CipherName[0], "AES-128-ECB");
  EXPECT_EQ(contentOf(*record), test::fixedContent());
  freeAesKeyData(record);
}

}  // namespace
