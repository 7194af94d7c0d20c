/* SPDX-License-Identifier: Apache-2.0 */
/* Functions of names that a host can hold too. The library must never reach them. */
#include <stdlib.h>

#define DECOY(name)                                               \
  int decoy_##name(void) __asm__(#name);                          \
  __attribute__((visibility("default"))) int decoy_##name(void) { \
    abort();                                                      \
  }

DECOY(crypt)
DECOY(encrypt)
DECOY(setkey)
DECOY(des)
DECOY(deskey)
DECOY(deskey56)
DECOY(SHA)
DECOY(_crypt)
DECOY(_crypt_r)
DECOY(check_format)
DECOY(binaryBlobToString)
DECOY(initQelCrypto)
