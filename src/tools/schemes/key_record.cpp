// SPDX-License-Identifier: Apache-2.0
// Loading stash files and the provider.
#include "schemes/key_record.h"

#include <grp.h>
#include <pwd.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <iterator>
#include <new>
#include <optional>
#include <utility>

#include "base/failure.h"
#include "base/input.h"
#include "base/messages.h"
#include "base/secret.h"
#include "base/text.h"
#include "crypto_provider.h"

namespace tool {
namespace {

constexpr size_t kReadBytes = size_t{1} << 16;  // far more than a stash file has
constexpr size_t kLengthBytes = sizeof(std::uint32_t);

std::optional<gid_t> allowedGroup;

bool mayRead(const struct stat& file) {
  if (allowedGroup == file.st_gid) return true;
  const passwd* owner = getpwuid(file.st_uid);
  return owner != nullptr && owner->pw_gid == file.st_gid;
}

void warnOfReaders(const std::string& path, const struct stat& file) {
  if (!S_ISREG(file.st_mode)) return;
  if ((file.st_mode & S_IRWXO) != 0) {
    warning(path + " is open to other users of the system; its mode should be 0600");
  } else if ((file.st_mode & S_IRWXG) != 0 && !mayRead(file)) {
    warning(path + " is open to its group; its mode should be 0600, or --keys-group names the right group");
  }
}

// A file of other content can be long enough, but it has other texts in these places.
bool looksLikeStash(const KeyRecord& record) {
  return base64Bytes(record.sync()) > 0 &&
         validateCryptoString(std::string(record.salt()).c_str(), 1) == LDAPPW_SUCCESS;
}

void fill(SecBuffer& buffer, std::string_view& from) {
  memcpy(buffer.data, from.data(), buffer.length);
  from.remove_prefix(buffer.length);
}

}  // namespace

void allowKeysGroup(const std::string& name) {
  const bool number = !name.empty() && name.size() < 10 && name.find_first_not_of("0123456789") == std::string::npos;
  const group* found = number ? nullptr : getgrnam(name.c_str());
  if (!number && found == nullptr) throw Failure(kUsage, "there is no group " + name);
  allowedGroup = number ? static_cast<gid_t>(std::stoul(name)) : found->gr_gid;
}

bool sameRecord(const KeyRecord& a, const KeyRecord& b) {
  const auto same = [](const SecBuffer& x, const SecBuffer& y) { return equalBytes(viewOf(x), viewOf(y)); };
  return a.sync() == b.sync() && a.salt() == b.salt() &&
         std::equal(std::begin(a.get()->aesKeys), std::end(a.get()->aesKeys), b.get()->aesKeys, same);
}

std::string_view viewOf(const SecBuffer& buffer) noexcept {
  if (buffer.data == nullptr) return {};
  return {reinterpret_cast<const char*>(buffer.data), buffer.length};
}

KeyRecord KeyRecord::load(const std::string& path) {
  if (path.empty()) return KeyRecord();
  Input file(path);
  struct stat found {};
  if (fstat(file.fd(), &found) != 0) throw ioFailure(path);
  if (S_ISDIR(found.st_mode)) throw ioFailure(path, EISDIR);
  warnOfReaders(path, found);
  Secret bytes;
  while (bytes.size() < kReadBytes && file.more(bytes, kReadBytes)) {
  }
  KeyRecord record = parse(bytes);
  if (!record) throw Failure(kBadKey, file.name() + " is not a whole key stash file");
  setCipherNameGlobal();
  return record;
}

// The library's own reader and writer take paths: a pipe would be opened a second time, and what is behind a path may
// change between two looks at it.
KeyRecord KeyRecord::parse(const Secret& content) {
  AesKeyData* made = nullptr;
  if (initAesKeyData(&made) != LDAPPW_SUCCESS) throw std::bad_alloc();
  KeyRecord record(made);
  std::string_view rest = content.view();
  std::uint64_t syncBytes = 0;
  for (size_t i = 0; i < kLengthBytes && i < rest.size(); ++i) {
    syncBytes |= std::uint64_t{static_cast<unsigned char>(rest[i])} << (8 * i);
  }
  std::uint64_t needed = kLengthBytes + syncBytes + made->cryptoSalt.length;
  for (const SecBuffer& key : made->aesKeys) needed += key.length;
  if (rest.size() < needed) return KeyRecord();
  rest.remove_prefix(kLengthBytes);
  made->cryptoSync.data = static_cast<unsigned char*>(calloc(static_cast<size_t>(syncBytes) + 1, 1));
  if (made->cryptoSync.data == nullptr) throw std::bad_alloc();
  made->cryptoSync.length = static_cast<std::uint32_t>(syncBytes);
  fill(made->cryptoSync, rest);
  fill(made->cryptoSalt, rest);
  for (SecBuffer& key : made->aesKeys) fill(key, rest);
  return looksLikeStash(record) ? std::move(record) : KeyRecord();
}

Secret KeyRecord::content() const {
  Secret content;
  const auto bytes = static_cast<std::uint32_t>(sync().size());
  for (size_t i = 0; i < kLengthBytes; ++i) content.append(static_cast<char>(bytes >> (8 * i) & 0xFFU));
  content.append(sync());
  content.append(salt());
  for (const SecBuffer& key : record_->aesKeys) content.append(viewOf(key));
  return content;
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
