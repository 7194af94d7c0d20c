/* SPDX-License-Identifier: Apache-2.0 */
/*
 * The crypto provider: digests, symmetric ciphers and random bytes behind plain C entries with opaque handles. It is
 * opened with dlopen, and its entries are found by name. These rules hold for every entry:
 *
 *  1. An int result is 1 for success and 0 for failure, or a size in bytes where the entry asks for one. A pointer
 *     result is null after a failure.
 *  2. A handle is a token, not an address. Each entry checks every handle it is given: null, a handle of another kind
 *     or of another provider context, one already released, and any other value whatever are failures. A released
 *     token does not come back to life when its place is used again (with 32-bit pointers: not before 4096 uses).
 *  3. A thread remembers its last failure, unless the provider context was not valid; a success leaves it as it is. An
 *     entry with a QelStatus argument also fills that record, which may be null: with the failure, or with zeros.
 *     OpenSSL's error queue of the thread is as it was before, with what the host has in it.
 *  4. A provider context and its algorithms may be used from many threads at once. A digest or cipher context belongs
 *     to one thread at a time, the one that made or started it last, and is released with a wipe when that ends.
 *  5. Lengths and sizes are in bytes; a negative one is a failure. A null buffer with a length of 0 is fine unless the
 *     entry says otherwise. Texts are NUL-terminated.
 *  6. The library stays in the process once it is loaded, as libcrypto does. So a thread that is inside when the host
 *     closes it or exits comes to its end there, and one that comes after QEL_Cleanup is refused. Where this library
 *     started OpenSSL, OpenSSL works until the process ends. Where the host did, its exit handler may end OpenSSL; what
 *     there is in a provider context goes on.
 *  7. Memory that runs out is a failure, and the call may be tried again. But OpenSSL starts once in a process: where
 *     memory ran out in that, QEL_Init fails for good.
 *  8. The child of a fork may go on with what the thread had that forked.
 */
#pragma once

#include <assert.h>
#include <stdint.h>

#ifdef __cplusplus
#define QEL_NOEXCEPT noexcept
extern "C" {
#else
#define QEL_NOEXCEPT
#endif
#pragma GCC visibility push(default)

typedef struct QelContextHandle QEL_CTX;
typedef struct QelCipherHandle QEL_CIPHER;
typedef struct QelDigestHandle QEL_DIGEST;
typedef struct QelCipherContextHandle QEL_CIPHER_CTX;
typedef struct QelDigestContextHandle QEL_MD_CTX;

typedef struct QelStatus {
  int32_t majRC;  /* 0 is success, 1 is failure */
  int32_t minRC;  /* a QelReason; 0 after a success */
  char desc[260]; /* the failure in words; empty after a success */
} QelStatus;
static_assert(sizeof(QelStatus) == 268, "the layout is exchanged with callers");

enum QelReason {
  QEL_REASON_UNSPECIFIED = 0,
  QEL_REASON_NULL_ARGUMENT = 1,
  QEL_REASON_FOREIGN_HANDLE = 2, /* not a live handle of this kind and provider context */
  QEL_REASON_UNKNOWN_ALGORITHM = 3,
  QEL_REASON_BAD_LENGTH = 4,
  QEL_REASON_WRONG_STATE = 5, /* a step out of order, such as an update without an init */
  QEL_REASON_PATH_TOO_LONG = 6,
  QEL_REASON_BAD_VALUE_ID = 7,
  QEL_REASON_BAD_VALUE = 8,
  QEL_REASON_BUFFER_TOO_SMALL = 9,
  QEL_REASON_DIGEST_FAILURE = 10,
  QEL_REASON_CIPHER_FAILURE = 11, /* wrong padding and incomplete blocks among them */
  QEL_REASON_RANDOM_FAILURE = 12,
  QEL_REASON_NOT_AVAILABLE = 13, /* OpenSSL or its default provider cannot be used */
  QEL_REASON_OVERLAP = 14,       /* of an output with input that is still to be read */
  QEL_REASON_OUT_OF_MEMORY = 15  /* also: 512 provider contexts, or 131072 digest or cipher contexts, are live */
};

/* The ids of QEL_SetValue and QEL_GetValue. */
enum QelValueId {
  QEL_VALUE_STRICT = 0,   /* "on" (at first) or "off": whether a cipher context needs a new init after its final step.
                             With "off" one that has nothing left goes on. Every other order check always holds. */
  QEL_VALUE_LOAD_PATH = 1 /* the path given to QEL_Init or set since; up to 4095 bytes */
};

/*
 * Copies the absolute path of the directory that holds qellib/ with this library, as the loader knew it (symbolic links
 * are not resolved), without a slash at its end. A path of PATH_MAX bytes or more is a failure. Needs no provider
 * context.
 *
 *   buffer  out  the path; untouched after a failure
 *   size    in   bytes of buffer, the NUL included
 */
int treskqels_path(char* buffer, int size) QEL_NOEXCEPT;

/* ---- Provider contexts ---- */

/* Copies the last failure of the calling thread into *status when it was with ctx, else zeros. A null status is a
 * failure here. */
int QEL_GetStatus(QEL_CTX* ctx, QelStatus* status) QEL_NOEXCEPT;

/* Set one of the values of QelValueId to a copy of the text, and copy the text of one with its NUL into a buffer of
 * size bytes. After a failure the old text stands, and the buffer is untouched. */
int QEL_SetValue(QEL_CTX* ctx, QelStatus* status, int id, const char* value) QEL_NOEXCEPT;
int QEL_GetValue(QEL_CTX* ctx, QelStatus* status, int id, char* buffer, int size) QEL_NOEXCEPT;

/* Makes a provider context; the caller releases it with QEL_Cleanup. path may be null, which is the empty path. */
QEL_CTX* QEL_Init(QelStatus* status, const char* path) QEL_NOEXCEPT;

/* Checks that SHA1 and AES-128-ECB can be had. Other entries do not depend on it. May be repeated. */
int QEL_Attach(QEL_CTX* ctx, QelStatus* status) QEL_NOEXCEPT;

/* Releases the provider context, and wipes and releases the digest and cipher contexts in it. Those that belong to
 * another thread are refused from now on, and go when that thread ends or needs their places. */
int QEL_Cleanup(QEL_CTX* ctx, QelStatus* status) QEL_NOEXCEPT;

/* ---- Algorithms ---- */

/* Find an algorithm by any name that OpenSSL's default provider has for it, in either case ("SHA1", "sha-1",
 * "AES-128-ECB"). Every name of it gives the same handle, which is valid until QEL_Cleanup and never released by
 * itself. Digests are those of one size, so SHAKE and KECCAK-KMAC are not found. Ciphers are those that work in pieces
 * of any size and give everything back with padding on; the others are not found: authenticated ones (GCM, CCM, OCB,
 * SIV, Poly1305, CBC with HMAC), key wraps, XTS, and CBC-CTS. */
const QEL_CIPHER* QEL_EVP_get_cipherbyname(QEL_CTX* ctx, const char* name) QEL_NOEXCEPT;
const QEL_DIGEST* QEL_EVP_get_digestbyname(QEL_CTX* ctx, const char* name) QEL_NOEXCEPT;

/* Sizes in bytes; 0 after a failure. A cipher without an initial vector, as in ECB mode, has one of 0 bytes. */
int QEL_EVP_MD_block_size(QEL_CTX* ctx, const QEL_DIGEST* digest) QEL_NOEXCEPT;
int QEL_EVP_MD_size(QEL_CTX* ctx, const QEL_DIGEST* digest) QEL_NOEXCEPT;
int QEL_EVP_CIPHER_block_size(QEL_CTX* ctx, const QEL_CIPHER* cipher) QEL_NOEXCEPT;
int QEL_EVP_CIPHER_key_length(QEL_CTX* ctx, const QEL_CIPHER* cipher) QEL_NOEXCEPT;
int QEL_EVP_CIPHER_iv_length(QEL_CTX* ctx, const QEL_CIPHER* cipher) QEL_NOEXCEPT;

/* ---- Digests ---- */

/* Makes a fresh digest context; the caller releases it with the free entry, which wipes it. Init and cleanup both wipe
 * it and make it as fresh as a new one. */
QEL_MD_CTX* QEL_EVP_MD_CTX_new(QEL_CTX* ctx) QEL_NOEXCEPT;
int QEL_EVP_MD_CTX_free(QEL_CTX* ctx, QEL_MD_CTX* digestCtx) QEL_NOEXCEPT;
int QEL_EVP_MD_CTX_init(QEL_CTX* ctx, QEL_MD_CTX* digestCtx) QEL_NOEXCEPT;
int QEL_EVP_MD_CTX_cleanup(QEL_CTX* ctx, QEL_MD_CTX* digestCtx) QEL_NOEXCEPT;

/* Start a digest, in whatever state the context is; add length bytes, only between init and final. After a failure of
 * OpenSSL the context needs another init. */
int QEL_EVP_DigestInit(QEL_CTX* ctx, QEL_MD_CTX* digestCtx, const QEL_DIGEST* digest) QEL_NOEXCEPT;
int QEL_EVP_DigestUpdate(QEL_CTX* ctx, QEL_MD_CTX* digestCtx, const void* data, unsigned int length) QEL_NOEXCEPT;

/*
 * Ends a digest; the next step is an init.
 *
 *   out        out  QEL_EVP_MD_size bytes
 *   outLength  out  the number of bytes written, 0 after a failure; may be null
 */
int QEL_EVP_DigestFinal(QEL_CTX* ctx, QEL_MD_CTX* digestCtx, unsigned char* out, unsigned int* outLength) QEL_NOEXCEPT;

/* ---- Ciphers ---- */

/* As with digests. A fresh cipher context has padding on. */
QEL_CIPHER_CTX* QEL_EVP_CIPHER_CTX_new(QEL_CTX* ctx) QEL_NOEXCEPT;
int QEL_EVP_CIPHER_CTX_free(QEL_CTX* ctx, QEL_CIPHER_CTX* cipherCtx) QEL_NOEXCEPT;
int QEL_EVP_CIPHER_CTX_init(QEL_CTX* ctx, QEL_CIPHER_CTX* cipherCtx) QEL_NOEXCEPT;
int QEL_EVP_CIPHER_CTX_cleanup(QEL_CTX* ctx, QEL_CIPHER_CTX* cipherCtx) QEL_NOEXCEPT;

/* States the length of the keys to come, 1 to 64 bytes. The ciphers of the default provider have one length each, so
 * that a length other than the cipher's is refused: here when the context has a cipher, else by the next init. */
int QEL_EVP_CIPHER_CTX_set_key_length(QEL_CTX* ctx, QEL_CIPHER_CTX* cipherCtx, int length) QEL_NOEXCEPT;

/* Padding on (not 0) or off (0), at once and for later inits, until the context is wiped. */
int QEL_EVP_CIPHER_CTX_set_padding(QEL_CTX* ctx, QEL_CIPHER_CTX* cipherCtx, int padding) QEL_NOEXCEPT;

/*
 * Start encryption or decryption, in whatever state the context is. After a failure the context needs another init.
 *
 *   key  in  QEL_EVP_CIPHER_key_length bytes; not null
 *   iv   in  QEL_EVP_CIPHER_iv_length bytes; null only when that is 0
 */
int QEL_EVP_EncryptInit(QEL_CTX* ctx, QEL_CIPHER_CTX* cipherCtx, const QEL_CIPHER* cipher, const unsigned char* key,
                        const unsigned char* iv) QEL_NOEXCEPT;
int QEL_EVP_DecryptInit(QEL_CTX* ctx, QEL_CIPHER_CTX* cipherCtx, const QEL_CIPHER* cipher, const unsigned char* key,
                        const unsigned char* iv) QEL_NOEXCEPT;

/*
 * Work on inLength more bytes, in the direction of the last init only.
 *
 *   out        out  room for inLength bytes and one block; not null. It may be equal to in while the context holds
 *                   nothing back, which it does of a block that is not whole, and of the last block of a padded
 *                   decryption; any other overlap is refused.
 *   outLength  out  the number of bytes written, 0 after a failure; not null
 */
int QEL_EVP_EncryptUpdate(QEL_CTX* ctx, QEL_CIPHER_CTX* cipherCtx, unsigned char* out, int* outLength,
                          const unsigned char* in, int inLength) QEL_NOEXCEPT;
int QEL_EVP_DecryptUpdate(QEL_CTX* ctx, QEL_CIPHER_CTX* cipherCtx, unsigned char* out, int* outLength,
                          const unsigned char* in, int inLength) QEL_NOEXCEPT;

/* Write the last block into room for one, outLength as above. Wrong padding and an incomplete block are failures. */
int QEL_EVP_EncryptFinal(QEL_CTX* ctx, QEL_CIPHER_CTX* cipherCtx, unsigned char* out, int* outLength) QEL_NOEXCEPT;
int QEL_EVP_DecryptFinal(QEL_CTX* ctx, QEL_CIPHER_CTX* cipherCtx, unsigned char* out, int* outLength) QEL_NOEXCEPT;

/* The cipher of the last init; a failure without one. */
const QEL_CIPHER* QEL_EVP_CIPHER_CTX_cipher(QEL_CTX* ctx, QEL_CIPHER_CTX* cipherCtx) QEL_NOEXCEPT;

/* ---- Random bytes ---- */

/* Fill count bytes from the system's generator; after a failure their content is not to be used. In the child of a fork
 * they differ from the parent's. */
int QEL_RAND_bytes(QEL_CTX* ctx, unsigned char* buffer, int count) QEL_NOEXCEPT;
int QEL_GenerateRandomSeed(QEL_CTX* ctx, QelStatus* status, unsigned char* buffer, int count) QEL_NOEXCEPT;

/* Checks its arguments and does nothing else: the system's generator needs no seed. */
int QEL_RAND_seed(QEL_CTX* ctx, const void* data, int length) QEL_NOEXCEPT;

#pragma GCC visibility pop
#ifdef __cplusplus
}
#endif
