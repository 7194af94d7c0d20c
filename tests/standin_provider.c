/* SPDX-License-Identifier: Apache-2.0 */
/*
 * A small provider for tests, without OpenSSL. In the file STANDIN_LOG it reports every call and its arguments while it is
 * loaded; its directory is STANDIN_PATH, and it gives no context while STANDIN_FAILS is set. STANDIN_NO_PATH and
 * STANDIN_NO_SEED leave an entry out. Its digests and ciphers are toys of the right sizes that protect nothing.
 */
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <time.h>

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
#ifdef STANDIN_DEFAULT_PATH
  if (path == NULL) path = STANDIN_DEFAULT_PATH;
#endif
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

struct context {
  unsigned char bytes[20]; /* the digest so far, or a key of one byte */
  size_t count;
  int size;
};

/* An algorithm is the number of bytes of its digest, 1 for a cipher. */
ENTRY const int* QEL_EVP_get_digestbyname(void* ctx, const char* name) {
  static const int sizes[] = {20, 16};
  return ctx == NULL ? NULL : strcmp(name, "SHA1") == 0 ? &sizes[0] : strcmp(name, "md5") == 0 ? &sizes[1] : NULL;
}

ENTRY const int* QEL_EVP_get_cipherbyname(void* ctx, const char* name) {
  static const int size = 1;
  return ctx != NULL && strncmp(name, "AES-", 4) == 0 ? &size : NULL;
}

ENTRY int QEL_EVP_MD_size(void* ctx, const int* digest) {
  return ctx == NULL ? 0 : *digest;
}

ENTRY int QEL_EVP_DigestInit(void* ctx, struct context* c, const int* digest) {
  *c = (struct context){.size = QEL_EVP_MD_size(ctx, digest)};
  return 1;
}

ENTRY int QEL_EVP_DigestUpdate(void* ctx, struct context* c, const unsigned char* data, unsigned length) {
  for (; length != 0; --length, ++c->count) c->bytes[c->count % (size_t)c->size] ^= (unsigned char)(*data++ + c->count);
  return ctx != NULL;
}

ENTRY int QEL_EVP_DigestFinal(void* ctx, struct context* c, unsigned char* out, unsigned* outLength) {
  memcpy(out, c->bytes, (size_t)c->size);
  if (outLength != NULL) *outLength = (unsigned)c->size;
  return ctx != NULL;
}

ENTRY int QEL_EVP_EncryptInit(void* ctx, struct context* c, const int* cipher, const unsigned char* key) {
  QEL_EVP_DigestInit(ctx, c, cipher);
  c->bytes[0] = key[0];
  return 1;
}

ENTRY int QEL_EVP_EncryptUpdate(void* ctx, struct context* c, unsigned char* out, int* outLength,
                                const unsigned char* in, int inLength) {
  for (int i = 0; i < inLength; ++i, ++c->count) out[i] = in[i] ^ c->bytes[0];
  *outLength = inLength;
  return ctx != NULL;
}

ENTRY int QEL_EVP_EncryptFinal(void* ctx, struct context* c, unsigned char* out, int* outLength) {
  unsigned char padding[16];
  const int count = 16 - (int)(c->count % 16);
  memset(padding, count, sizeof padding);
  return QEL_EVP_EncryptUpdate(ctx, c, out, outLength, padding, count);
}

ENTRY int QEL_EVP_DecryptInit(void* ctx, struct context* c, const int* cipher, const unsigned char* key) {
  return QEL_EVP_EncryptInit(ctx, c, cipher, key);
}

/* Takes the whole text at once, and its padding off. */
ENTRY int QEL_EVP_DecryptUpdate(void* ctx, struct context* c, unsigned char* out, int* outLength,
                                const unsigned char* in, int inLength) {
  QEL_EVP_EncryptUpdate(ctx, c, out, outLength, in, inLength);
  if (inLength == 0 || out[inLength - 1] > inLength) return 0;
  *outLength -= out[inLength - 1];
  return 1;
}

ENTRY int QEL_EVP_DecryptFinal(void* ctx, struct context* c, unsigned char* out, int* outLength) {
  *outLength = 0;
  return ctx != NULL && c != NULL && out != NULL;
}

ENTRY int QEL_RAND_bytes(void* ctx, unsigned char* buffer, int count) {
  for (int i = 0; i < count; ++i) buffer[i] = (unsigned char)rand();
  return ctx != NULL;
}

static int release(void* ctx, void* context) {
  free(context);
  return ctx != NULL;
}

// clang-format off
#define GIVES(name, value) ENTRY int QEL_##name(void) { return value; }
#define CONTEXT(kind) \
  ENTRY void* QEL_EVP_##kind##_CTX_new(void* ctx) { (void)ctx; return calloc(1, sizeof(struct context)); } \
  ENTRY int QEL_EVP_##kind##_CTX_free(void* ctx, void* context) { return release(ctx, context); } \
  GIVES(EVP_##kind##_CTX_init, 1) GIVES(EVP_##kind##_CTX_cleanup, 1)
CONTEXT(MD) CONTEXT(CIPHER)
GIVES(GetStatus, 0) GIVES(GetValue, 0) GIVES(EVP_MD_block_size, 64) GIVES(EVP_CIPHER_CTX_set_key_length, 1)
GIVES(EVP_CIPHER_CTX_set_padding, 1) GIVES(EVP_CIPHER_block_size, 16) GIVES(EVP_CIPHER_key_length, 0)
GIVES(EVP_CIPHER_iv_length, 0) GIVES(EVP_CIPHER_CTX_cipher, 0) GIVES(RAND_seed, 1)
#ifndef STANDIN_NO_SEED
GIVES(GenerateRandomSeed, 1)
#endif
    // clang-format on
