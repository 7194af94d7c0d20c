// SPDX-License-Identifier: Apache-2.0
#include "keys/stash.h"

#include <sys/stat.h>

#include <utility>

#include "base/failure.h"
#include "base/input.h"
#include "base/messages.h"
#include "crypto_provider.h"
#include "keys/stash_folder.h"

namespace tool {
namespace {

bool acceptable(const Secret& text, int type) {
  return text.view().find('\0') == std::string_view::npos && validateCryptoString(text.c_str(), type) == LDAPPW_SUCCESS;
}

}  // namespace

void requireSeed(const Secret& seed) {
  if (acceptable(seed, 0)) return;
  throw Failure(kBadValue, "a seed has 12 to 1016 characters, each a letter, digit or punctuation mark of ASCII");
}

void requireSalt(const Secret& salt) {
  if (acceptable(salt, 1)) return;
  throw Failure(kBadValue, "a salt has exactly 12 characters, each a letter, digit or punctuation mark of ASCII");
}

Secret readSaltFile(const std::string& path) {
  Secret salt = firstLine(path, kSaltLine);
  requireSalt(salt);
  return salt;
}

KeyRecord deriveRecord(const Secret& seed, std::string_view salt) {
  AesKeyData* made = nullptr;
  const int code = genTmpKeyDataVal(seed.c_str(), std::string(salt).c_str(), &made);
  KeyRecord record(made);
  requireDone(code, "the keys could not be derived");
  return record;
}

KeyRecord drawRecord() {
  struct Contexts {
    ~Contexts() { freeQelDigest(provider, digest); }
    void* provider = nullptr;
    void* digest = nullptr;
    void* algorithm = nullptr;
  } contexts;
  requireDone(initQelCrypto(&contexts.provider), "the crypto provider");
  requireDone(initQelDigest(contexts.provider, &contexts.digest, "SHA1", &contexts.algorithm), "SHA1");
  AesKeyData* made = nullptr;
  const int code = genKeyDataVal(contexts.provider, contexts.digest, contexts.algorithm, nullptr, nullptr, &made);
  KeyRecord record(made);
  requireDone(code, "the keys could not be drawn");
  return record;
}

void requireDone(int code, const std::string& what) {
  if (code == LDAPPW_SUCCESS) return;
  if (code == LDAPPW_NO_MEMORY) throw Failure(kInternal, what + ": out of memory");
  if (code == LDAPPW_CONSTRAINT_VIOLATION) throw Failure(kBadValue, what + ": the seed or salt is not acceptable");
  throw Failure(kInternal, what + ": the library failed with code " + std::to_string(code));
}

void writeStash(OutputFile& file, const KeyRecord& record) {
  const Secret content = record.content();
  file.write(content.view());
  struct stat made {};
  const bool whole = fstat(file.fd(), &made) == 0 && (made.st_mode & 07777) == kStashMode &&
                     equalBytes(beginningOf(file.fd(), content.size() + 1).view(), content.view());
  if (!whole) throw Failure(kIoError, file.target() + " could not be written whole; nothing was replaced");
}

KeyRecord makeDirectoryStash(const std::string& path, bool force, const Secret& seed, const Secret& salt) {
  Place place(path, force);
  const StashFolders locked({&place});
  OutputFile file(std::move(place), kStashMode);
  KeyRecord record = deriveRecord(seed, salt.view());
  writeStash(file, record);
  file.sync();
  const std::string kept = file.keepOld();
  file.commit();
  if (!kept.empty()) message("the old file is kept as " + kept);
  return record;
}

}  // namespace tool
