// SPDX-License-Identifier: Apache-2.0
// A stored value says how much its check costs, and whoever wrote it may be hostile: each is held against a limit
// before anything is computed.
#include "schemes/foreign_values.h"

#include <algorithm>
#include <memory>
#include <string>

#include "base/base64.h"
#include "base/random.h"
#include "schemes/foreign_payloads.h"
#include "schemes/hash_libraries.h"
#include "schemes/memory_budget.h"
#include "schemes/schemes.h"

namespace tool {
namespace {

constexpr Status kMatchStatus{};
constexpr Status kNoMatchStatus{kNoMatch, "the password does not match"};
constexpr Status kTooCostly{kBadValue, "the value asks for more time or memory than a check may take"};
constexpr Status kNotComputed{kBadValue, "the value cannot be computed: its settings are not accepted"};
constexpr Status kNotMade{kInternal, "the value could not be made"};
constexpr Status kNoMemory{kInternal, "out of memory"};
constexpr Status kNoBudget{kBadValue, "a value of these costs takes more memory than all may (--memory-limit)"};

constexpr size_t kHashBytes = 32;         // of Argon2
constexpr size_t kCryptRandomBytes = 16;  // of which crypt(3) makes a salt
constexpr std::uint32_t kArgon2Version = ARGON2_VERSION_13;

const unsigned char* bytesOf(const Secret& secret) noexcept {
  return reinterpret_cast<const unsigned char*>(secret.c_str());
}
unsigned char* bytesOf(Secret& secret) noexcept {
  return reinterpret_cast<unsigned char*>(secret.data());
}

Status answer(std::string_view computed, std::string_view stored) noexcept {
  return equalBytes(computed, stored) ? kMatchStatus : kNoMatchStatus;
}

const EVP_MD* digestOf(const Scheme& scheme) {
  const EVP_MD* digest = digestLibrary().byName(scheme.algorithm);
  if (digest == nullptr) throw Failure(kInternal, std::string("there is no digest ") + scheme.algorithm);
  return digest;
}

void digestInto(const Scheme& scheme, std::string_view bytes, Secret& out) {
  out.resize(EVP_MAX_MD_SIZE);
  unsigned size = 0;
  if (digestLibrary().digest(bytes.data(), bytes.size(), bytesOf(out), &size, digestOf(scheme), nullptr) != 1) {
    throw Failure(kInternal, std::string("the digest ") + scheme.algorithm + " fails");
  }
  out.resize(size);
}

void hmacInto(const Scheme& scheme, const Secret& key, std::string_view text, Secret& out) {
  out.resize(EVP_MAX_MD_SIZE);
  unsigned size = 0;
  const auto* bytes = reinterpret_cast<const unsigned char*>(text.data());
  if (digestLibrary().hmac(digestOf(scheme), key.c_str(), static_cast<int>(key.size()), bytes, text.size(),
                           bytesOf(out), &size) == nullptr) {
    throw Failure(kInternal, std::string("HMAC with ") + scheme.algorithm + " fails");
  }
  out.resize(size);
}

void deriveInto(const Scheme& scheme, const Secret& password, const Secret& salt, std::uint32_t iterations,
                size_t bytes, Secret& out) {
  out.resize(bytes);
  if (digestLibrary().pbkdf2(password.c_str(), static_cast<int>(password.size()), bytesOf(salt),
                             static_cast<int>(salt.size()), static_cast<int>(iterations), digestOf(scheme),
                             static_cast<int>(bytes), bytesOf(out)) != 1) {
    throw Failure(kInternal, std::string("PBKDF2 with ") + scheme.algorithm + " fails");
  }
}

// The first tag of a row is the one that is written.
std::string_view writtenTag(const Scheme& scheme) noexcept {
  return scheme.tag.substr(0, scheme.tag.find('}') + 1);
}

Secret drawSalt(std::uint32_t bytes) {
  Secret salt;
  salt.resize(bytes);
  drawRandom(salt.data(), bytes);
  return salt;
}

struct CryptState {
  crypt_data data{};
  ~CryptState() { explicit_bzero(&data, sizeof data); }
};

// Null when the setting or the password is not accepted. The text lies in the state.
const char* crypt3(const Secret& password, const char* setting, CryptState& state) {
  return cryptLibrary().hash(password.c_str(), setting, &state.data, static_cast<int>(sizeof state.data));
}

Status checkAsCrypt(const Secret& stored, const Secret& password) {
  if (const char* problem = crypt3PasswordProblem(password.view())) return {kBadValue, problem};
  if (!cryptCostsAreBounded(stored.view())) return kTooCostly;
  const MemoryShare memory(cryptMemory(stored.view()));
  if (!memory.granted()) return kTooCostly;
  const auto state = std::make_unique<CryptState>();
  const char* computed = crypt3(password, stored.c_str(), *state);
  return computed != nullptr ? answer(computed, stored.view()) : kNotComputed;
}

}  // namespace

Status openPlain(const StoredValue& value, const KeyRecord&, Secret& out) {
  out.append(value.payload());
  return {};
}

Status openBase64(const StoredValue& value, const KeyRecord&, Secret& out) {
  return decodeAnyBase64(value.payload(), out) ? Status{} : kNotComputed;
}

Status checkOpened(const StoredValue& value, const KeyRecord& key, const Secret& password) {
  Secret clear;
  const Status opened = value.scheme().open(value, key, clear);
  return opened.ok() ? answer(clear.view(), password.view()) : opened;
}

Status checkDigest(const StoredValue& value, const KeyRecord&, const Secret& password) {
  Secret stored;
  if (!decodeAnyBase64(value.payload(), stored)) return kNotComputed;
  const auto digestBytes = static_cast<size_t>(value.scheme().payload.least);
  Secret salted(password.view());
  salted.append(stored.view().substr(digestBytes));
  Secret computed;
  digestInto(value.scheme(), salted.view(), computed);
  return answer(computed.view(), stored.view().substr(0, digestBytes));
}

Status checkHexDigest(const StoredValue& value, const KeyRecord&, const Secret& password) {
  Secret stored;
  Secret computed;
  if (!decodeHex(value.payload(), stored)) return kNotComputed;
  digestInto(value.scheme(), password.view(), computed);
  return answer(computed.view(), stored.view());
}

Status checkCrypt3(const StoredValue& value, const KeyRecord&, const Secret& password) {
  return checkAsCrypt(Secret(value.payload()), password);
}

// crypt(3) has the hash behind a prefix of its own.
Status checkNtHash(const StoredValue& value, const KeyRecord&, const Secret& password) {
  Secret stored("$3$$");
  for (const char c : value.payload()) stored.append(c >= 'A' && c <= 'F' ? static_cast<char>(c - 'A' + 'a') : c);
  return checkAsCrypt(stored, password);
}

Status checkPbkdf2(const StoredValue& value, const KeyRecord&, const Secret& password) {
  Pbkdf2Parts parts;
  if (!parsePbkdf2(value.payload(), parts)) return kNotComputed;
  if (!pbkdf2CostsAreBounded(parts.iterations, parts.hash.size())) return kTooCostly;
  Secret computed;
  deriveInto(value.scheme(), password, parts.salt, parts.iterations, parts.hash.size(), computed);
  return answer(computed.view(), parts.hash.view());
}

// RFC 5802: what is stored is the digest of a key that is made of the derived one.
Status checkScram(const StoredValue& value, const KeyRecord&, const Secret& password) {
  Pbkdf2Parts parts;
  if (!parseScram(value.payload(), parts)) return kNotComputed;
  if (!pbkdf2CostsAreBounded(parts.iterations, parts.hash.size())) return kTooCostly;
  Secret derived;
  Secret clientKey;
  Secret computed;
  deriveInto(value.scheme(), password, parts.salt, parts.iterations, parts.hash.size(), derived);
  hmacInto(value.scheme(), derived, "Client Key", clientKey);
  digestInto(value.scheme(), clientKey.view(), computed);
  return answer(computed.view(), parts.hash.view());
}

Status checkArgon2(const StoredValue& value, const KeyRecord&, const Secret& password) {
  Argon2Parts parts;
  if (!parseArgon2(value.payload(), parts)) return kNotComputed;
  if (!argon2CostsAreBounded(parts)) return kTooCostly;
  const MemoryShare memory(std::uint64_t{parts.memoryKib} << 10);
  if (!memory.granted()) return kTooCostly;
  const Secret stored(value.payload());
  const auto type = static_cast<argon2_type>(*value.scheme().algorithm - '0');
  const int code = argon2Library().verify(stored.c_str(), password.c_str(), password.size(), type);
  if (code == ARGON2_MEMORY_ALLOCATION_ERROR) return kNoMemory;
  if (code == ARGON2_VERIFY_MISMATCH) return kNoMatchStatus;
  return code == ARGON2_OK ? kMatchStatus : kNotComputed;
}

Status makeSalted(const Scheme& scheme, const KeyRecord&, const Costs& costs, const Secret& password, Secret& out) {
  const Secret salt = drawSalt(costs.saltBytes);
  Secret salted(password.view());
  salted.append(salt.view());
  Secret digest;
  digestInto(scheme, salted.view(), digest);
  digest.append(salt.view());
  out.clear();
  out.append(writtenTag(scheme));
  appendBase64(digest.view(), out);
  return {};
}

// In the spelling of slapd's module, which 389 Directory Server reads too, while slapd does not read the other's.
Status makePbkdf2(const Scheme& scheme, const KeyRecord&, const Costs& costs, const Secret& password, Secret& out) {
  const Secret salt = drawSalt(costs.saltBytes);
  Secret derived;
  deriveInto(scheme, password, salt, costs.rounds, static_cast<size_t>(scheme.payload.least), derived);
  out.clear();
  out.append(writtenTag(scheme));
  out.append(std::to_string(costs.rounds) + '$');
  appendAdaptedBase64(salt, out);
  out.append('$');
  appendAdaptedBase64(derived, out);
  return {};
}

Status makeCrypt3(const Scheme& scheme, const KeyRecord&, const Costs& costs, const Secret& password, Secret& out) {
  const Secret random = drawSalt(kCryptRandomBytes);
  char setting[CRYPT_GENSALT_OUTPUT_SIZE];
  const Secret prefix(scheme.prefix);
  if (cryptLibrary().makeSetting(prefix.c_str(), costs.rounds, random.c_str(), static_cast<int>(random.size()), setting,
                                 static_cast<int>(sizeof setting)) == nullptr) {
    return kNotMade;
  }
  const MemoryShare memory(cryptMemory(setting));
  if (!memory.granted()) return kNoBudget;
  const auto state = std::make_unique<CryptState>();
  const char* computed = crypt3(password, setting, *state);
  if (computed == nullptr) return kNotMade;
  out.clear();
  out.append(writtenTag(scheme));
  out.append(computed);
  return {};
}

Status makeArgon2(const Scheme& scheme, const KeyRecord&, const Costs& costs, const Secret& password, Secret& out) {
  constexpr size_t kLongestText = 512;
  constexpr std::uint32_t kLeastKibOfLane = 8;
  if (costs.memoryKib / kLeastKibOfLane < costs.parallelism) return {kBadValue, "Argon2 needs 8 KiB of memory a lane"};
  const MemoryShare memory(std::uint64_t{costs.memoryKib} << 10);
  if (!memory.granted()) return kNoBudget;
  const Secret salt = drawSalt(costs.saltBytes);
  Secret hash;
  Secret text;
  hash.resize(kHashBytes);
  text.resize(kLongestText);
  const int code =
      argon2Library().hash(costs.rounds, costs.memoryKib, costs.parallelism, password.c_str(), password.size(),
                           salt.c_str(), salt.size(), hash.data(), hash.size(), text.data(), text.size(),
                           static_cast<argon2_type>(*scheme.algorithm - '0'), kArgon2Version);
  if (code == ARGON2_MEMORY_ALLOCATION_ERROR) return kNoMemory;
  if (code != ARGON2_OK) return kNotMade;
  out.clear();
  out.append(writtenTag(scheme));
  out.append(text.c_str());
  return {};
}

const char* crypt3PasswordProblem(std::string_view password) {
  return password.size() < CRYPT_MAX_PASSPHRASE_SIZE ? nullptr
                                                     : "the password is longer than the 511 bytes of crypt(3)";
}

}  // namespace tool
