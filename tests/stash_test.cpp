// SPDX-License-Identifier: Apache-2.0
// Stash files: their bytes, their creation in pairs, their rebuilding, and what goes wrong.
#include <sys/resource.h>
#include <sys/stat.h>

#include <csignal>

#include "aes_file_format.h"
#include "failures.h"
#include "oracle.h"

using namespace test;
using ldappw::writeKeyStashFile;

namespace {

class StashFiles : public testing::Test {
 protected:
  void SetUp() override { ASSERT_EQ(initAesKeyData(&target), 0); }
  void TearDown() override {
    freeAesKeyData(record);
    freeAesKeyData(target);
  }
  const TempFolder folder;
  const std::string file = folder.file("stash"), folderPath = folder.file("");
  AesKeyData *const record = fixedRecord(), *target = nullptr;
  const AesKeyData* source = record;
  const char* path = file.c_str();
  const Operation read{"readKeyStashFile", [this] { return readKeyStashFile(path, target); }};
  const Operation write{"writeKeyStashFile", [this] { return writeKeyStashFile(path, source); }};
};

TEST_F(StashFiles, HoldTheRecordByteForByte) {
  const mode_t mask = umask(0);
  EXPECT_EQ(write(), 0);
  umask(mask);
  EXPECT_EQ(fileContent(path), fixedFile());
  struct stat about {};
  ASSERT_EQ(stat(path, &about), 0);
  EXPECT_EQ(about.st_mode & 07777U, 0600U);
  putFile(path, std::string(500, 'x'));
  EXPECT_EQ(write(), 0);
  EXPECT_EQ(fileContent(path), fixedFile());
  putFile(path, fixedFile() + "bytes behind the last key");
  for (int twice = 0; twice < 2; ++twice) EXPECT_EQ(read(), 0);
  EXPECT_EQ(contentOf(*target), fixedContent());
  EXPECT_STREQ(reinterpret_cast<char*>(target->cryptoSync.data), "c3luYw==");
}

TEST_F(StashFiles, ThatCannotBeRead) {
  const Failure untouched = [](const Body& body) { body(); };
  read.refusesNulls(path, target);
  read.fails({{1, "fopen() failed.", replacing(path, "not/there")},
              {1, "fread(cryptoSync) failed.", replacing(path, folderPath.c_str())}});
  for (const size_t length : {0U, 3U, 4U, 11U, 12U, 23U, 24U, 39U, 40U, 95U}) {
    putFile(path, fixedFile().substr(0, length));
    const std::string part = length < 12 ? "cryptoSync" : length < 24 ? "cryptoSalt" : "aesKeys";
    read.fails({{1, "fread(" + part + ") failed.", untouched}});
    EXPECT_EQ(target->cryptoSync.length, length == 0 ? 0U : 8U);
  }
  for (const char* length : {"ffffffff", "feffffff", "00000080", "5d000000", "09000100"}) {
    putFile(path, fixedFile().replace(0, 4, fromHex(length)));
    read.fails({{1, "fread(cryptoSync) failed.", untouched}});
  }
  putFile(path, fixedFile());
  const std::string memory = "Error - genKeySyncVal: calloc(cryptoSync) returned NULL. rc = 90\n";  // another's name
  read.fails({{90, memory, failingAllocation(0)}});
  int ends[2];  // a pipe does not tell how much is left
  ASSERT_EQ(pipe(ends), 0);
  EXPECT_EQ(::write(ends[1], "\xff\xff\xff\xffxx", 6), 6);
  read.fails({{90, memory, replacing(path, ("/dev/fd/" + std::to_string(ends[0])).c_str())}});
  for (const int end : ends) close(end);
}

// The system lets no file grow beyond that.
Failure filesUpTo(rlim_t limit) {
  return [=](const Body& body) {
    rlimit before{};
    getrlimit(RLIMIT_FSIZE, &before);
    const rlimit small{limit, before.rlim_max};
    setrlimit(RLIMIT_FSIZE, &small);
    body();
    setrlimit(RLIMIT_FSIZE, &before);
  };
}

TEST_F(StashFiles, ThatCannotBeWritten) {
  signal(SIGXFSZ, SIG_IGN);
  write.refusesNulls(path, source);
  write.fails({{1, "fopen() failed.", replacing(path, folderPath.c_str())},
               {1, "fwrite(cryptoSync) failed.", filesUpTo(2)},
               {1, "fwrite(cryptoSync) failed.", filesUpTo(11)},
               {1, "fwrite(cryptoSalt) failed.", filesUpTo(12)},
               {1, "fwrite(aesKeys) failed.", filesUpTo(95)}});
  EXPECT_EQ(fileContent(path), fixedFile().substr(0, 95)) << "what was written stays";
}

// ---- Creating and rebuilding ----

class StashFileMaking : public testing::Test {
 protected:
  void SetUp() override { ASSERT_EQ(initQelCrypto(&context_), 0); }
  void* context_ = nullptr;
  const TempFolder folder_;
  const std::string cfgPath_ = folder_.file("cfg"), dirPath_ = folder_.file("dir"), nowhere_ = folder_.file("no/file");
  // The arguments, for rows to replace.
  const char *cfg = cfgPath_.c_str(), *dir = dirPath_.c_str(), *seed = "abcdefghijkl", *salt = "saltsaltsalt";
  char *sync = nullptr, **slot = &sync;
  const Operation create{"createKeyStashFiles", [this] { return createKeyStashFiles(cfg, dir, seed, slot, salt); }};
  const Operation restore{"restoreKeyStashFile", [this] { return restoreKeyStashFile(dir, seed, salt); }};
};

TEST_F(StashFileMaking, PairsAreCreatedAndRebuiltTheSame) {
  ASSERT_EQ(create(), 0);
  const std::string before = fileContent(cfg);
  EXPECT_EQ(before.substr(4, 16), sync);
  EXPECT_EQ(before.size(), 104U);
  // The sync text and the keys of this seed and salt stand in tests/data/derivation.vec.
  const std::string key = fromHex("5c1377fc453beea3703678604efde41ebdc95e7367c5fc29e10b6ebf8c58b521");
  const std::string whole =
      std::string("\x10\0\0\0", 4) + "ytzNSq98tK5eecLy" + salt + key.substr(0, 16) + key.substr(0, 24) + key;
  EXPECT_EQ(fileContent(dir), whole);
  putFile(dir, "");
  EXPECT_EQ(restore(), 0);
  EXPECT_EQ(fileContent(dir), whole);
  free(std::exchange(sync, nullptr));
  salt = nullptr;
  ASSERT_EQ(create(), 0);
  EXPECT_NE(fileContent(cfg), before);
  EXPECT_NE(fileContent(dir).substr(20, 12), "saltsaltsalt");
  free(sync);
}

TEST_F(StashFileMaking, CreationReportsEachStepThatFails) {
  create.refusesNulls(cfg, dir, seed, slot);
  const std::vector<FailingStep> rows = {{19, "validateCryptoString(dir) failed.", replacing(seed, "short")},
                                         {19, "Invalid parameter.", replacing(salt, "short")},
                                         {1, "initQelCrypto() failed.", withoutProvider()},
                                         {1, "initQelDigest() failed.", withoutDigests()},
                                         {90, "genKeyDataVal(cfg) failed.", failingAllocation(0)},
                                         {1, "writeKeyStashFile(cfg) failed.", replacing(cfg, nowhere_.c_str())},
                                         {90, "calloc(cryptoSyncStr) returned NULL.", failingAllocation(14)},
                                         {90, "genKeyDataVal(dir) failed.", failingAllocation(15)},
                                         {1, "writeKeyStashFile(dir) failed.", replacing(dir, "/dev/full")}};
  withQuickDigests()([&] {
    create.fails(rows);
    EXPECT_EQ(fileContent(cfg).size(), 104U) << "a configuration file once written stays";
    for (long number = 0, rc = 1; rc != 0; ++number) {
      EXPECT_EQ(sync, nullptr) << number;
      failingAllocation(number)([&] { rc = create(); });
    }
  });
  free(sync);
}

TEST_F(StashFileMaking, RebuildingReportsEachStepThatFails) {
  restore.refusesNulls(dir, seed, salt);
  restore.fails({{19, "validateCryptoString(seed) failed.", replacing(seed, "short")},
                 {19, "validateCryptoString(salt) failed.", replacing(salt, "short")},
                 {1, "initQelCrypto() failed.", withoutProvider()},
                 {1, "initQelDigest() failed.", withoutDigests()},
                 {90, "genKeyDataVal(dir) failed.", failingAllocation(0)},
                 {1, "writeKeyStashFile() failed.", both(withQuickDigests(), replacing(dir, nowhere_.c_str()))}});
  const TraceCapture trace;
  EXPECT_EQ(restoreKeyStashFile(dir, nullptr, nullptr), 1);
  EXPECT_EQ(outlineOf(trace),
            ">createKeyStashFiles: Entering. keyStashFile = #, cryptoSeed = (nil), cryptoSalt = (nil)\n"
            "Error - restoreKeyStashFile: Invalid parameter. rc = 1\ngenKeyStashFile: Leaving. rc = 1\n<");
}

TEST(CryptoStrings, AreCheckedForTypeLengthAndCharacters) {
  const struct {
    std::string text;
    int type, rc;
    std::string says;
  } rows[] = {
      {std::string(12, '!'), 0, 0, ""},
      {std::string(1016, '~'), 0, 0, ""},
      {std::string(12, 'x'), 1, 0, ""},
      {std::string(11, 'x'), 0, 19, "Crypto string too short, length = 11, rc = 19\n"},
      {std::string(1017, 'x'), 0, 19, "Crypto string too long, length = 1017, rc = 19\n"},
      {std::string(13, ' '), 1, 19, "Crypto string too long, length = 13, rc = 19\n"},  // the length first
      {"abcdefghijk\x7f", 1, 19, "Invalid crypto string character = 127, rc = 19\n"},
      {"\xe4 is no char", 0, 19, "Invalid crypto string character = 228, rc = 19\n"},
      {"", 2, 1, "Invalid crypto string type. rc = 1\n"},  // and the type before the length
  };
  for (const auto& row : rows) {
    const TraceCapture trace;
    EXPECT_EQ(validateCryptoString(row.text.c_str(), row.type), row.rc);
    EXPECT_EQ(outlineOf(trace), ">validateCryptoSeed: Entering. cryptoString = #\n" +
                                    (row.rc == 0 ? "" : "Error - validateCryptoString: " + row.says) +
                                    "validateCryptoString: Leaving. rc = " + std::to_string(row.rc) + "\n<");
    EXPECT_EQ(trace.records()[2].severity, row.rc == 0 ? LDTR_DEBUG : LDTR_ERROR);
  }
  EXPECT_EQ(validateCryptoString(nullptr, 0), 1);
}

}  // namespace
