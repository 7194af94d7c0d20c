/* SPDX-License-Identifier: Apache-2.0 */
/* A program in C that uses the built library as a host does: every header, operations of each, and exported variables
 * that the library must see change. With decoys preloaded it shows that the library keeps to its own functions. Each
 * scheme is used with the stack at every distance from a multiple of 16, as hosts of the older 32-bit convention do. */
#include <alloca.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>

#include "aes_keys.h"
#include "check.h"
#include "crypto_provider.h"
#include "encoding_utils.h"
#include "password_schemes.h"

static int noRandomBytes(void* ctx, unsigned char* buffer, int count) {
  (void)ctx, (void)buffer, (void)count;
  return 0;
}

static int matches(const char* password, const char* stored, AesKeyData* keys) {
  return verify_password(password, (int)strlen(password), stored, (int)strlen(stored), 1, keys) == 0;
}

static void useOnStackMovedBy(size_t distance, int scheme, char* salt, AesKeyData* keys) {
  volatile char* moved = alloca(distance);
  char value[1024];
  char* clear = NULL;
  moved[0] = 0;
  CHECK(format_password(scheme, salt, keys, "secret", 6, value, (int)sizeof value) > 0);
  CHECK(matches("secret", value, keys) && !matches("Secret", value, keys));
  CHECK(scheme < FORMAT_QVEIL || (unformat_password(value, &clear, keys, NULL) == 1 && strcmp(clear, "secret") == 0));
  _morva_utils_decode_buffer_free(&clear);
}

/* The tags are arrays of the library's own, back to back with one NUL behind the last, that a host may write to. */
static void checkTags(void) {
  char* const tags[] = {SHA_BRACED,    SSHA_BRACED,   MD5_BRACED,    crypt_BRACED, qVEIL_BRACED,
                        AES128_BRACED, AES192_BRACED, AES256_BRACED, VLDL_BRACED};
  char* const texts[] = {"{SHA}",    "{SSHA}",   "{MD5}",    "{crypt}", "{qVEIL}",
                         "{AES128}", "{AES192}", "{AES256}", "{VLDL}"};
  char* volatile first = SHA_BRACED; /* a compiler that knew the array would see its end passed */
  volatile char* next = first;
  for (size_t i = 0; i < sizeof tags / sizeof tags[0]; ++i) {
    CHECK(next == tags[i]);
    for (const char* c = texts[i]; *c != '\0'; ++c, ++next) {
      CHECK(*next == *c);
      *next = '?';
      CHECK(*next == '?');
      *next = *c;
    }
  }
  CHECK(*next == '\0');
}

int main(void) {
  static const int schemes[] = {FORMAT_SHA,   FORMAT_MD5,    FORMAT_CRYPT,  FORMAT_SSHA,
                                FORMAT_QVEIL, FORMAT_AES128, FORMAT_AES192, FORMAT_AES256};
  char folder[] = "/tmp/ldappw-consumer-XXXXXX";
  char stash[64];
  char salt[3];
  char* sync = NULL;
  char* text = NULL;
  AesKeyData* keys = NULL;
  CHECK(mkdtemp(folder) != NULL);
  snprintf(stash, sizeof stash, "%s/stash", folder);
  CHECK(createKeyStashFiles("/dev/null", stash, "a seed with blanks", &sync, NULL) == LDAPPW_CONSTRAINT_VIOLATION);
  CHECK(createKeyStashFiles("/dev/null", stash, "aSeedWithoutSpaces", &sync, NULL) == LDAPPW_SUCCESS && sync != NULL);
  CHECK(setAESKeyData(stash, &keys) == LDAPPW_SUCCESS);
  CHECK(strcmp(g_CipherName[2], "AES-256-ECB") == 0);

  generate_crypt_salt(salt);
  for (size_t i = 0; i < sizeof schemes / sizeof schemes[0]; ++i) {
    for (size_t distance = 4; distance <= 64; distance += 4) useOnStackMovedBy(distance, schemes[i], salt, keys);
  }

  checkTags();
  free(sync);
  freeAesKeyData(keys);
  unlink(stash);
  rmdir(folder);
  if (getenv("LDAPPW_DECOYS") != NULL) return 0; /* the host's own calls from here on would reach the decoys */

  /* FIPS 46-3 weak key: enciphering twice gives the block back. */
  uint32_t schedule[32];
  unsigned char block[8] = "8 bytes";
  deskey(schedule, (const unsigned char*)"\1\1\1\1\1\1\1\1", 0);
  des(schedule, block);
  des(schedule, block);
  CHECK(memcmp(block, "8 bytes", 8) == 0);
  char bits[64] = {0};
  CHECK(ldappw_setkey(bits) == 0 && ldappw_encrypt(bits, 0) == 0 && bits[0] == 1); /* 0 under 0 is 8ca64de9c1b123a7 */

  /* The library sees a provider entry and an alphabet that the host puts in place. */
  int (*const randomBytes)(void*, unsigned char*, int) = pQEL_RAND_bytes;
  CHECK(randomBytes != NULL && qelCtxGlobal != NULL);
  pQEL_RAND_bytes = noRandomBytes;
  CHECK(saltedHashEncrypt("secret", &text, "SHA1") == LDAPPW_OPERATIONS_ERROR && text == NULL);
  pQEL_RAND_bytes = randomBytes;
  const char* const standard = pBase64;
  pBase64 = "abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ0123456789+/";
  text = binaryBlobToBase64((const unsigned char*)"\0\0\0", 3);
  pBase64 = standard;
  CHECK(text != NULL && strcmp(text, "aaaa") == 0);

  free(text);
  return 0;
}
