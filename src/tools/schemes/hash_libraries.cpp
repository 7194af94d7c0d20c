// SPDX-License-Identifier: Apache-2.0
#include "schemes/hash_libraries.h"

#include <dlfcn.h>

#include <cstring>
#include <string>

#include "base/failure.h"

namespace tool {
namespace {

class Library {
 public:
  explicit Library(const char* name) : handle_(dlopen(name, RTLD_NOW | RTLD_LOCAL)) {}  // stays open

  template <typename Function>
  void resolve(const char* name, Function& function) const {
    void* address = handle_ != nullptr ? dlsym(handle_, name) : nullptr;
    if (address == nullptr) throw Failure(kInternal, std::string("the scheme cannot be computed: ") + dlerror());
    memcpy(&function, &address, sizeof function);
  }

 private:
  void* handle_;
};

DigestLibrary openDigests() {
  const Library library(LDAPPW_CRYPTO_SONAME);
  DigestLibrary functions{};
  library.resolve("EVP_get_digestbyname", functions.byName);
  library.resolve("EVP_Digest", functions.digest);
  library.resolve("HMAC", functions.hmac);
  library.resolve("PKCS5_PBKDF2_HMAC", functions.pbkdf2);
  return functions;
}

CryptLibrary openCrypt() {
  const Library library(LDAPPW_CRYPT_SONAME);
  CryptLibrary functions{};
  library.resolve("crypt_rn", functions.hash);
  library.resolve("crypt_gensalt_rn", functions.makeSetting);
  return functions;
}

Argon2Library openArgon2() {
  const Library library(LDAPPW_ARGON2_SONAME);
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
