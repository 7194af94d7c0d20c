// SPDX-License-Identifier: Apache-2.0
// The process-wide state of the provider: the open library, the context and the entry table.
#include "provider/qel_utils_table.h"

extern "C" {

// Documented in crypto_provider.h.

const char* qelLibraryName = "libtresk7qels.so";
void** qelLoadGlobal = nullptr;
void* qelCtxGlobal = nullptr;

#define LDAPPW_ENTRIES(X)          \
  X(GetStatus)                     \
  X(SetValue)                      \
  X(GetValue)                      \
  X(Init)                          \
  X(Attach)                        \
  X(Cleanup)                       \
  X(EVP_get_cipherbyname)          \
  X(EVP_get_digestbyname)          \
  X(EVP_MD_CTX_new)                \
  X(EVP_MD_CTX_free)               \
  X(EVP_MD_CTX_init)               \
  X(EVP_MD_CTX_cleanup)            \
  X(EVP_MD_block_size)             \
  X(EVP_MD_size)                   \
  X(EVP_DigestInit)                \
  X(EVP_DigestUpdate)              \
  X(EVP_DigestFinal)               \
  X(EVP_CIPHER_CTX_new)            \
  X(EVP_CIPHER_CTX_free)           \
  X(EVP_CIPHER_CTX_init)           \
  X(EVP_CIPHER_CTX_cleanup)        \
  X(EVP_CIPHER_CTX_set_key_length) \
  X(EVP_CIPHER_CTX_set_padding)    \
  X(EVP_CIPHER_block_size)         \
  X(EVP_CIPHER_key_length)         \
  X(EVP_CIPHER_iv_length)          \
  X(EVP_EncryptInit)               \
  X(EVP_EncryptUpdate)             \
  X(EVP_EncryptFinal)              \
  X(EVP_DecryptInit)               \
  X(EVP_DecryptUpdate)             \
  X(EVP_DecryptFinal)              \
  X(EVP_CIPHER_CTX_cipher)         \
  X(RAND_bytes)                    \
  X(RAND_seed)                     \
  X(GenerateRandomSeed)

#define LDAPPW_DEFINE(operation) decltype(pQEL_##operation) pQEL_##operation = nullptr;
LDAPPW_ENTRIES(LDAPPW_DEFINE)
#undef LDAPPW_DEFINE

}  // extern "C"

namespace ldappw {

#define LDAPPW_ROW(operation) {"QEL_" #operation, &pQEL_##operation},
constexpr Entry kEntries[] = {LDAPPW_ENTRIES(LDAPPW_ROW)};
#undef LDAPPW_ROW
#undef LDAPPW_ENTRIES
static_assert(sizeof kEntries / sizeof kEntries[0] == kEntryCount);

}  // namespace ldappw
