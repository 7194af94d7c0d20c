// SPDX-License-Identifier: Apache-2.0
#include "schemes/hash_libraries.h"

#include "base/loaded_library.h"

namespace tool {
namespace {

constexpr char kProblem[] = "the scheme cannot be computed";

DigestLibrary openDigests() {
  const LoadedLibrary library(LDAPPW_CRYPTO_SONAME, kProblem);
  DigestLibrary functions{};
  library.resolve("EVP_get_digestbyname", functions.byName);
  library.resolve("EVP_Digest", functions.digest);
  library.resolve("HMAC", functions.hmac);
  library.resolve("PKCS5_PBKDF2_HMAC", functions.pbkdf2);
  return functions;
}

CryptLibrary openCrypt() {
  const LoadedLibrary library(LDAPPW_CRYPT_SONAME, kProblem);
  CryptLibrary functions{};
  library.resolve("crypt_rn", functions.hash);
  library.resolve("crypt_gensalt_rn", functions.makeSetting);
  return functions;
}

Argon2Library openArgon2() {
  const LoadedLibrary library(LDAPPW_ARGON2_SONAME, kProblem);
  Argon2Library functions{};
  library.resolve("argon2_hash", functions.hash);
  library.resolve("argon2_verify", functions.verify);
  return functions;
}

}  // namespace

const DigestLibrary& digestLibrary() {
  static const DigestLibrary library = openDigests();
  return library;
}

const CryptLibrary& cryptLibrary() {
  static const CryptLibrary library = openCrypt();
  return library;
}

const Argon2Library& argon2Library() {
  static const Argon2Library library = openArgon2();
  return library;
}

}  // namespace tool
