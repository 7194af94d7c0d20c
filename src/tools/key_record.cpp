// SPDX-License-Identifier: Apache-2.0
// Loading stash files and the provider.
#include "key_record.h"

#include <errno.h>
#include <sys/stat.h>

#include "crypto_provider.h"
#include "failure.h"
#include "input.h"
#include "messages.h"
#include "text.h"

namespace tool {
namespace {

// A file of other content can be long enough, but it has other texts in these places.
bool looksLikeStash(const KeyRecord& record) {
  return base64Bytes(record.sync()) > 0 &&
         validateCryptoString(std::string(record.salt()).c_str(), 1) == LDAPPW_SUCCESS;
}

}  // namespace

std::string_view viewOf(const SecBuffer& buffer) noexcept {
  if (buffer.data == nullptr) return {};
  return {reinterpret_cast<const char*>(buffer.data), buffer.length};
}

KeyRecord KeyRecord::load(const std::string& path) {
  if (path.empty()) return KeyRecord();
  const Input file(path);
  struct stat found {};
  if (fstat(file.fd(), &found) != 0) throw ioFailure(path);
  if (S_ISDIR(found.st_mode)) throw ioFailure(path, EISDIR);
  if (S_ISREG(found.st_mode) && (found.st_mode & (S_IRWXG | S_IRWXO)) != 0) {
    warning(path + " is open to other users of the system; its mode should be 0600");
  }
  AesKeyData* loaded = nullptr;
  const int code = setAESKeyData(path.c_str(), &loaded);
  KeyRecord record(loaded);
  if (code == LDAPPW_NO_MEMORY) throw Failure(kInternal, path + ": out of memory");
  if (code != LDAPPW_SUCCESS || !looksLikeStash(record)) {
    throw Failure(kBadKey, path + " is not a whole key stash file");
  }
  return record;
}

std::string_view KeyRecord::sync() const noexcept {
  return viewOf(record_->cryptoSync);
}

std::string_view KeyRecord::salt() const noexcept {
  return viewOf(record_->cryptoSalt);
}

void requireProvider() {
  void* context = nullptr;
  if (initQelCrypto(&context) != LDAPPW_SUCCESS || context == nullptr) {
    throw Failure(kInternal, "the crypto provider cannot be loaded; LDAP_DEBUG=1 shows why");
  }
}

}  // namespace tool
