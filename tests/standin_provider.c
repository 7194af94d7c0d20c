/* SPDX-License-Identifier: Apache-2.0 */
/*
 * A provider for the tests of loading, which computes nothing. In the file STANDIN_LOG it reports every call and its
 * arguments while it is loaded; its directory is STANDIN_PATH, and it gives no context while STANDIN_FAILS is set, nor
 * before there is the file that STANDIN_WAITS may name. STANDIN_NO_PATH and STANDIN_NO_SEED leave an entry out.
 */
#include <stdatomic.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <time.h>
#include <unistd.h>

#include "crypto_provider.h"

#define ENTRY __attribute__((visibility("default")))

static const QelStatus zero;

static void note(const QelStatus* status, const char* call, const char* value) {
  const char* path = getenv("STANDIN_LOG");
  FILE* file = path == NULL ? NULL : fopen(path, "a");
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

enum { kContexts = 64 };
static char isCleaned[kContexts];
static atomic_int made;

static int isContext(const void* ctx) {
  return (const char*)ctx >= isCleaned && (const char*)ctx < isCleaned + kContexts;
}

ENTRY void* QEL_Init(QelStatus* status, const char* path) {
  const struct timespec while_others_come = {0, 2000000};
  note(status, "Init ", path);
  const char* until = getenv("STANDIN_WAITS");
  while (until != NULL && access(until, F_OK) != 0) nanosleep(&while_others_come, NULL);
  nanosleep(&while_others_come, NULL);
  return getenv("STANDIN_FAILS") != NULL ? NULL : (void*)&isCleaned[atomic_fetch_add(&made, 1) % kContexts];
}

ENTRY int QEL_SetValue(void* ctx, QelStatus* status, int id, const char* value) {
  note(status, id == 1 ? "SetValue 1 " : id == 0 ? "SetValue 0 " : "SetValue of another ", value);
  return !isContext(ctx); /* nobody looks */
}

ENTRY int QEL_Attach(void* ctx, QelStatus* status) {
  note(status, "Attach", "");
  return !isContext(ctx);
}

ENTRY int QEL_Cleanup(void* ctx, QelStatus* status) {
  note(status, "Cleanup", !isContext(ctx) ? " of something else" : *(char*)ctx ? " again" : "");
  if (isContext(ctx)) *(char*)ctx = 1;
  return 0;
}

// clang-format off
#define GIVES(name, value) ENTRY int QEL_##name(void) { return value; }
#define CONTEXT(kind) GIVES(EVP_##kind##_CTX_new, 0) GIVES(EVP_##kind##_CTX_free, 1) \
  GIVES(EVP_##kind##_CTX_init, 1) GIVES(EVP_##kind##_CTX_cleanup, 1)
#define STEPS(work) GIVES(EVP_##work##Init, 1) GIVES(EVP_##work##Update, 1) GIVES(EVP_##work##Final, 1)
CONTEXT(MD) CONTEXT(CIPHER) STEPS(Digest) STEPS(Encrypt) STEPS(Decrypt)
GIVES(EVP_get_digestbyname, 0) GIVES(EVP_get_cipherbyname, 0) GIVES(EVP_MD_size, 20)
GIVES(GetStatus, 0) GIVES(GetValue, 0) GIVES(EVP_MD_block_size, 64) GIVES(EVP_CIPHER_CTX_set_key_length, 1)
GIVES(EVP_CIPHER_CTX_set_padding, 1) GIVES(EVP_CIPHER_block_size, 16) GIVES(EVP_CIPHER_key_length, 0)
GIVES(EVP_CIPHER_iv_length, 0) GIVES(EVP_CIPHER_CTX_cipher, 0) GIVES(RAND_bytes, 1) GIVES(RAND_seed, 1)
#ifndef STANDIN_NO_SEED
GIVES(GenerateRandomSeed, 1)
#endif
    // clang-format on
