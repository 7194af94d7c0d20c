// SPDX-License-Identifier: Apache-2.0
#include "keys/stash.h"

#include <sys/stat.h>

#include <cstdint>

#include "base/failure.h"
#include "base/input.h"
#include "base/messages.h"
#include "keys/stash_folder.h"

namespace tool {
namespace {

// The size that the stash file format gives to a record.
off_t stashBytes(const KeyRecord& record) {
  size_t bytes = sizeof(std::uint32_t) + record.sync().size() + record.salt().size();
  for (const SecBuffer& key : record.get()->aesKeys) bytes += key.length;
  return static_cast<off_t>(bytes);
}

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
  Secret salt = firstLine(path, "salt");
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

void requireDone(int code, const std::string& what) {
  if (code == LDAPPW_SUCCESS) return;
  if (code == LDAPPW_NO_MEMORY) throw Failure(kInternal, what + ": out of memory");
  if (code == LDAPPW_CONSTRAINT_VIOLATION) throw Failure(kBadValue, what + ": the seed or salt is not acceptable");
  throw Failure(kInternal, what + ": the library failed with code " + std::to_string(code));
}

void requireWritten(int code, const std::string& what) {
  if (code == LDAPPW_OPERATIONS_ERROR) throw Failure(kIoError, what + " could not be written; nothing was replaced");
  requireDone(code, what);
}

KeyRecord readBack(const OutputFile& file) {
  AesKeyData* loaded = nullptr;
  const int code = setAESKeyData(file.temporaryPath().c_str(), &loaded);
  KeyRecord record(loaded);
  struct stat written {};
  struct stat made {};
  const bool whole = code == LDAPPW_SUCCESS && stat(file.temporaryPath().c_str(), &written) == 0 &&
                     fstat(file.fd(), &made) == 0 && written.st_dev == made.st_dev && written.st_ino == made.st_ino &&
                     (made.st_mode & 07777) == kStashMode && made.st_size == stashBytes(record);
  if (!whole) throw Failure(kIoError, file.target() + " could not be written whole; nothing was replaced");
  return record;
}

KeyRecord makeDirectoryStash(const std::string& path, bool force, const Secret& seed, const Secret& salt) {
  const StashFolders locked({path});
  OutputFile file(path, kStashMode, force);
  file.requireRoom(kStashRoom);
  requireWritten(restoreKeyStashFile(file.temporaryPath().c_str(), seed.c_str(), salt.c_str()), path);
  KeyRecord record = readBack(file);
  if (!sameRecord(record, deriveRecord(seed, salt.view()))) {
    throw Failure(kIoError, path + " could not be written whole; nothing was replaced");
  }
  file.sync();
  const std::string kept = file.keepOld();
  file.commit();
  if (!kept.empty()) message("the old file is kept as " + kept);
  return record;
}

}  // namespace tool
