// SPDX-License-Identifier: Apache-2.0
// Key records, and making, checking and opening stored values with the library.
#include "common.h"

#include <errno.h>
#include <fcntl.h>
#include <sys/random.h>
#include <sys/stat.h>

#include <algorithm>
#include <cstring>
#include <utility>

#include "crypto_provider.h"

namespace tool {
namespace {

// Beyond this a password is a mistake, and stored values stay within the library's int lengths.
constexpr std::size_t kMaxPasswordBytes = std::size_t{1} << 28;
constexpr std::size_t kMaxValueBytes = kMaxPasswordBytes * 2;
constexpr std::size_t kLeastOutBytes = 1024;

constexpr Status kNoKey{kBadKey, "an AES value needs the key stash (--keys)"};
constexpr Status kNoMemoryStatus{kInternal, "out of memory"};

bool drawCryptSalt(char (&salt)[3]) noexcept {
  static constexpr char kSaltCharacters[] = "./0123456789ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz";
  unsigned char random[2];
  ssize_t count = 0;
  do {
    count = getrandom(random, sizeof random, 0);
  } while (count < 0 && errno == EINTR);
  if (count != static_cast<ssize_t>(sizeof random)) return false;
  salt[0] = kSaltCharacters[random[0] & 63U];
  salt[1] = kSaltCharacters[random[1] & 63U];
  salt[2] = '\0';
  return true;
}

std::string_view textOf(const SecBuffer& buffer) noexcept {
  if (buffer.data == nullptr) return {};
  return {reinterpret_cast<const char*>(buffer.data), buffer.length};
}

// A file of other content can be long enough: its texts tell.
bool looksLikeStash(const KeyRecord& record) {
  return !record.sync().empty() && base64Bytes(record.sync()) > 0 &&
         validateCryptoString(std::string(record.salt()).c_str(), 1) == LDAPPW_SUCCESS;
}

Status formatWithLibrary(const Scheme& scheme, const KeyRecord& key, std::string_view password, Secret& out) {
  char salt[3] = "";
  if (scheme.code == FORMAT_CRYPT && !drawCryptSalt(salt)) return {kInternal, "no random bytes for a salt"};
  const int clearBytes = static_cast<int>(password.size());
  const int needed = formatted_password_length(scheme.code, clearBytes);
  if (needed < 0) return {kInternal, "the length of the value is not known"};
  const Secret clear(password);  // an empty view may point nowhere
  out.clear();
  out.resize(std::max(kLeastOutBytes, static_cast<std::size_t>(needed) + 64));
  const int written = format_password(scheme.code, salt, key.get(), clear.c_str(), clearBytes, out.data(),
                                      static_cast<int>(out.size()));
  if (written <= 0) {
    out.clear();
    return {kInternal, "the value could not be made"};
  }
  out.resize(static_cast<std::size_t>(written));
  return {};
}

Status reversibleProblem(const Scheme& scheme, std::string_view value, const KeyRecord& key) {
  if (value.size() > kMaxValueBytes) return {kBadValue, "the value is too long"};
  if (const char* problem = payloadProblem(value)) return {kBadValue, problem};
  if (scheme.code == FORMAT_VLDL) return {kBadValue, "a {VLDL} value can only be recognised"};
  if (scheme.needsKey() && !key) return kNoKey;
  return {};
}

}  // namespace

KeyRecord& KeyRecord::operator=(KeyRecord&& other) noexcept {
  std::swap(record_, other.record_);
  return *this;
}

KeyRecord KeyRecord::load(const std::string& path) {
  if (path.empty()) return {};
  const Descriptor file = openInput(path);
  struct stat found {};
  if (fstat(file.get(), &found) != 0) throw Failure(kIoError, systemText(path, errno));
  if (S_ISDIR(found.st_mode)) throw Failure(kIoError, systemText(path, EISDIR));
  if (S_ISREG(found.st_mode) && (found.st_mode & (S_IRWXG | S_IRWXO)) != 0) {
    warning(path + " is open to other users of the system; its mode should be 0600");
  }
  AesKeyData* loaded = nullptr;
  const int code = setAESKeyData(path.c_str(), &loaded);
  KeyRecord record(loaded);
  if (code == LDAPPW_NO_MEMORY) throw Failure(kInternal, path + ": out of memory");
  if (code != LDAPPW_SUCCESS || !looksLikeStash(record))
    throw Failure(kBadKey, path + " is not a whole key stash file");
  return record;
}

std::string_view KeyRecord::sync() const noexcept {
  return record_ != nullptr ? textOf(record_->cryptoSync) : std::string_view();
}

std::string_view KeyRecord::salt() const noexcept {
  return record_ != nullptr ? textOf(record_->cryptoSalt) : std::string_view();
}

void requireProvider() {
  void* context = nullptr;
  if (initQelCrypto(&context) != LDAPPW_SUCCESS || context == nullptr) {
    throw Failure(kInternal, "the crypto provider cannot be loaded; LDAP_DEBUG=1 shows why");
  }
}

Status passwordProblem(const Scheme& scheme, std::string_view password) noexcept {
  if (!scheme.makeable) return {kBadValue, "values of this scheme cannot be made"};
  if (password.find('\0') != std::string_view::npos) return {kBadValue, "the password holds a NUL byte"};
  if (password.size() > kMaxPasswordBytes) return {kBadValue, "the password is longer than 256 MiB"};
  if (scheme.code == FORMAT_SHA && schemeOf(password).code == FORMAT_SHA) {
    return {kBadValue, "a password that begins with {SHA} would be taken for a value by this scheme"};
  }
  if (scheme.code == FORMAT_NONE && (schemeOf(password).code != FORMAT_NONE || unknownTag(password))) {
    return {kBadValue, "as clear text the password would be taken for a value of another scheme"};
  }
  return {};
}

Status formatPassword(const Scheme& scheme, const KeyRecord& key, std::string_view password, Secret& out) {
  if (const Status problem = passwordProblem(scheme, password); !problem.ok()) return problem;
  if (scheme.needsKey() && !key) return kNoKey;
  if (scheme.code != FORMAT_NONE) return formatWithLibrary(scheme, key, password, out);
  out.clear();
  out.append(password);
  return {};
}

Status revealValue(std::string_view value, const KeyRecord& key, Secret& out) {
  const Scheme& scheme = schemeOf(value);
  if (const Status problem = reversibleProblem(scheme, value, key); !problem.ok()) return problem;
  out.clear();
  if (scheme.code == FORMAT_NONE) {
    out.append(value);
    return {};
  }
  if (!scheme.reversible) return {kBadValue, "the scheme is one-way: the password cannot be had from the value"};
  char* clear = nullptr;
  int clearBytes = 0;
  const Secret copy(value);
  const int done = unformat_password(copy.c_str(), &clear, key.get(), &clearBytes);
  const bool opened = done == 1 && clear != nullptr;
  if (opened) {
    const auto bytes = static_cast<std::size_t>(std::max(clearBytes, 0));
    out.append({clear, bytes});
    explicit_bzero(clear, bytes);  // the library's release looks no further than the first NUL
  }
  _morva_utils_decode_buffer_free(&clear);
  if (opened) return {};
  if (scheme.needsKey()) return {kBadKey, "the key does not open the value"};
  return {kBadValue, "the value does not open"};
}

Status verifyValue(std::string_view value, const KeyRecord& key, std::string_view password) {
  const Scheme& scheme = schemeOf(value);
  if (const Status problem = reversibleProblem(scheme, value, key); !problem.ok()) return problem;
  if (scheme.needsKey()) {
    // By opening: the library checks by making the value anew in 1024 bytes, which cannot tell a wrong key from a wrong
    // password and does not hold a long one.
    Secret clear;
    const Status opened = revealValue(value, key, clear);
    if (!opened.ok()) return opened;
    return equalBytes(clear.view(), password) ? Status{} : Status{kNoMatch, "the password does not match"};
  }
  const Secret presented(password);
  const Secret stored(value);
  const int code = verify_password(presented.c_str(), static_cast<int>(presented.size()), stored.c_str(),
                                   static_cast<int>(stored.size()), 1, key.get());
  if (code == LDAPPW_SUCCESS) return {};
  if (code == LDAPPW_NO_MEMORY) return kNoMemoryStatus;
  return {kNoMatch, "the password does not match"};
}

}  // namespace tool
