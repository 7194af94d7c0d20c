// SPDX-License-Identifier: Apache-2.0
// Key records, the process-wide key state, and stash files: their bytes, their creation in pairs and their rebuilding.
// What memory and the provider can do to them stands in ledger_test.cpp.
#include <sys/resource.h>
#include <sys/stat.h>

#include <csignal>

#include "aes/aes_file_format.h"
#include "failures.h"
#include "oracle.h"

using namespace test;
using ldappw::writeKeyStashFile;

namespace {

long openDescriptors() {
  return std::distance(std::filesystem::directory_iterator("/proc/self/fd"), {});
}

class Keys : public testing::Test {
 protected:
  void SetUp() override {
    ASSERT_EQ(initAesKeyData(&target), 0);
    ASSERT_EQ(initQelCrypto(&context), 0);
    descriptors = openDescriptors();
  }
  void TearDown() override {
    EXPECT_EQ(openDescriptors(), descriptors);
    freeAesKeyData(record);
    freeAesKeyData(target);
  }
  void* context = nullptr;
  long descriptors = 0;
  const TempFolder folder;
  const std::string file = folder.file("stash"), other = folder.file("other"), missing = folder.file("not/there");
  AesKeyData *const record = fixedRecord(), *target = nullptr;
  const char* path = file.c_str();
};

// ---- Records ----

TEST_F(Keys, RecordsStartAsZerosAndAreCopiedWhole) {
  EXPECT_EQ(contentOf(*target), std::string(12 + 16 + 24 + 32, '\0'));
  EXPECT_EQ(target->cryptoSync.data, nullptr);
  AesKeyData* copy = nullptr;
  ASSERT_EQ(copyAesKeyData(record, &copy), 0);
  EXPECT_EQ(contentOf(*copy), fixedContent());
  EXPECT_STREQ(reinterpret_cast<char*>(copy->cryptoSync.data), "c3luYw==");
  EXPECT_STREQ(reinterpret_cast<char*>(copy->cryptoSalt.data), "saltsaltsalt");
  freeAesKeyData(copy);
  std::string longKey = letters(200);
  {
    const Replaced<SecBuffer> longer(record->aesKeys[2], SecBuffer{bytesOf(longKey), 200});
    record->aesKeys[1].length = 20;  // the copy's length is the key's own
    ASSERT_EQ(copyAesKeyData(record, &copy), 0);
  }
  EXPECT_EQ(textOf(copy->aesKeys[1]), textOf(record->aesKeys[1]) + std::string(4, '\0'));
  EXPECT_EQ(copy->aesKeys[2].length, 32U);
  EXPECT_EQ(std::memcmp(copy->aesKeys[2].data, longKey.data(), 200), 0);  // for callers that reach further
  copy->cryptoSync.data[0] = copy->cryptoSalt.data[0] = 'X';
  EXPECT_EQ(freeAesKeyData(copy) + freeAesKeyData(nullptr), 0);
  EXPECT_EQ(record->cryptoSync.data[0], 'c');
  for (SecBuffer* part : {&record->cryptoSync, &record->cryptoSalt, &record->aesKeys[2]}) {
    replacing(part->data, nullptr)([&] { EXPECT_EQ(copyAesKeyData(record, &copy), 1); });
  }
}

TEST_F(Keys, RecordsAreComparedBySyncTextAndSalt) {
  const struct {
    const char *sync, *salt;
    int matches[2];  // by the type: the second looks at the salt too
  } rows[] = {{"c3luYw==", "saltsaltsalt", {1, 1}},  {"c3luYw==", "saltsaltsalT", {1, 0}},
              {"c3luYx==", "saltsaltsalt", {0, 0}},  {"c3luYw=", "saltsaltsalt", {0, 0}},
              {"c3luYw===", "saltsaltsalt", {0, 0}}, {"", "", {0, 0}}};
  for (const auto& row : rows) {
    for (const int type : {0, 1}) {
      int match = 7;
      EXPECT_EQ(checkKeyStashFile(type, record, row.sync, row.salt, &match), 0);
      EXPECT_EQ(match, row.matches[type]) << row.sync << " " << row.salt << " " << type;
    }
  }
  int match = 7;
  EXPECT_EQ(
      outcomeOf("", [&] { return std::to_string(checkKeyStashFile(2, record, "c3luYw==", "saltsaltsalt", &match)); }),
      "1 ");
  EXPECT_EQ(match, 0);
}

// ---- The process-wide state ----

TEST_F(Keys, StateIsSetOnceAndOnlyByASoundFile) {
  putFile(path, fixedFile());
  const struct {
    int (*set)(const char*);
    AesKeyData* (*get)();
    AesKeyData*& global;
  } rows[] = {{setCfgKeyDataGlobal, getCfgKeyDataGlobal, g_CfgKeyData},
              {setDirKeyDataGlobal, getDirKeyDataGlobal, g_DirKeyData}};
  for (const auto& row : rows) {
    const Replaced<const char*> unset(g_CipherName[0], nullptr);
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
  }
}

TEST_F(Keys, StateKeepsTheFirstSyncTextAndCipherNames) {
  failingAllocation(0)([] { EXPECT_EQ(setCfgCryptoSyncGlobal("first"), 90); });
  for (std::string text : {"first", "second"}) EXPECT_EQ(setCfgCryptoSyncGlobal(text.c_str()), 0);
  EXPECT_STREQ(g_CfgCryptoSync, "first");
  const Replaced<const char*> own(g_CipherName[0], "own");
  EXPECT_EQ(setCipherNameGlobal(), 0);
  EXPECT_STREQ(g_CipherName[0], "own");
  free(std::exchange(g_CfgCryptoSync, nullptr));
}

// ---- Stash files ----

TEST_F(Keys, FilesHoldTheRecordByteForByte) {
  const mode_t mask = umask(0);
  EXPECT_EQ(writeKeyStashFile(path, record), 0);
  umask(mask);
  struct stat about {};
  ASSERT_EQ(stat(path, &about), 0);
  EXPECT_EQ(about.st_mode & 07777U, 0600U);
  EXPECT_EQ(fileContent(path), fixedFile());
  putFile(path, std::string(500, 'x'));
  EXPECT_EQ(writeKeyStashFile(path, record), 0);
  EXPECT_EQ(fileContent(path), fixedFile());
  putFile(path, fixedFile() + "bytes behind the last key");
  for (int twice = 0; twice < 2; ++twice) EXPECT_EQ(readKeyStashFile(path, target), 0);
  EXPECT_EQ(contentOf(*target), fixedContent());
  EXPECT_STREQ(reinterpret_cast<char*>(target->cryptoSync.data), "c3luYw==");
}

// The system lets the process have no more of something: of descriptors, or of a file's bytes.
Failure limited(decltype(RLIMIT_FSIZE) resource, rlim_t limit) {
  return [=](const Body& body) {
    rlimit before{};
    getrlimit(resource, &before);
    const rlimit small{limit, before.rlim_max};
    setrlimit(resource, &small);
    body();
    setrlimit(resource, &before);
  };
}

TEST_F(Keys, FilesThatCannotBeRead) {
  const std::string memory = "90 Error - genKeySyncVal: calloc(cryptoSync) returned NULL. rc = 90\n";  // another's name
  const auto read = [&] {
    return outcomeOf("readKeyStashFile", [&] { return std::to_string(readKeyStashFile(path, target)); });
  };
  for (size_t length = 0; length < fixedFile().size(); ++length) {
    putFile(path, fixedFile().substr(0, length));
    const char* part = length < 12 ? "cryptoSync" : length < 24 ? "cryptoSalt" : "aesKeys";
    EXPECT_EQ(read(), "1 fread(" + std::string(part) + ") failed.") << length;
    EXPECT_EQ(target->cryptoSync.length, length == 0 ? 0U : 8U) << length;
  }
  for (const char* length : {"ffffffff", "feffffff", "00000080", "5d000000", "09000100"}) {
    putFile(path, fixedFile().replace(0, 4, fromHex(length)));
    EXPECT_EQ(read(), "1 fread(cryptoSync) failed.") << length;
  }
  int ends[2];  // a pipe does not say how much is left
  ASSERT_EQ(pipe(ends), 0);
  EXPECT_EQ(write(ends[1], "\xff\xff\xff\xffxx", 6), 6);
  const std::string pipePath = "/dev/fd/" + std::to_string(ends[0]);
  putFile(path, fixedFile());
  expectOutcomes("readKeyStashFile",
                 {{"1 fopen() failed.", replacing(path, missing.c_str())},
                  {"1 fopen() failed.", limited(RLIMIT_NOFILE, 0)},
                  {"1 fread(cryptoSync) failed.", replacing(path, "/")},
                  {memory, replacing(path, pipePath.c_str())}},
                 [&] { return readKeyStashFile(path, target); });
  for (const int end : ends) close(end);
}

TEST_F(Keys, FilesThatCannotBeWritten) {
  signal(SIGXFSZ, SIG_IGN);
  expectOutcomes("writeKeyStashFile",
                 {{"1 fopen() failed.", replacing(path, "/")},
                  {"1 fopen() failed.", limited(RLIMIT_NOFILE, 0)},
                  {"1 fwrite(cryptoSync) failed.", replacing(path, "/dev/full")},
                  {"1 fwrite(cryptoSync) failed.", limited(RLIMIT_FSIZE, 2)},
                  {"1 fwrite(cryptoSync) failed.", limited(RLIMIT_FSIZE, 11)},
                  {"1 fwrite(cryptoSalt) failed.", limited(RLIMIT_FSIZE, 12)},
                  {"1 fwrite(aesKeys) failed.", limited(RLIMIT_FSIZE, 95)}},
                 [&] { return writeKeyStashFile(path, record); });
  EXPECT_EQ(fileContent(path), fixedFile().substr(0, 95)) << "what was written stays";
  EXPECT_EQ(writeKeyStashFile(nullptr, record) + writeKeyStashFile(path, nullptr), 2);
}

// ---- Creating and rebuilding ----

TEST_F(Keys, PairsAreCreatedAndRebuiltTheSame) {
  char* sync = nullptr;
  const char *seed = "abcdefghijkl", *salt = "saltsaltsalt", *cfg = other.c_str();
  const auto create = [&] { return createKeyStashFiles(cfg, path, seed, &sync, salt); };
  const auto restore = [&] { return restoreKeyStashFile(path, seed, salt); };
  ASSERT_EQ(create(), 0);
  const std::string before = fileContent(cfg);
  EXPECT_EQ(before.substr(4, 16), taken(std::exchange(sync, nullptr)));
  EXPECT_EQ(before.size(), 104U);
  // The sync text and the keys of this seed and salt stand in tests/data/derivation.vec.
  const std::string key = fromHex("5c1377fc453beea3703678604efde41ebdc95e7367c5fc29e10b6ebf8c58b521");
  const std::string whole =
      std::string("\x10\0\0\0", 4) + "ytzNSq98tK5eecLy" + salt + key.substr(0, 16) + key.substr(0, 24) + key;
  EXPECT_EQ(fileContent(path), whole);
  putFile(path, "");
  EXPECT_EQ(restore(), 0);
  EXPECT_EQ(fileContent(path), whole);
  for (const std::string& secret : {std::string(seed), key.substr(0, 16)}) {
    const ReleaseWatch watch(secret);
    EXPECT_EQ(restore(), 0);
    replacing(path, "/dev/full")([&] { EXPECT_EQ(create() + restore(), 2); });
    EXPECT_EQ(watch.withSecret(), 0) << secret;
  }
  replacing(salt, nullptr)([&] { ASSERT_EQ(create(), 0); });
  EXPECT_NE(fileContent(cfg), before);
  EXPECT_NE(fileContent(path).substr(20, 12), "saltsaltsalt");
  free(std::exchange(sync, nullptr));

  const std::string whichever = fileContent(cfg);
  withQuickDigests()([&] {
    expectOutcomes("createKeyStashFiles",
                   {{"19 validateCryptoString(dir) failed.", replacing(seed, "short")},
                    {"19 Invalid parameter.", replacing(salt, "thirteen char")},
                    {"1 writeKeyStashFile(cfg) failed.", replacing(cfg, missing.c_str())},
                    {"1 writeKeyStashFile(dir) failed.", replacing(path, "/dev/full")}},
                   create);
    EXPECT_NE(fileContent(cfg), whichever) << "a configuration file once written stays";
    EXPECT_EQ(sync, nullptr);
    expectOutcomes("restoreKeyStashFile",
                   {{"19 validateCryptoString(seed) failed.", replacing(seed, "short")},
                    {"19 validateCryptoString(salt) failed.", replacing(salt, "thirteen char")},
                    {"1 writeKeyStashFile() failed.", replacing(path, missing.c_str())}},
                   restore);
  });
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
}

}  // namespace
