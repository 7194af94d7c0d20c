// SPDX-License-Identifier: Apache-2.0
// Creating and rebuilding stash files, and what seeds and salts must look like. Log readers match the texts as they
// are, those that name another function or call a bad salt an invalid parameter among them; the Keys, Ledger and
// CryptoStrings suites pin all.
#include <cstring>

#include "aes/aes_file_format.h"
#include "aes/aes_utils_record.h"
#include "provider/qel_utils.h"
#include "support/trace_scope.h"

namespace ldappw {
namespace {

constexpr TraceInfo kCreate =
    operation(kAesFile, 3, "createKeyStashFiles",
              {"cfgKeyStashFile", "dirKeyStashFile", "dirCryptoSeed", "cryptoSyncStr", "dirCryptoSalt"});

constexpr TraceInfo named(TraceInfo info, const char* enteringAs, const char* leavingLine) {
  info.enteringAs = enteringAs;
  info.leavingLine = leavingLine;
  return info;
}

constexpr TraceInfo kRestore =
    named(operation(kAesFile, 4, "restoreKeyStashFile", {"keyStashFile", "cryptoSeed", "cryptoSalt"}),
          "createKeyStashFiles", "genKeyStashFile: Leaving. rc = %d\n");
constexpr TraceInfo kValidate =
    named(operation(kAesFile, 5, "validateCryptoString", {"cryptoString"}), "validateCryptoSeed", nullptr);

constexpr int kSeedType = 0;
constexpr int kSaltType = 1;
constexpr size_t kShortestText = 12;
constexpr size_t kLongestSeed = 1016;
constexpr size_t kLongestSalt = 12;
constexpr unsigned char kFirstPrintable = 33;
constexpr unsigned char kLastPrintable = 126;
constexpr char kDigestName[] = "SHA1";

// A record of this module's own.
class OwnRecord {
 public:
  AesKeyData** slot() noexcept { return &record_; }
  const AesKeyData* get() const noexcept { return record_; }

 private:
  AesKeyData* record_ = nullptr;
  RecordGuard guard_{&record_};
};

int generate(const Digest& digest, const char* seed, const char* salt, OwnRecord& record) noexcept {
  return genKeyDataVal(digest.qelCtx, digest.context, digest.algorithm, seed, salt, record.slot());
}

int copySync(TracedCall& call, const SecBuffer& sync, char** out) noexcept {
  *out = zeroedBytes<char>(size_t{sync.length} + 1);
  if (*out == nullptr) return call.fail(LDAPPW_NO_MEMORY, "calloc(cryptoSyncStr) returned NULL.");
  std::memcpy(*out, sync.data, sync.length);
  return LDAPPW_SUCCESS;
}

int createCfgFile(TracedCall& call, const Digest& digest, const char* path, char** cryptoSyncStr) noexcept {
  OwnRecord record;
  if (const int rc = generate(digest, nullptr, nullptr, record); rc != 0) {
    return call.fail(rc, "genKeyDataVal(cfg) failed.");
  }
  if (const int rc = writeKeyStashFile(path, record.get()); rc != 0) {
    return call.fail(rc, "writeKeyStashFile(cfg) failed.");
  }
  return copySync(call, record.get()->cryptoSync, cryptoSyncStr);
}

int createDirFile(TracedCall& call, const Digest& digest, const char* path, const char* seed,
                  const char* salt) noexcept {
  OwnRecord record;
  if (const int rc = generate(digest, seed, salt, record); rc != 0) {
    return call.fail(rc, "genKeyDataVal(dir) failed.");
  }
  if (const int rc = writeKeyStashFile(path, record.get()); rc != 0) {
    return call.fail(rc, "writeKeyStashFile(dir) failed.");
  }
  return LDAPPW_SUCCESS;
}

}  // namespace
}  // namespace ldappw

using namespace ldappw;

extern "C" {

// Documented in aes_keys.h.

int createKeyStashFiles(const char* cfgKeyStashFile, const char* dirKeyStashFile, const char* dirCryptoSeed,
                        char** cryptoSyncStr, const char* dirCryptoSalt) noexcept {
  TracedCall call{kCreate, cfgKeyStashFile, dirKeyStashFile, dirCryptoSeed, cryptoSyncStr, dirCryptoSalt};
  if (anyNull(cfgKeyStashFile, dirKeyStashFile, dirCryptoSeed, cryptoSyncStr)) return call.invalid();
  OutGuard result{cryptoSyncStr};
  if (const int rc = validateCryptoString(dirCryptoSeed, kSeedType); rc != 0) {
    return call.fail(rc, "validateCryptoString(dir) failed.");
  }
  if (dirCryptoSalt != nullptr) {
    if (const int rc = validateCryptoString(dirCryptoSalt, kSaltType); rc != 0) {
      return call.fail(rc, "Invalid parameter.");
    }
  }
  void* qelCtx = nullptr;
  if (const int rc = initQelCrypto(&qelCtx); rc != 0) return call.fail(rc, "initQelCrypto() failed.");
  DigestOwner digest(qelCtx);
  if (const int rc = digest.open(kDigestName); rc != 0) return call.fail(rc, "initQelDigest() failed.");
  if (const int rc = createCfgFile(call, digest, cfgKeyStashFile, cryptoSyncStr); rc != 0) return rc;
  if (const int rc = createDirFile(call, digest, dirKeyStashFile, dirCryptoSeed, dirCryptoSalt); rc != 0) return rc;
  result.keep();
  return call.leave(LDAPPW_SUCCESS);
}

int restoreKeyStashFile(const char* keyStashFile, const char* cryptoSeed, const char* cryptoSalt) noexcept {
  TracedCall call{kRestore, keyStashFile, cryptoSeed, cryptoSalt};
  if (anyNull(keyStashFile, cryptoSeed, cryptoSalt)) return call.invalid();
  if (const int rc = validateCryptoString(cryptoSeed, kSeedType); rc != 0) {
    return call.fail(rc, "validateCryptoString(seed) failed.");
  }
  if (const int rc = validateCryptoString(cryptoSalt, kSaltType); rc != 0) {
    return call.fail(rc, "validateCryptoString(salt) failed.");
  }
  void* qelCtx = nullptr;
  if (const int rc = initQelCrypto(&qelCtx); rc != 0) return call.fail(rc, "initQelCrypto() failed.");
  DigestOwner digest(qelCtx);
  if (const int rc = digest.open(kDigestName); rc != 0) return call.fail(rc, "initQelDigest() failed.");
  OwnRecord record;
  if (const int rc = generate(digest, cryptoSeed, cryptoSalt, record); rc != 0) {
    return call.fail(rc, "genKeyDataVal(dir) failed.");
  }
  if (const int rc = writeKeyStashFile(keyStashFile, record.get()); rc != 0) {
    return call.fail(rc, "writeKeyStashFile() failed.");
  }
  return call.leave(LDAPPW_SUCCESS);
}

int validateCryptoString(const char* cryptoString, int type) noexcept {
  TracedCall call{kValidate, cryptoString};
  if (cryptoString == nullptr) return call.invalid();
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
