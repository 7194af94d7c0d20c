// SPDX-License-Identifier: Apache-2.0
// Opens a library, makes its first {SSHA} value or salted digest, and prints the processor seconds that this
// took.
//
//   load_probe ours|openssl
#include <dlfcn.h>
#include <openssl/evp.h>
#include <openssl/rand.h>

#include <cstdio>
#include <cstring>
#include <ctime>

#include "password_schemes.h"

namespace {

constexpr char kPassword[] = "correct horse 42";
constexpr size_t kPasswordBytes = sizeof kPassword - 1;

template <typename Function>
Function* found(void* library, const char* name, Function*) {
  return reinterpret_cast<Function*>(dlsym(library, name));
}
#define FOUND(name) found(library, #name, static_cast<decltype(&(name))>(nullptr))

bool makeOurs() {
  void* library = dlopen(LDAPPW_LIBRARY, RTLD_NOW);
  char value[1024];
  return library != nullptr &&
         FOUND(format_password)(FORMAT_SSHA, nullptr, nullptr, kPassword, kPasswordBytes, value, sizeof value) == 62;
}

bool makeOpenssl() {
  void* library = dlopen("libcrypto.so.3", RTLD_NOW);
  if (library == nullptr) return false;
  const auto update = FOUND(EVP_DigestUpdate);
  unsigned char raw[40];
  EVP_MD* digest = FOUND(EVP_MD_fetch)(nullptr, "SHA1", nullptr);
  EVP_MD_CTX* context = FOUND(EVP_MD_CTX_new)();
  return FOUND(RAND_bytes)(raw + 20, 20) == 1 && FOUND(EVP_DigestInit_ex2)(context, digest, nullptr) == 1 &&
         update(context, kPassword, kPasswordBytes) == 1 && update(context, raw + 20, 20) == 1 &&
         FOUND(EVP_DigestFinal_ex)(context, raw, nullptr) == 1;
}

}  // namespace

int main(int argc, char** argv) {
  const bool isOurs = argc == 2 && std::strcmp(argv[1], "ours") == 0;
  const std::clock_t start = std::clock();
  if (!(isOurs ? makeOurs() : makeOpenssl())) return 1;
  std::printf("%.6f\n", static_cast<double>(std::clock() - start) / CLOCKS_PER_SEC);
  return 0;
}
