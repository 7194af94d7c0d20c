/* SPDX-License-Identifier: Apache-2.0 */
/* The same inputs give the same bytes on every target: results of fixed inputs, and of random bytes that are fixed too,
 * against those on record. With a file it compares, without one it prints. Every round is called with the stack at
 * another distance from a multiple of 16, as hosts of the older 32-bit convention do. */
#include <alloca.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>

#include "aes_keys.h"
#include "crypto_provider.h"
#include "password_schemes.h"

/* Offsets and sizes of the public records, with pointers of 4 and of 8 bytes. */
#define LAYOUT(what, with4, with8) _Static_assert((what) == (sizeof(void*) == 8 ? (with8) : (with4)), #what)
LAYOUT(sizeof(SecBuffer), 8, 16);
LAYOUT(offsetof(SecBuffer, data), 0, 0);
LAYOUT(offsetof(SecBuffer, length), 4, 8);
LAYOUT(sizeof(AesKeyData), 40, 80);
LAYOUT(offsetof(AesKeyData, cryptoSync), 0, 0);
LAYOUT(offsetof(AesKeyData, cryptoSalt), 8, 16);
LAYOUT(offsetof(AesKeyData, aesKeys), 16, 32);
LAYOUT(sizeof(QelStatus), 268, 268);
LAYOUT(offsetof(QelStatus, minRC), 4, 4);
LAYOUT(offsetof(QelStatus, desc), 8, 8);
LAYOUT(sizeof(sha_digest), 20, 20);
LAYOUT(sizeof(ldappw_crypt_data), 898, 898);
LAYOUT(_Alignof(ldappw_crypt_data), 1, 1);
LAYOUT(offsetof(ldappw_crypt_data, KS), 48, 48);
LAYOUT(offsetof(ldappw_crypt_data, block), 816, 816);
LAYOUT(offsetof(ldappw_crypt_data, iobuf), 882, 882);

static uint32_t state;

static int fixedRandomBytes(void* ctx, unsigned char* buffer, int count) {
  (void)ctx;
  for (int i = 0; i < count; ++i) {
    state = state * 1664525U + 1013904223U;
    buffer[i] = (unsigned char)(state >> 24U);
  }
  return 1;
}

static void bytes(FILE* out, const char* name, const unsigned char* data, size_t count) {
  fprintf(out, "%s ", name);
  for (size_t i = 0; i < count; ++i) fprintf(out, "%02x", data[i]);
  fputc('\n', out);
}

static void values(FILE* out, AesKeyData* keys) {
  static const int schemes[] = {FORMAT_SHA,    FORMAT_MD5,    FORMAT_CRYPT, FORMAT_SSHA,
                                FORMAT_AES128, FORMAT_AES192, FORMAT_AES256};
  static const int lengths[] = {0, 1, 8, 15, 16, 63, 200};
  char password[200];
  char value[512];
  char salt[] = "aZ";
  for (size_t i = 0; i < sizeof password; ++i) password[i] = (char)(1 + (i * 37) % 255);
  for (size_t s = 0; s < sizeof schemes / sizeof schemes[0]; ++s) {
    for (size_t n = 0; n < sizeof lengths / sizeof lengths[0]; ++n) {
      const int length = format_password(schemes[s], salt, keys, password, lengths[n], value, (int)sizeof value);
      fprintf(out, "%.*s %d %d\n", length, value, check_format(value, (unsigned)length),
              formatted_password_length(schemes[s], lengths[n]));
    }
  }
}

static void derived(FILE* out) {
  unsigned char key[45];
  void* ctx = NULL;
  void* digestCtx = NULL;
  void* digest = NULL;
  const uint64_t tooLong = 85899345901U; /* cut to 32 bits it would do */
  initQelCrypto(&ctx);
  initQelDigest(ctx, &digestCtx, "SHA1", &digest);
  const unsigned char* const text = (const unsigned char*)"0123456789abcdef";
  fprintf(out, "derivation %d %d\n", morva_pbkdf2(ctx, digestCtx, digest, text, 9, text, 7, 5, key, sizeof key),
          morva_pbkdf2(ctx, digestCtx, digest, text, 9, text, 7, 5, key, tooLong));
  bytes(out, "derived", key, sizeof key);
  freeQelDigest(ctx, digestCtx);
}

static void everything(FILE* out) {
  static const char masked[] =
      "{qVEIL}>17XiuZrtnLrvXtGcqx+g2tBVmMDTVxji7I7wgwMSlUnUwk5oXZZrrh78S5wOBYO3gK0uRrLjjGI2cREs1tgHF9UWHJXwjIPAUpMruJP+"
      "DceHrVaRODQ1DGMIMoEX2B1FDO9x4HwLnv3OGrLbt3VaaGBKTPpMsPtpQj<";
  AesKeyData* keys = NULL;
  char* clear = NULL;
  unsigned char drawn[400];
  unsigned char block[] = "8 bytes";
  uint32_t schedule[96];
  state = 1;
  fputs("# Made by the test \"recorded\" on x86-64, without an argument.\n", out);
  fprintf(out, "keys %d\n", genTmpKeyDataVal("aSeedOfSomeCharacters", "12CharsSalt!", &keys));
  if (keys == NULL) return;
  setCipherNameGlobal();
  fprintf(out, "sync %s\n", (const char*)keys->cryptoSync.data);
  for (int i = 0; i < 3; ++i) bytes(out, "key", keys->aesKeys[i].data, keys->aesKeys[i].length);
  values(out, keys);
  derived(out);
  morva_rand_ascii(qelCtxGlobal, drawn, sizeof drawn);
  fprintf(out, "random %s\n", (const char*)drawn);
  des3key(schedule, (const unsigned char*)"0123456789abcdefABCDEFGH", 0);
  for (int i = 0; i < 3; ++i) des(schedule + i * 32, block);
  bytes(out, "des3", block, sizeof block);
  fprintf(out, "unmasked %d", unformat_password(masked, &clear, NULL, NULL));
  fprintf(out, " %s\n", clear == NULL ? "" : clear);
  _morva_utils_decode_buffer_free(&clear);
  freeAesKeyData(keys);
}

/* One round, with the stack moved. */
static char* rounded(size_t distance) {
  volatile char* moved = alloca(distance);
  char* text = NULL;
  size_t size = 0;
  FILE* out = open_memstream(&text, &size);
  moved[0] = 0;
  everything(out);
  fclose(out);
  return text;
}

int main(int argc, char** argv) {
  static char expected[16384];
  void* ctx = NULL;
  FILE* record = argc == 2 ? fopen(argv[1], "r") : NULL;
  if (initQelCrypto(&ctx) != 0 || (argc == 2 && record == NULL)) return 2;
  pQEL_RAND_bytes = fixedRandomBytes;
  if (record != NULL) {
    expected[fread(expected, 1, sizeof expected - 1, record)] = '\0';
    fclose(record);
  }
  for (size_t distance = 4; distance <= 64; distance += 4) {
    char* text = rounded(distance);
    const int same = strcmp(text, expected) == 0;
    if (record == NULL || !same) fputs(text, stdout);
    free(text);
    if (record == NULL) return 0;
    if (!same) {
      fprintf(stderr, "what is on standard output differs from %s\n", argv[1]);
      return 1;
    }
  }
  return 0;
}
