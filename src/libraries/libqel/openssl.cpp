// SPDX-License-Identifier: Apache-2.0
// Starting OpenSSL, and reading what its default provider has.
#include "objects.h"

#include <openssl/core_names.h>
#include <openssl/evp.h>
#include <openssl/params.h>
#include <openssl/provider.h>

#include <algorithm>
#include <cstring>
#include <iterator>

namespace qel {
namespace {

struct Usual {
  Type type;
  const char* spelling;
  const Algorithm* algorithm = nullptr;
} usual[] = {{kDigest, "SHA1"},        {kDigest, "md5"},         {kDigest, "SHA256"},
             {kCipher, "AES-256-ECB"}, {kCipher, "AES-192-ECB"}, {kCipher, "AES-128-ECB"}};

// As OpenSSL compares names, whose function for it the first releases do not have, and the host's language changes
// nothing.
bool isSame(char a, char b) noexcept {
  const auto lower = [](char c) { return c >= 'A' && c <= 'Z' ? c - 'A' + 'a' : c; };
  return lower(a) == lower(b);
}

bool isAmong(const char* names, const char* name) noexcept {
  const char* const nameEnd = name + std::strlen(name);
  for (const char* end;; names = end + 1) {
    end = strchrnul(names, ':');
    if (std::equal(names, end, name, nameEnd, isSame)) return true;
    if (*end == '\0') return false;
  }
}

// False for one that is not served. A digest is when it has one size. A cipher is when it gives back what it took,
// through a start, updates of any size and an end: authenticated ones do not, nor those that wrap keys or take their
// data at once.
bool read(const OSSL_ALGORITHM& source, Type type, Algorithm& algorithm) noexcept {
  algorithm = {};
  algorithm.type = type;
  algorithm.names = source.algorithm_names;
  for (const OSSL_DISPATCH* each = source.implementation; each->function_id != 0; ++each) {
    if (each->function_id < kFunctions) algorithm.functions[each->function_id] = each->function;
  }
  unsigned mode = EVP_CIPH_STREAM_CIPHER;
  int hasAnySize = 0, isAuthenticated = 0, takesAllAtOnce = 0;
  OSSL_PARAM wanted[] = {OSSL_PARAM_construct_size_t(OSSL_DIGEST_PARAM_SIZE, &algorithm.size),
                         OSSL_PARAM_construct_size_t(OSSL_DIGEST_PARAM_BLOCK_SIZE, &algorithm.blockSize),
                         OSSL_PARAM_construct_int(OSSL_DIGEST_PARAM_XOF, &hasAnySize),
                         OSSL_PARAM_construct_size_t(OSSL_CIPHER_PARAM_KEYLEN, &algorithm.keyLength),
                         OSSL_PARAM_construct_size_t(OSSL_CIPHER_PARAM_IVLEN, &algorithm.ivLength),
                         OSSL_PARAM_construct_uint(OSSL_CIPHER_PARAM_MODE, &mode),
                         OSSL_PARAM_construct_int(OSSL_CIPHER_PARAM_AEAD, &isAuthenticated),
                         OSSL_PARAM_construct_int(OSSL_CIPHER_PARAM_CTS, &takesAllAtOnce),
                         OSSL_PARAM_construct_end()};
  const int id = type == kDigest ? OSSL_FUNC_DIGEST_GET_PARAMS : OSSL_FUNC_CIPHER_GET_PARAMS;
  auto* describe = reinterpret_cast<OSSL_FUNC_digest_get_params_fn*>(algorithm.functions[id]);  // alike for both types
  if (describe == nullptr || describe(wanted) != 1) return false;
  // A start of a block cipher fills all that is secret. So does one of a digest that has blocks of 64 bytes; those with
  // larger ones leave the data where it was.
  algorithm.isOverwritten = type == kCipher ? algorithm.blockSize > 1 : algorithm.blockSize == 64;
  algorithm.endSize = type == kCipher && algorithm.blockSize > 1 ? algorithm.blockSize : algorithm.size;
  if (type == kDigest) return algorithm.size != 0 && hasAnySize == 0;
  return mode <= EVP_CIPH_CTR_MODE && isAuthenticated == 0 && takesAllAtOnce == 0;
}

// The list is not given back: names and functions are used as long as the process lives.
void readAll(OSSL_PROVIDER* provider, Type type, int operation) noexcept {
  int mustNotBeKept = 0;
  Algorithm* next = algorithms[type];
  const OSSL_ALGORITHM* all = OSSL_PROVIDER_query_operation(provider, operation, &mustNotBeKept);
  for (const OSSL_ALGORITHM* each = all; each != nullptr && each->algorithm_names != nullptr; ++each) {
    if (next != std::end(algorithms[type]) && read(*each, type, *next)) ++next;
  }
  algorithmCounts[type] = static_cast<size_t>(next - algorithms[type]);
}

}  // namespace

// A library context of its own keeps the host's configuration and property queries from deciding what a name means.
// Without an exit handler, which counts where nobody has started OpenSSL before, OpenSSL works until the process ends.
bool startOpenssl() noexcept {
  if (providerContext != nullptr) return true;
  if (OPENSSL_init_crypto(OPENSSL_INIT_NO_ATEXIT, nullptr) != 1) return false;
  const ErrorMark mark;
  OSSL_LIB_CTX* library = OSSL_LIB_CTX_new();
  OSSL_PROVIDER* provider = library == nullptr ? nullptr : OSSL_PROVIDER_load(library, "default");
  if (provider == nullptr) return OSSL_LIB_CTX_free(library), false;
  readAll(provider, kDigest, OSSL_OP_DIGEST);
  readAll(provider, kCipher, OSSL_OP_CIPHER);
  for (Usual& each : usual) each.algorithm = findAlgorithm(each.type, each.spelling);
  providerContext = OSSL_PROVIDER_get0_provider_ctx(provider);
  return true;
}

const Algorithm* findAlgorithm(Type type, const char* name) noexcept {
  for (const Usual& each : usual) {
    if (each.type == type && each.algorithm != nullptr && std::strcmp(each.spelling, name) == 0) return each.algorithm;
  }
  for (size_t i = 0; i < algorithmCounts[type]; ++i) {
    if (isAmong(algorithms[type][i].names, name)) return &algorithms[type][i];
  }
  return nullptr;
}

}  // namespace qel
