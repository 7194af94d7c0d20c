// SPDX-License-Identifier: Apache-2.0
// Key stash files: their format, and the operations that create and rebuild them.
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdio>
#include <cstring>

#include "aes_internal.h"
#include "qel_utils.h"
#include "trace_scope.h"

static_assert(__BYTE_ORDER__ == __ORDER_LITTLE_ENDIAN__, "the file's sync length is little-endian");

namespace ldappw {
namespace {

constexpr TraceInfo operation(const char* name, unsigned function) {
  return {name, operationScope(moduleId(kAesFile, function)), LineClass::error};
}

constexpr TraceInfo kWrite = operation("writeKeyStashFile", 1);
constexpr TraceInfo kRead = operation("readKeyStashFile", 2);
constexpr TraceInfo kCreate = operation("createKeyStashFiles", 3);
// Two operations enter, and one leaves, under another name: meant.
constexpr TraceInfo kRestore{"restoreKeyStashFile", operationScope(moduleId(kAesFile, 4)),
                             LineClass::error,      Lines::usual,
                             "createKeyStashFiles", "genKeyStashFile: Leaving. rc = %d\n"};
constexpr TraceInfo kValidate{"validateCryptoString", operationScope(moduleId(kAesFile, 5)),
                              LineClass::error,       Lines::usual,
                              "validateCryptoSeed",   nullptr};

constexpr int kSeedType = 0;
constexpr int kSaltType = 1;
constexpr size_t kShortestText = 12;
constexpr size_t kLongestSeed = 1016;
constexpr size_t kLongestSalt = 12;
constexpr unsigned char kFirstPrintable = 33;
constexpr unsigned char kLastPrintable = 126;
constexpr char kDigestName[] = "SHA1";

// A stash file under way. It has no buffer of its own: no key stays behind in one, and a write that the device refuses
// is noticed at once.
class StashFile {
 public:
  static StashFile forReading(const char* path) noexcept { return StashFile(std::fopen(path, "rbe")); }
  static StashFile forWriting(const char* path) noexcept {
    const int descriptor = open(path, O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, S_IRUSR | S_IWUSR);
    if (descriptor < 0) return StashFile(nullptr);
    FILE* file = fdopen(descriptor, "wb");
    if (file == nullptr) close(descriptor);
    return StashFile(file);
  }
  ~StashFile() {
    if (file_ != nullptr) std::fclose(file_);
  }
  StashFile(const StashFile&) = delete;
  StashFile& operator=(const StashFile&) = delete;

  explicit operator bool() const noexcept { return file_ != nullptr; }
  bool read(void* data, size_t bytes) noexcept { return std::fread(data, 1, bytes, file_) == bytes; }
  bool write(const void* data, size_t bytes) noexcept { return std::fwrite(data, 1, bytes, file_) == bytes; }
  bool write(const SecBuffer& buffer) noexcept { return buffer.length == 0 || write(buffer.data, buffer.length); }
  void flush() noexcept { std::fflush(file_); }

  // Whether a regular file is known to hold less than so many further bytes.
  bool endsBefore(size_t bytes) noexcept {
    struct stat about {};
    const long at = std::ftell(file_);
    return fstat(fileno(file_), &about) == 0 && S_ISREG(about.st_mode) && at >= 0 &&
           static_cast<uint64_t>(about.st_size) - static_cast<uint64_t>(at) < bytes;
  }

 private:
  explicit StashFile(FILE* file) noexcept : file_(file) {
    if (file_ != nullptr) std::setvbuf(file_, nullptr, _IONBF, 0);
  }
  FILE* file_;
};

// A record of this module's own.
class OwnRecord {
 public:
  AesKeyData** slot() noexcept { return &record_; }
  const AesKeyData* get() const noexcept { return record_; }

 private:
  AesKeyData* record_ = nullptr;
  RecordGuard guard_{&record_};
};

// The sync text with its length before it. What a regular file cannot hold is not allocated.
int readSync(TracedCall& call, StashFile& file, SecBuffer& sync) noexcept {
  uint32_t length = 0;
  if (!file.read(&length, sizeof length) || file.endsBefore(length)) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "fread(cryptoSync) failed.");
  }
  wipeAndFree(sync.data);
  sync.length = length;
  sync.data = length == UINT32_MAX ? nullptr : zeroedBytes<unsigned char>(size_t{length} + 1);
  if (sync.data == nullptr) {  // under another name: meant
    return call.failText(LDAPPW_NO_MEMORY, "Error - genKeySyncVal: calloc(cryptoSync) returned NULL. rc = %d\n",
                         static_cast<int>(LDAPPW_NO_MEMORY));
  }
  if (!file.read(sync.data, length)) return call.fail(LDAPPW_OPERATIONS_ERROR, "fread(cryptoSync) failed.");
  return LDAPPW_SUCCESS;
}

// Contexts that both creating and rebuilding need.
struct Generator {
  void* qelCtx;
  DigestContext& digest;
  int generate(const char* seed, const char* salt, OwnRecord& record) const noexcept {
    return genKeyDataVal(qelCtx, digest.get(), digest.algorithm(), seed, salt, record.slot());
  }
};

int copySync(TracedCall& call, const SecBuffer& sync, char** out) noexcept {
  *out = zeroedBytes<char>(size_t{sync.length} + 1);
  if (*out == nullptr) return call.fail(LDAPPW_NO_MEMORY, "calloc(cryptoSyncStr) returned NULL.");
  std::memcpy(*out, sync.data, sync.length);
  return LDAPPW_SUCCESS;
}

int createCfgFile(TracedCall& call, const Generator& generator, const char* path, char** cryptoSyncStr) noexcept {
  OwnRecord record;
  if (const int rc = generator.generate(nullptr, nullptr, record); rc != 0) {
    return call.fail(rc, "genKeyDataVal(cfg) failed.");
  }
  if (const int rc = writeKeyStashFile(path, record.get()); rc != 0) {
    return call.fail(rc, "writeKeyStashFile(cfg) failed.");
  }
  return copySync(call, record.get()->cryptoSync, cryptoSyncStr);
}

int createDirFile(TracedCall& call, const Generator& generator, const char* path, const char* seed,
                  const char* salt) noexcept {
  OwnRecord record;
  if (const int rc = generator.generate(seed, salt, record); rc != 0) {
    return call.fail(rc, "genKeyDataVal(dir) failed.");
  }
  if (const int rc = writeKeyStashFile(path, record.get()); rc != 0) {
    return call.fail(rc, "writeKeyStashFile(dir) failed.");
  }
  return LDAPPW_SUCCESS;
}

}  // namespace

int writeKeyStashFile(const char* keyStashFile, const AesKeyData* keyData) noexcept {
  TracedCall call{kWrite, "keyStashFile", keyStashFile, "keyData", keyData};
  if (keyStashFile == nullptr || keyData == nullptr) return call.fail(LDAPPW_OPERATIONS_ERROR, "Invalid parameter.");
  StashFile file = StashFile::forWriting(keyStashFile);
  if (!file) return call.fail(LDAPPW_OPERATIONS_ERROR, "fopen() failed.");
  const uint32_t length = keyData->cryptoSync.length;
  if (!file.write(&length, sizeof length) || !file.write(keyData->cryptoSync)) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "fwrite(cryptoSync) failed.");
  }
  if (!file.write(keyData->cryptoSalt)) return call.fail(LDAPPW_OPERATIONS_ERROR, "fwrite(cryptoSalt) failed.");
  for (const SecBuffer& key : keyData->aesKeys) {
    if (!file.write(key)) return call.fail(LDAPPW_OPERATIONS_ERROR, "fwrite(aesKeys) failed.");
  }
  file.flush();
  return call.leave(LDAPPW_SUCCESS);
}

}  // namespace ldappw

using namespace ldappw;

extern "C" {

// Documented in aes_keys.h.

int readKeyStashFile(const char* keyStashFile, AesKeyData* keyData) noexcept {
  TracedCall call{kRead, "keyStashFile", keyStashFile, "keyData", keyData};
  if (keyStashFile == nullptr || keyData == nullptr) return call.fail(LDAPPW_OPERATIONS_ERROR, "Invalid parameter.");
  StashFile file = StashFile::forReading(keyStashFile);
  if (!file) return call.fail(LDAPPW_OPERATIONS_ERROR, "fopen() failed.");
  if (const int rc = readSync(call, file, keyData->cryptoSync); rc != 0) return rc;
  if (!file.read(keyData->cryptoSalt.data, keyData->cryptoSalt.length)) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "fread(cryptoSalt) failed.");
  }
  for (const SecBuffer& key : keyData->aesKeys) {
    if (!file.read(key.data, key.length)) return call.fail(LDAPPW_OPERATIONS_ERROR, "fread(aesKeys) failed.");
  }
  return call.leave(LDAPPW_SUCCESS);
}

int createKeyStashFiles(const char* cfgKeyStashFile, const char* dirKeyStashFile, const char* dirCryptoSeed,
                        char** cryptoSyncStr, const char* dirCryptoSalt) noexcept {
  TracedCall call{kCreate,         "cfgKeyStashFile", cfgKeyStashFile, "dirKeyStashFile",
                  dirKeyStashFile, "dirCryptoSeed",   dirCryptoSeed,   "cryptoSyncStr",
                  cryptoSyncStr,   "dirCryptoSalt",   dirCryptoSalt};
  if (cfgKeyStashFile == nullptr || dirKeyStashFile == nullptr || dirCryptoSeed == nullptr ||
      cryptoSyncStr == nullptr) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "Invalid parameter.");
  }
  OutGuard result{cryptoSyncStr};
  if (const int rc = validateCryptoString(dirCryptoSeed, kSeedType); rc != 0) {
    return call.fail(rc, "validateCryptoString(dir) failed.");
  }
  if (dirCryptoSalt != nullptr) {
    const int rc = validateCryptoString(dirCryptoSalt, kSaltType);
    if (rc != 0) return call.fail(rc, "Invalid parameter.");  // the wording: meant
  }
  void* qelCtx = nullptr;
  if (const int rc = initQelCrypto(&qelCtx); rc != 0) return call.fail(rc, "initQelCrypto() failed.");
  DigestContext digest(qelCtx);
  if (const int rc = digest.init(kDigestName); rc != 0) return call.fail(rc, "initQelDigest() failed.");
  const Generator generator{qelCtx, digest};
  if (const int rc = createCfgFile(call, generator, cfgKeyStashFile, cryptoSyncStr); rc != 0) return rc;
  if (const int rc = createDirFile(call, generator, dirKeyStashFile, dirCryptoSeed, dirCryptoSalt); rc != 0) return rc;
  result.keep(*cryptoSyncStr);
  return call.leave(LDAPPW_SUCCESS);
}

int restoreKeyStashFile(const char* keyStashFile, const char* cryptoSeed, const char* cryptoSalt) noexcept {
  TracedCall call{kRestore, "keyStashFile", keyStashFile, "cryptoSeed", cryptoSeed, "cryptoSalt", cryptoSalt};
  if (keyStashFile == nullptr || cryptoSeed == nullptr || cryptoSalt == nullptr) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "Invalid parameter.");
  }
  if (const int rc = validateCryptoString(cryptoSeed, kSeedType); rc != 0) {
    return call.fail(rc, "validateCryptoString(seed) failed.");
  }
  if (const int rc = validateCryptoString(cryptoSalt, kSaltType); rc != 0) {
    return call.fail(rc, "validateCryptoString(salt) failed.");
  }
  void* qelCtx = nullptr;
  if (const int rc = initQelCrypto(&qelCtx); rc != 0) return call.fail(rc, "initQelCrypto() failed.");
  DigestContext digest(qelCtx);
  if (const int rc = digest.init(kDigestName); rc != 0) return call.fail(rc, "initQelDigest() failed.");
  OwnRecord record;
  const Generator generator{qelCtx, digest};
  if (const int rc = generator.generate(cryptoSeed, cryptoSalt, record); rc != 0) {
    return call.fail(rc, "genKeyDataVal(dir) failed.");
  }
  if (const int rc = writeKeyStashFile(keyStashFile, record.get()); rc != 0) {
    return call.fail(rc, "writeKeyStashFile() failed.");
  }
  return call.leave(LDAPPW_SUCCESS);
}

int validateCryptoString(const char* cryptoString, int type) noexcept {
  TracedCall call{kValidate, "cryptoString", cryptoString};
  if (cryptoString == nullptr) return call.fail(LDAPPW_OPERATIONS_ERROR, "Invalid parameter.");
  if (type != kSeedType && type != kSaltType) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "Invalid crypto string type.");
  }
  constexpr int refused = LDAPPW_CONSTRAINT_VIOLATION;
  const size_t length = std::strlen(cryptoString);
  if (length < kShortestText) {
    return call.failText(refused, "Error - validateCryptoString: Crypto string too short, length = %d, rc = %d\n",
                         static_cast<int>(length), refused);
  }
  if (length > (type == kSeedType ? kLongestSeed : kLongestSalt)) {
    return call.failText(refused, "Error - validateCryptoString: Crypto string too long, length = %d, rc = %d\n",
                         static_cast<int>(length), refused);
  }
  for (const char* at = cryptoString; *at != '\0'; ++at) {
    const auto byte = static_cast<unsigned char>(*at);
    if (byte < kFirstPrintable || byte > kLastPrintable) {
      return call.failText(refused, "Error - validateCryptoString: Invalid crypto string character = %d, rc = %d\n",
                           int{byte}, refused);
    }
  }
  return call.leave(LDAPPW_SUCCESS);
}

}  // extern "C"
