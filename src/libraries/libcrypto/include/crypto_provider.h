/* SPDX-License-Identifier: Apache-2.0 */
/*
 * ldappw crypto provider: finding and opening the provider library, its entry table, the one process-wide provider
 * context, and cipher and digest contexts over it. The rules of encoding_utils.h hold here too. Each operation is
 * traced unless it says otherwise.
 *
 * Order of use: initQelCrypto, then initQelCipher or initQelDigest, then provider calls through the table, then
 * freeQelCipher or freeQelDigest. The provider context lives until the process exits. A cipher or digest context
 * belongs to one thread at a time; everything else may be shared.
 */
#ifndef LDAPPW_CRYPTO_PROVIDER_H
#define LDAPPW_CRYPTO_PROVIDER_H

#include "encoding_utils.h"

#ifdef __cplusplus
extern "C" {
#endif

/* What the provider reports of its last step. The layout is exchanged with the provider: 268 bytes. */
typedef struct QelStatus {
  int32_t majRC; /* 0 is success */
  int32_t minRC; /* 15 is out of memory */
  char desc[260];
} QelStatus;

/* ---- Process-wide state: written while the provider is loaded, read-only afterwards ---- */

LDAPPW_DATA const char* qelLibraryName; /* the provider library's file name */
LDAPPW_DATA void** qelLoadGlobal;       /* the cell of the open provider library, or null */
LDAPPW_DATA void* qelCtxGlobal;         /* the provider context, or null */

/*
 * The entry table, in the order in which the entries are resolved. Results of type int are 1 for success and 0 for
 * failure, or a size in bytes. ctx is the provider context. Set by loadQelCrypto, stale after unloadQelCrypto.
 */
LDAPPW_DATA int (*pQEL_GetStatus)(void* ctx, QelStatus* status);
LDAPPW_DATA int (*pQEL_SetValue)(void* ctx, QelStatus* status, int id, const char* value);
LDAPPW_DATA int (*pQEL_GetValue)(void* ctx, QelStatus* status, int id, char* buffer, int size);
LDAPPW_DATA void* (*pQEL_Init)(QelStatus* status, const char* path);
LDAPPW_DATA int (*pQEL_Attach)(void* ctx, QelStatus* status);
LDAPPW_DATA int (*pQEL_Cleanup)(void* ctx, QelStatus* status);
LDAPPW_DATA const void* (*pQEL_EVP_get_cipherbyname)(void* ctx, const char* name);
LDAPPW_DATA const void* (*pQEL_EVP_get_digestbyname)(void* ctx, const char* name);
LDAPPW_DATA void* (*pQEL_EVP_MD_CTX_new)(void* ctx);
LDAPPW_DATA int (*pQEL_EVP_MD_CTX_free)(void* ctx, void* digestCtx);
LDAPPW_DATA int (*pQEL_EVP_MD_CTX_init)(void* ctx, void* digestCtx);
LDAPPW_DATA int (*pQEL_EVP_MD_CTX_cleanup)(void* ctx, void* digestCtx);
LDAPPW_DATA int (*pQEL_EVP_MD_block_size)(void* ctx, const void* digest);
LDAPPW_DATA int (*pQEL_EVP_MD_size)(void* ctx, const void* digest);
LDAPPW_DATA int (*pQEL_EVP_DigestInit)(void* ctx, void* digestCtx, const void* digest);
LDAPPW_DATA int (*pQEL_EVP_DigestUpdate)(void* ctx, void* digestCtx, const void* data, unsigned int length);
LDAPPW_DATA int (*pQEL_EVP_DigestFinal)(void* ctx, void* digestCtx, unsigned char* out, unsigned int* outLength);
LDAPPW_DATA void* (*pQEL_EVP_CIPHER_CTX_new)(void* ctx);
LDAPPW_DATA int (*pQEL_EVP_CIPHER_CTX_free)(void* ctx, void* cipherCtx);
LDAPPW_DATA int (*pQEL_EVP_CIPHER_CTX_init)(void* ctx, void* cipherCtx);
LDAPPW_DATA int (*pQEL_EVP_CIPHER_CTX_cleanup)(void* ctx, void* cipherCtx);
LDAPPW_DATA int (*pQEL_EVP_CIPHER_CTX_set_key_length)(void* ctx, void* cipherCtx, int length);
LDAPPW_DATA int (*pQEL_EVP_CIPHER_CTX_set_padding)(void* ctx, void* cipherCtx, int padding);
LDAPPW_DATA int (*pQEL_EVP_CIPHER_block_size)(void* ctx, const void* cipher);
LDAPPW_DATA int (*pQEL_EVP_CIPHER_key_length)(void* ctx, const void* cipher);
LDAPPW_DATA int (*pQEL_EVP_CIPHER_iv_length)(void* ctx, const void* cipher);
LDAPPW_DATA int (*pQEL_EVP_EncryptInit)(void* ctx, void* cipherCtx, const void* cipher, const unsigned char* key,
                                        const unsigned char* iv);
LDAPPW_DATA int (*pQEL_EVP_EncryptUpdate)(void* ctx, void* cipherCtx, unsigned char* out, int* outLength,
                                          const unsigned char* in, int inLength);
LDAPPW_DATA int (*pQEL_EVP_EncryptFinal)(void* ctx, void* cipherCtx, unsigned char* out, int* outLength);
LDAPPW_DATA int (*pQEL_EVP_DecryptInit)(void* ctx, void* cipherCtx, const void* cipher, const unsigned char* key,
                                        const unsigned char* iv);
LDAPPW_DATA int (*pQEL_EVP_DecryptUpdate)(void* ctx, void* cipherCtx, unsigned char* out, int* outLength,
                                          const unsigned char* in, int inLength);
LDAPPW_DATA int (*pQEL_EVP_DecryptFinal)(void* ctx, void* cipherCtx, unsigned char* out, int* outLength);
LDAPPW_DATA const void* (*pQEL_EVP_CIPHER_CTX_cipher)(void* ctx, void* cipherCtx);
LDAPPW_DATA int (*pQEL_RAND_bytes)(void* ctx, unsigned char* buffer, int count);
LDAPPW_DATA int (*pQEL_RAND_seed)(void* ctx, const void* data, int length);
LDAPPW_DATA int (*pQEL_GenerateRandomSeed)(void* ctx, QelStatus* status, unsigned char* buffer, int count);

/* ---- Loading ---- */

/*
 * loadQelCrypto opens the provider library (the system's copy in /usr/lib, or whatever the loader finds when
 * TRESK_LOCAL_INSTALL_MODE is set; otherwise the copy shipped in qel/qellib beside libdsutil) and resolves the entry
 * table. TRESK_SHIPPED_QEL in the environment names the copy in use to the provider. A library left open by an earlier
 * failure is used again.
 *
 *   attachPath  out  what it points to on entry is ignored; on success a new buffer of 1024 bytes: the directory to
 *                    attach the provider at. After a failure null, or a buffer that the caller releases all the same.
 *
 * Returns 0; 1 for a null argument, a missing entry, or a path that the provider or libdsutil does not report;
 * LDAPPW_NO_MEMORY; or the result of putEnvVar. A shipped copy without treskqels_path gives 0 with no path and the
 * table untouched. Not to be called from two threads at once.
 */
LDAPPW_API int loadQelCrypto(char** attachPath) LDAPPW_NOEXCEPT;

/* Destroys the provider context and closes the library, where they exist. Neither global is cleared and the table stays
 * stale: a later load needs the caller to reset both to null. Closing the same library twice is harmless. Not traced.
 * One thread only, after all others have finished. */
LDAPPW_API void unloadQelCrypto(void) LDAPPW_NOEXCEPT;

/* ---- Contexts ---- */

/*
 * initQelCrypto hands out the process-wide provider context, which the first call creates. Many threads may call at
 * once: all get the same, and what some of them have made beside it is cleaned up. The provider is unloaded at exit, or
 * when this library is unloaded; in a process that exits while other threads run it stays, and they go on with the
 * context that there is.
 *
 *   qelCtx  out  the context; untouched after a failure, and any later call tries again
 *
 * Returns 0; 1 for a null argument, when the provider gives no context, or when there is none and the process is
 * exiting; or the code of loadQelCrypto.
 */
LDAPPW_API int initQelCrypto(void** qelCtx) LDAPPW_NOEXCEPT;

/* Destroys a provider context; null does nothing. Always 0. For a caller with a context of its own: the process-wide
 * one must not be used afterwards. */
LDAPPW_API int freeQelCrypto(void* qelCtx) LDAPPW_NOEXCEPT;

/*
 * initQelCipher and initQelDigest create a cipher or digest context and look its algorithm up by name.
 *
 *   qelCtx      in   the provider context
 *   cipherCtx   out  the context, released with the matching free operation; null after a failure of the provider
 *   cipherName  in   a name that the provider knows, such as "AES-128-ECB", "SHA1" or "md5"
 *   cipher      out  the algorithm, which is never released
 *
 * Return 0, or 1 for a null argument, an unknown name or a provider failure.
 */
LDAPPW_API int initQelCipher(void* qelCtx, void** cipherCtx, const char* cipherName, void** cipher) LDAPPW_NOEXCEPT;
LDAPPW_API int initQelDigest(void* qelCtx, void** digestCtx, const char* digestName, void** digest) LDAPPW_NOEXCEPT;

/* Clean and release a cipher or digest context; null does nothing. Return 0, or 1 for a null qelCtx or a provider
 * failure (a context that cannot be cleaned is not released). */
LDAPPW_API int freeQelCipher(void* qelCtx, void* cipherCtx) LDAPPW_NOEXCEPT;
LDAPPW_API int freeQelDigest(void* qelCtx, void* digestCtx) LDAPPW_NOEXCEPT;

/* Translates a provider status: the given one, or the context's last when status is null. A majRC other than 0 is also
 * printed on standard output. Returns 0 for a majRC of 0; LDAPPW_NO_MEMORY for a minRC of 15; otherwise 1, also when
 * both arguments are null. */
LDAPPW_API int qelStatusToLdap(void* qelCtx, QelStatus* status) LDAPPW_NOEXCEPT;

#ifdef __cplusplus
}
#endif

#endif
