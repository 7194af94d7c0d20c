/* SPDX-License-Identifier: Apache-2.0 */
/*
 * A provider that only tells, in the file STANDIN_LOG, what was called with what. Its directory is STANDIN_PATH, and it
 * gives no context while STANDIN_FAILS is set. STANDIN_NO_PATH and STANDIN_NO_SEED leave an entry out.
 */
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <time.h>

#include "crypto_provider.h"

#define ENTRY __attribute__((visibility("default")))

static const QelStatus zero;

static void note(const QelStatus* status, const char* call, const char* value) {
  FILE* file = fopen(getenv("STANDIN_LOG"), "a");
  if (file == NULL) return;
  fprintf(file, "%s%s%s\n", call, value, memcmp(status, &zero, sizeof zero) != 0 ? " over a used status" : "");
  fclose(file);
}

__attribute__((destructor)) static void closed(void) {
  note(&zero, "closed", "");
}

#ifndef STANDIN_NO_PATH
ENTRY int treskqels_path(char* buffer, int size) {
  const char* path = getenv("STANDIN_PATH");
  return path != NULL && snprintf(buffer, (size_t)size, "%s", path) < 1024 && size == 1024;
}
#endif

ENTRY void* QEL_Init(QelStatus* status, const char* path) {
  const struct timespec while_others_come = {0, 2000000};
  note(status, "Init ", path);
  nanosleep(&while_others_come, NULL);
  return getenv("STANDIN_FAILS") != NULL ? NULL : (void*)&zero;
}

ENTRY int QEL_SetValue(void* ctx, QelStatus* status, int id, const char* value) {
  note(status, id == 1 ? "SetValue 1 " : id == 0 ? "SetValue 0 " : "SetValue of another ", value);
  return ctx != &zero; /* nobody looks */
}

ENTRY int QEL_Attach(void* ctx, QelStatus* status) {
  note(status, "Attach", "");
  return ctx != &zero;
}

ENTRY int QEL_Cleanup(void* ctx, QelStatus* status) {
  note(status, "Cleanup", ctx == &zero ? "" : " of something else");
  return 0;
}

// clang-format off
#define UNUSED(name) ENTRY int QEL_##name(void) { return 0; }
UNUSED(GetStatus) UNUSED(GetValue) UNUSED(EVP_get_cipherbyname) UNUSED(EVP_get_digestbyname) UNUSED(EVP_MD_CTX_new)
UNUSED(EVP_MD_CTX_free) UNUSED(EVP_MD_CTX_init) UNUSED(EVP_MD_CTX_cleanup) UNUSED(EVP_MD_block_size) UNUSED(EVP_MD_size)
UNUSED(EVP_DigestInit) UNUSED(EVP_DigestUpdate) UNUSED(EVP_DigestFinal) UNUSED(EVP_CIPHER_CTX_new)
UNUSED(EVP_CIPHER_CTX_free) UNUSED(EVP_CIPHER_CTX_init) UNUSED(EVP_CIPHER_CTX_cleanup)
UNUSED(EVP_CIPHER_CTX_set_key_length) UNUSED(EVP_CIPHER_CTX_set_padding) UNUSED(EVP_CIPHER_block_size)
UNUSED(EVP_CIPHER_key_length) UNUSED(EVP_CIPHER_iv_length) UNUSED(EVP_EncryptInit) UNUSED(EVP_EncryptUpdate)
UNUSED(EVP_EncryptFinal) UNUSED(EVP_DecryptInit) UNUSED(EVP_DecryptUpdate) UNUSED(EVP_DecryptFinal)
UNUSED(EVP_CIPHER_CTX_cipher) UNUSED(RAND_bytes) UNUSED(RAND_seed)
#ifndef STANDIN_NO_SEED
UNUSED(GenerateRandomSeed)
#endif
    // clang-format on
