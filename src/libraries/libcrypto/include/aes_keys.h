/* SPDX-License-Identifier: Apache-2.0 */
/*
 * ldappw AES keys: the key data record and the process-wide key state, stash files, key generation, and encryption of
 * buffers. The rules of encoding_utils.h hold here too. Handles (qelCtx, digestCtx, digest) come from
 * crypto_provider.h. Each operation is traced.
 */
#ifndef LDAPPW_AES_KEYS_H
#define LDAPPW_AES_KEYS_H

#include "encoding_utils.h"

#ifdef __cplusplus
extern "C" {
#endif

/* A counted buffer. */
typedef struct SecBuffer {
  unsigned char* data;
  uint32_t length;
} SecBuffer;

/*
 * The key material of one stash file. It owns its five buffers. Texts are NUL-terminated and their lengths do not count
 * the NUL. Keys are 16, 24 and 32 bytes for AES-128, AES-192 and AES-256 (FIPS 197): index 0, 1, 2.
 */
typedef struct AesKeyData {
  SecBuffer cryptoSync; /* base64 text that is equal in records of the same seed and salt */
  SecBuffer cryptoSalt; /* 12 printable characters */
  SecBuffer aesKeys[3];
} AesKeyData;

/* ---- The process-wide key state: null at start, each set once, by one thread, before other threads read it ---- */

LDAPPW_DATA AesKeyData* g_CfgKeyData;    /* of the configuration stash file */
LDAPPW_DATA AesKeyData* g_DirKeyData;    /* of the directory stash file */
LDAPPW_DATA char* g_CfgCryptoSync;       /* the configuration's sync text as the server handed it in */
LDAPPW_DATA const char* g_CipherName[3]; /* provider cipher names by key index; set when a stash file is loaded */

/* Loads the stash file into the global record unless that is set already; no file is looked at then. Returns 0, 1 or
 * LDAPPW_NO_MEMORY; after a failure the global is still null, so that a later call may succeed. Check the result: with
 * a null record format_password makes a FORMAT_QVEIL value of FORMAT_AES256 in silence, so that a server without its
 * stash file would store what anybody can read. */
LDAPPW_API int setCfgKeyDataGlobal(const char* keyStashFile) LDAPPW_NOEXCEPT;
LDAPPW_API int setDirKeyDataGlobal(const char* keyStashFile) LDAPPW_NOEXCEPT;

/* Returns the global record itself, null when it is not set. Not to be released. */
LDAPPW_API AesKeyData* getCfgKeyDataGlobal(void) LDAPPW_NOEXCEPT;
LDAPPW_API AesKeyData* getDirKeyDataGlobal(void) LDAPPW_NOEXCEPT;

/* Keeps a copy of the text unless one is kept already. Returns 0, 1 for null, or LDAPPW_NO_MEMORY. */
LDAPPW_API int setCfgCryptoSyncGlobal(const char* cryptoSync) LDAPPW_NOEXCEPT;

/* Fills g_CipherName when its first slot is null. Always 0. setAESKeyData and the set...KeyDataGlobal operations do so;
 * who has a record from elsewhere calls this before the first password operation with that record. */
LDAPPW_API int setCipherNameGlobal(void) LDAPPW_NOEXCEPT;

/* ---- Records ---- */

/* Creates a record whose salt and key buffers are zeros and whose sync buffer is null. What *keyData holds on entry is
 * ignored. Returns 0, 1 or LDAPPW_NO_MEMORY. */
LDAPPW_API int initAesKeyData(AesKeyData** keyData) LDAPPW_NOEXCEPT;

/* Creates a deep copy. The source must have all five buffers (1 otherwise), and its texts their terminators. Returns 0,
 * 1 or LDAPPW_NO_MEMORY. */
LDAPPW_API int copyAesKeyData(const AesKeyData* keyDataOrig, AesKeyData** keyDataCopy) LDAPPW_NOEXCEPT;

/* Wipes and releases the record and its buffers, of which each holds as many bytes as its length states. Always 0. */
LDAPPW_API int freeAesKeyData(AesKeyData* keyData) LDAPPW_NOEXCEPT;

/* Creates a record from a stash file, for a caller that keeps its own. Returns 0, 1 or LDAPPW_NO_MEMORY. */
LDAPPW_API int setAESKeyData(const char* keyStashFile, AesKeyData** keyData) LDAPPW_NOEXCEPT;

/*
 * checkKeyStashFile compares sync and salt texts with a record's.
 *
 *   type        in   0: the sync text alone is compared; 1: both
 *   keyData     in   the record
 *   cryptoSync  in   a NUL-terminated text
 *   cryptoSalt  in   a NUL-terminated text, needed for both types
 *   isMatch     out  1 for a match, otherwise 0; untouched when an argument is null
 *
 * Returns 0, also for a mismatch; 1 for a null argument or another type.
 */
LDAPPW_API int checkKeyStashFile(int type, const AesKeyData* keyData, const char* cryptoSync, const char* cryptoSalt,
                                 int* isMatch) LDAPPW_NOEXCEPT;

/* ---- Stash files: sync length (32 bits, little-endian), sync text, 12 bytes of salt, the three keys ---- */

/* Reads the file into a record that comes from initAesKeyData. Bytes after the last key are ignored. Returns 0; 1 for a
 * null argument, a file that cannot be opened or is too short; LDAPPW_NO_MEMORY. A record filled in part is the
 * caller's to release. */
LDAPPW_API int readKeyStashFile(const char* keyStashFile, AesKeyData* keyData) LDAPPW_NOEXCEPT;

/*
 * createKeyStashFiles writes two stash files; new ones get mode 0600, and a file that exists keeps its mode. The
 * configuration's comes from a random seed and salt, the directory's from those given.
 *
 *   cfgKeyStashFile  in   path
 *   dirKeyStashFile  in   path
 *   dirCryptoSeed    in   12 to 1016 characters (see validateCryptoString)
 *   cryptoSyncStr    out  a new text: the sync text of the configuration record
 *   dirCryptoSalt    in   12 characters, or null for random ones
 *
 * Returns 0; 1 for a null argument or a failed file or provider operation; LDAPPW_CONSTRAINT_VIOLATION for an
 * unacceptable seed or salt; LDAPPW_NO_MEMORY; or the code of initQelCrypto. A failure may leave the configuration file
 * written, but no file with other keys than seed and salt give.
 */
LDAPPW_API int createKeyStashFiles(const char* cfgKeyStashFile, const char* dirKeyStashFile, const char* dirCryptoSeed,
                                   char** cryptoSyncStr, const char* dirCryptoSalt) LDAPPW_NOEXCEPT;

/* Rebuilds a directory stash file, byte for byte, from its seed and salt. All arguments are needed; codes as above. */
LDAPPW_API int restoreKeyStashFile(const char* keyStashFile, const char* cryptoSeed,
                                   const char* cryptoSalt) LDAPPW_NOEXCEPT;

/* Checks that the text can be a seed (type 0: 12 to 1016 characters) or a salt (type 1: exactly 12), each character
 * from 33 to 126. Returns 0, 1 for null or another type, LDAPPW_CONSTRAINT_VIOLATION for a text that cannot. */
LDAPPW_API int validateCryptoString(const char* cryptoString, int type) LDAPPW_NOEXCEPT;

/* ---- Making key material ---- */

/* Writes size - 1 random characters from 33 to 125 and a NUL; a size of 0 writes nothing. Returns 0, or 1 when no
 * provider is loaded. A provider that fails to give random bytes ends the process, after "The PRNG is not seeded!" on
 * standard error. Not traced. */
LDAPPW_API int morva_rand_ascii(void* qelCtx, unsigned char* buffer, unsigned int size) LDAPPW_NOEXCEPT;

/* Fills the record's salt with random characters. Returns 0, or 1 for a null argument or no provider. */
LDAPPW_API int genKeySaltVal(void* qelCtx, AesKeyData* keyData) LDAPPW_NOEXCEPT;

/*
 * morva_pbkdf2 derives a key from a seed and a salt in the outer shape of PBKDF2 (RFC 2898, section 5.2), but its
 * pseudo-random function is a plain digest, not HMAC: U1 = H(salt || seed || INT(i)), Uj = H(Uj-1). The results are not
 * those of standard PBKDF2. A block has 20 bytes ("SHA1"); of a longer digest the first 20 count.
 *
 *   qelCtx         in   the provider context
 *   digestCtx      in   a digest context
 *   digest         in   its digest
 *   seed           in   seedLen bytes
 *   seedLen        in   bytes
 *   salt           in   saltLen bytes, of which the low 32 bits of the number count
 *   saltLen        in   bytes
 *   iterations     in   0 counts as 1
 *   derivedKey     out  derivedKeyLen bytes; blocks written before a failure stay
 *   derivedKeyLen  in   bytes, at most 85899345900
 *
 * Returns 0, 1 for a null argument, a length above that or no provider, or LDAPPW_NO_MEMORY. A provider failure inside
 * a digest call is not reported here, only by the operations below.
 */
LDAPPW_API int morva_pbkdf2(void* qelCtx, void* digestCtx, void* digest, const unsigned char* seed, uint32_t seedLen,
                            const unsigned char* salt, uint64_t saltLen, uint32_t iterations, unsigned char* derivedKey,
                            uint64_t derivedKeyLen) LDAPPW_NOEXCEPT;

/* Fills the three keys from the seed text and the record's salt, 10000 iterations each. As only the lengths differ, a
 * shorter key is the beginning of a longer one. Returns 0; 1 for a null argument or a failed provider step;
 * LDAPPW_NO_MEMORY. */
LDAPPW_API int growKeysFromSeed(void* qelCtx, void* digestCtx, void* digest, const char* cryptoSeed,
                                AesKeyData* keyData) LDAPPW_NOEXCEPT;

/* Fills the sync text: as many bytes as the seed has characters, derived with 3 iterations, as base64. The seed may be
 * the record's own sync text. Codes as above. */
LDAPPW_API int genKeySyncVal(void* qelCtx, void* digestCtx, void* digest, const char* cryptoSeed,
                             AesKeyData* keyData) LDAPPW_NOEXCEPT;

/* Creates a complete record from a seed and a salt; null for either means a random one. Codes as above. */
LDAPPW_API int genKeyDataVal(void* qelCtx, void* digestCtx, void* digest, const char* userCryptoSeed,
                             const char* userCryptoSalt, AesKeyData** keyData) LDAPPW_NOEXCEPT;

/* The same with contexts of its own; seed and salt are both needed. Codes as above, or the code of initQelCrypto. */
LDAPPW_API int genTmpKeyDataVal(const char* userCryptoSeed, const char* userCryptoSalt,
                                AesKeyData** keyData) LDAPPW_NOEXCEPT;

/* ---- Encryption of buffers ---- */

/*
 * aesEncryptBuffer enciphers bytes with PKCS #7 padding and returns them as base64 text: the payload of an {AES128},
 * {AES192} or {AES256} value.
 *
 *   clear        in   clearLength bytes, zeros allowed; null is an error even when clearLength is 0
 *   out          out  a new NUL-terminated text
 *   cipherName   in   a name that the provider knows, such as "AES-256-ECB"
 *   key          in   key->data holds as many bytes as the cipher needs; key->length is ignored
 *   iv           in   the first min(iv->length, vector length) bytes, zero-padded; an ECB cipher takes none
 *   clearLength  in   0 or more
 *
 * Returns 0; 1 for a null argument, a negative length or a failed provider or base64 step; LDAPPW_NO_MEMORY, also for a
 * length so near to INT_MAX that no int can state the result's; or the code of initQelCrypto or initQelCipher. *out is
 * untouched when the arguments are refused or initQelCrypto fails.
 */
LDAPPW_API int aesEncryptBuffer(const char* clear, char** out, const char* cipherName, const SecBuffer* key,
                                const SecBuffer* iv, int clearLength) LDAPPW_NOEXCEPT;

/*
 * aesDecryptBuffer undoes it.
 *
 *   text         in   a NUL-terminated text
 *   out          out  new bytes followed by a NUL
 *   cipherName   in   as above
 *   key          in   as above
 *   iv           in   as above
 *   clearLength  out  the number of bytes; may be null
 *
 * A text with a character outside base64 is refused with 1 before the provider is asked; a wrong key or a damaged text
 * gives 1 when the padding does not check, which one wrong key in some 250 passes. Codes as above; *out is untouched
 * when the arguments or the text are refused.
 */
LDAPPW_API int aesDecryptBuffer(const char* text, char** out, const char* cipherName, const SecBuffer* key,
                                const SecBuffer* iv, int* clearLength) LDAPPW_NOEXCEPT;

#ifdef __cplusplus
}
#endif

#endif
