// SPDX-License-Identifier: Apache-2.0
// Stash files: their bytes, their creation in pairs, their rebuilding, and what goes wrong.
#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/stat.h>

#include <algorithm>
#include <csignal>

#include "aes_internal.h"
#include "failures.h"
#include "oracle.h"

namespace {

using ldappw::writeKeyStashFile;
using test::AllocationWatch;
using test::contentOf;
using test::failingAllocation;
using test::fileContent;
using test::fixedFile;
using test::fixedRecord;
using test::Lines;
using test::putFile;
using test::replacing;
using test::TempFolder;
using test::TraceCapture;

constexpr char kSalt[] = "saltsaltsalt";

TEST(StashFiles, HoldTheRecordByteForByte) {
  const TempFolder folder;
  const std::string path = folder.file("stash");
  const mode_t mask = umask(0);
  AesKeyData* record = fixedRecord();
  EXPECT_EQ(writeKeyStashFile(path.c_str(), record), 0);
  EXPECT_EQ(fileContent(path), fixedFile());
  struct stat about {};
  ASSERT_EQ(stat(path.c_str(), &about), 0);
  EXPECT_EQ(about.st_mode & 07777U, 0600U);
  putFile(path, std::string(500, 'x'));
  EXPECT_EQ(writeKeyStashFile(path.c_str(), record), 0);
  EXPECT_EQ(fileContent(path), fixedFile());
  putFile(path, fixedFile() + "bytes behind the last key");
  freeAesKeyData(std::exchange(record, nullptr));
  ASSERT_EQ(initAesKeyData(&record), 0);
  for (int twice = 0; twice < 2; ++twice) EXPECT_EQ(readKeyStashFile(path.c_str(), record), 0);
  EXPECT_EQ(contentOf(*record), test::fixedContent());
  EXPECT_STREQ(reinterpret_cast<char*>(record->cryptoSync.data), "c3luYw==");
  freeAesKeyData(record);
  umask(mask);
}

// Reading the file into a new record gives that code and that line.
void expectUnreadable(
    const std::string& path, int rc, const std::string& line,
    const test::Failure& failure = [](const test::Body& body) { body(); }) {
  SCOPED_TRACE(path);
  AesKeyData* record = nullptr;
  ASSERT_EQ(initAesKeyData(&record), 0);
  test::expectFailures({{rc, {line}, failure}}, LDTR_ERROR, [&] { return readKeyStashFile(path.c_str(), record); });
  EXPECT_EQ(freeAesKeyData(record), 0);
}

TEST(StashFiles, ThatCannotBeRead) {
  const TempFolder folder;
  const std::string path = folder.file("hostile");
  const std::string sync = "Error - readKeyStashFile: fread(cryptoSync) failed. rc = 1\n";
  for (size_t length = 0; length < fixedFile().size(); ++length) {
    putFile(path, fixedFile().substr(0, length));
    expectUnreadable(path, 1,
                     length < 12   ? sync
                     : length < 24 ? "Error - readKeyStashFile: fread(cryptoSalt) failed. rc = 1\n"
                                   : "Error - readKeyStashFile: fread(aesKeys) failed. rc = 1\n");
  }
  for (const char* length : {"ffffffff", "feffffff", "00000080", "5d000000", "09000100"}) {
    putFile(path, fixedFile().replace(0, 4, test::fromHex(length)));
    expectUnreadable(path, 1, sync);
  }
  expectUnreadable(folder.file("missing"), 1, "Error - readKeyStashFile: fopen() failed. rc = 1\n");
  expectUnreadable(folder.file(""), 1, sync);  // the folder itself
  putFile(path, fixedFile());
  const std::string memory = "Error - genKeySyncVal: calloc(cryptoSync) returned NULL. rc = 90\n";  // another's name
  expectUnreadable(path, 90, memory, failingAllocation(0));
  int ends[2];  // a pipe does not tell how much is left
  ASSERT_EQ(pipe(ends), 0);
  EXPECT_EQ(write(ends[1], "\xff\xff\xff\xffxx", 6), 6);
  close(ends[1]);
  expectUnreadable("/dev/fd/" + std::to_string(ends[0]), 90, memory);
  close(ends[0]);
  const TraceCapture trace;
  EXPECT_EQ(readKeyStashFile(path.c_str(), nullptr), 1);
  EXPECT_EQ(trace.messages(), Lines{"Error - readKeyStashFile: Invalid parameter. rc = 1\n"});
}

// Ends the process: 0 when the writing, stopped by a limit at that byte, told so.
void writeUpTo(rlim_t limit, const std::string& path, const AesKeyData* record, const std::string& line) {
  const rlimit small{limit, limit};
  setrlimit(RLIMIT_FSIZE, &small);
  signal(SIGXFSZ, SIG_IGN);
  const TraceCapture trace;
  const int rc = writeKeyStashFile(path.c_str(), record);
  _exit(rc == 1 && trace.messages() == Lines{line} ? 0 : 1);
}

TEST(StashFiles, ThatCannotBeWritten) {
  const TempFolder folder;
  const std::string folderPath = folder.file("");
  const std::string cut = folder.file("cut");
  AesKeyData* const record = fixedRecord();
  const AesKeyData* subject = record;
  const char* path = cut.c_str();
  test::expectFailures(test::Rows("writeKeyStashFile")
                           .refuses({replacing(path, nullptr), replacing(subject, nullptr)})
                           .fails(1, "fopen() failed.", replacing(path, folderPath.c_str()))
                           .fails(1, "fwrite(cryptoSync) failed.", replacing(path, "/dev/full")),
                       LDTR_ERROR, [&] { return writeKeyStashFile(path, subject); });
  for (const auto& [limit, what] :
       {std::pair{2U, "cryptoSync"}, {11U, "cryptoSync"}, {12U, "cryptoSalt"}, {24U, "aesKeys"}, {95U, "aesKeys"}}) {
    const std::string line = "Error - writeKeyStashFile: fwrite(" + std::string(what) + ") failed. rc = 1\n";
    EXPECT_EXIT(writeUpTo(limit, cut, record, line), testing::ExitedWithCode(0), "");
    EXPECT_EQ(fileContent(cut), fixedFile().substr(0, limit));  // what was written stays
  }
  freeAesKeyData(record);
}

// ---- Creating and rebuilding ----

class StashFileMaking : public testing::Test {
 protected:
  void SetUp() override {
    void* context = nullptr;
    ASSERT_EQ(initQelCrypto(&context), 0);
  }
  const TempFolder folder_;
  const std::string cfgPath_ = folder_.file("cfg");
  const std::string dirPath_ = folder_.file("dir");
  const std::string nowhere_ = folder_.file("no/file");
  const test::Failure noDigest_ =
      replacing(pQEL_EVP_get_digestbyname, [](void*, const char*) -> const void* { return nullptr; });
  // The arguments, for rows to replace.
  const char* cfg = cfgPath_.c_str();
  const char* dir = dirPath_.c_str();
  const char* seed = "abcdefghijkl";
  const char* salt = kSalt;
  char* sync = nullptr;
  char** slot = &sync;
};

TEST_F(StashFileMaking, PairsAreCreatedAndRebuiltTheSame) {
  ASSERT_EQ(createKeyStashFiles(cfg, dir, seed, slot, salt), 0);
  EXPECT_EQ(fileContent(cfgPath_).substr(4, 16), sync);
  EXPECT_EQ(fileContent(cfgPath_).size(), 104U);
  // The sync text and the keys of this seed and salt stand in tests/data/derivation.vec.
  const std::string key = test::fromHex("5c1377fc453beea3703678604efde41ebdc95e7367c5fc29e10b6ebf8c58b521");
  const std::string whole =
      std::string("\x10\0\0\0", 4) + "ytzNSq98tK5eecLy" + kSalt + key.substr(0, 16) + key.substr(0, 24) + key;
  EXPECT_EQ(fileContent(dirPath_), whole);
  EXPECT_EQ(restoreKeyStashFile(folder_.file("again").c_str(), seed, salt), 0);
  EXPECT_EQ(fileContent(folder_.file("again")), whole);
  free(std::exchange(sync, nullptr));
  const std::string before = fileContent(cfgPath_);
  ASSERT_EQ(createKeyStashFiles(cfg, dir, seed, slot, nullptr), 0);
  EXPECT_NE(fileContent(cfgPath_), before);
  EXPECT_NE(fileContent(dirPath_).substr(20, 12), kSalt);
  free(sync);
}

TEST_F(StashFileMaking, CreationReportsEachStepThatFails) {
  const auto rows = test::Rows("createKeyStashFiles")
                        .refuses({replacing(cfg, nullptr), replacing(dir, nullptr), replacing(seed, nullptr),
                                  replacing(slot, nullptr)})
                        .fails(19, "validateCryptoString(dir) failed.", replacing(seed, "short"),
                               {"Error - validateCryptoString: Crypto string too short, length = 5, rc = 19\n"})
                        .fails(19, "Invalid parameter.", replacing(salt, "short"))
                        .fails(1, "initQelCrypto() failed.", test::withoutProvider())
                        .fails(1, "initQelDigest() failed.", noDigest_)
                        .fails(1, "writeKeyStashFile(cfg) failed.", replacing(cfg, nowhere_.c_str()))
                        .fails(1, "writeKeyStashFile(dir) failed.", replacing(dir, "/dev/full"));
  test::withQuickDigests()(
      [&] { test::expectFailures(rows, LDTR_ERROR, [&] { return createKeyStashFiles(cfg, dir, seed, slot, salt); }); });
  EXPECT_EQ(sync, nullptr);
  EXPECT_EQ(fileContent(cfgPath_).size(), 104U) << "a configuration file once written stays";
}

TEST_F(StashFileMaking, CreationReportsEveryAllocationThatFails) {
  std::vector<std::string> last;
  const auto create = [&] {
    for (long failing = 0; sync == nullptr; ++failing) {
      const TraceCapture trace;
      const AllocationWatch watch(failing);
      const int rc = createKeyStashFiles(cfg, dir, seed, slot, salt);
      ASSERT_EQ(sync == nullptr, rc != 0);
      if (rc != 0) last.push_back(trace.messages().back());
    }
  };
  test::withQuickDigests()(create);
  free(sync);
  last.erase(std::unique(last.begin(), last.end()), last.end());
  EXPECT_EQ(last, (Lines{"Error - createKeyStashFiles: genKeyDataVal(cfg) failed. rc = 90\n",
                         "Error - createKeyStashFiles: genKeyDataVal(cfg) failed. rc = 1\n",  // of the base64 step
                         "Error - createKeyStashFiles: genKeyDataVal(cfg) failed. rc = 90\n",
                         "Error - createKeyStashFiles: calloc(cryptoSyncStr) returned NULL. rc = 90\n",
                         "Error - createKeyStashFiles: genKeyDataVal(dir) failed. rc = 90\n",
                         "Error - createKeyStashFiles: genKeyDataVal(dir) failed. rc = 1\n",
                         "Error - createKeyStashFiles: genKeyDataVal(dir) failed. rc = 90\n"}));
}

TEST_F(StashFileMaking, RebuildingReportsEachStepThatFails) {
  test::expectFailures(test::Rows("restoreKeyStashFile")
                           .refuses({replacing(dir, nullptr), replacing(seed, nullptr), replacing(salt, nullptr)})
                           .fails(19, "validateCryptoString(seed) failed.", replacing(seed, "short"))
                           .fails(19, "validateCryptoString(salt) failed.", replacing(salt, "short"))
                           .fails(1, "initQelCrypto() failed.", test::withoutProvider())
                           .fails(1, "initQelDigest() failed.", noDigest_)
                           .fails(90, "genKeyDataVal(dir) failed.", failingAllocation(0))
                           .fails(1, "writeKeyStashFile() failed.", replacing(dir, nowhere_.c_str())),
                       LDTR_ERROR, [&] { return restoreKeyStashFile(dir, seed, salt); });
  const TraceCapture trace;
  EXPECT_EQ(restoreKeyStashFile(dir, nullptr, nullptr), 1);
  EXPECT_EQ(test::outlineOf(trace),
            ">createKeyStashFiles: Entering. keyStashFile = #, cryptoSeed = (nil), cryptoSalt = (nil)\n"
            "Error - restoreKeyStashFile: Invalid parameter. rc = 1\ngenKeyStashFile: Leaving. rc = 1\n<");
}

TEST(CryptoStrings, AreCheckedForTypeLengthAndCharacters) {
  const std::string start = "Error - validateCryptoString: ";
  const struct {
    std::string text;
    int type, rc;
    std::string line;
  } rows[] = {
      {std::string(12, '!'), 0, 0, ""},
      {std::string(1016, '~'), 0, 0, ""},
      {std::string(11, 'x'), 0, 19, start + "Crypto string too short, length = 11, rc = 19\n"},
      {std::string(1017, 'x'), 0, 19, start + "Crypto string too long, length = 1017, rc = 19\n"},
      {std::string(12, 'x'), 1, 0, ""},
      {"", 1, 19, start + "Crypto string too short, length = 0, rc = 19\n"},
      {std::string(13, ' '), 1, 19, start + "Crypto string too long, length = 13, rc = 19\n"},  // the length first
      {"hundred acres", 0, 19, start + "Invalid crypto string character = 32, rc = 19\n"},
      {"abcdefghijk\x7f", 0, 19, start + "Invalid crypto string character = 127, rc = 19\n"},
      {"abcdefghijk\xe4", 1, 19, start + "Invalid crypto string character = 228, rc = 19\n"},
      {"", 2, 1, start + "Invalid crypto string type. rc = 1\n"},  // and the type before the length
      {std::string(12, 'x'), -1, 1, start + "Invalid crypto string type. rc = 1\n"},
  };
  for (const auto& row : rows) {
    SCOPED_TRACE(row.text);
    const TraceCapture trace;
    EXPECT_EQ(validateCryptoString(row.text.c_str(), row.type), row.rc);
    EXPECT_EQ(test::outlineOf(trace), ">validateCryptoSeed: Entering. cryptoString = #\n" + row.line +
                                          "validateCryptoString: Leaving. rc = " + std::to_string(row.rc) + "\n<");
    EXPECT_EQ(trace.records()[2].severity, row.rc == 0 ? LDTR_DEBUG : LDTR_ERROR);
  }
  const TraceCapture trace;
  EXPECT_EQ(validateCryptoString(nullptr, 0), 1);
  EXPECT_EQ(trace.messages(), Lines{"Error - validateCryptoString: Invalid parameter. rc = 1\n"});
}

}  // namespace
