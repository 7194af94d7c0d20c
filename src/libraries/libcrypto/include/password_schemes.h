/* SPDX-License-Identifier: Apache-2.0 */
/*
 * ldappw password schemes: recognising the scheme of a stored password value, making stored values, checking presented
 * passwords and turning reversible values back into clear text; with the Unix crypt and the digests behind them. The
 * rules of encoding_utils.h hold here too.
 *
 * A stored value is a scheme tag such as "{SSHA}", compared without regard to case, and the scheme's payload, compared
 * exactly. A value without a known tag is clear text.
 */
#ifndef LDAPPW_PASSWORD_SCHEMES_H
#define LDAPPW_PASSWORD_SCHEMES_H

#include "aes_keys.h"

#ifdef __cplusplus
extern "C" {
#endif

/* Scheme codes. Bit 7 marks the reversible schemes. */
typedef enum PasswordFormat {
  FORMAT_NONE = 1, /* clear text, or a value with an unknown tag */
  FORMAT_SHA = 2,
  FORMAT_MD5 = 3,
  FORMAT_CRYPT = 4,
  FORMAT_VLDL = 8, /* recognised only */
  FORMAT_SSHA = 9,
  FORMAT_QVEIL = 128,
  FORMAT_AES256 = 133,
  FORMAT_AES192 = 134,
  FORMAT_AES128 = 135
} PasswordFormat;

/* The tags, each without a terminator; they lie back to back in this order, followed by a single NUL. */
LDAPPW_DATA char SHA_BRACED[5];
LDAPPW_DATA char SSHA_BRACED[6];
LDAPPW_DATA char MD5_BRACED[5];
LDAPPW_DATA char crypt_BRACED[7];
LDAPPW_DATA char qVEIL_BRACED[7];
LDAPPW_DATA char AES128_BRACED[8];
LDAPPW_DATA char AES192_BRACED[8];
LDAPPW_DATA char AES256_BRACED[8];
LDAPPW_DATA char VLDL_BRACED[6];

/* ---- Schemes ---- */

/*
 * check_format returns the scheme code of a value.
 *
 *   value   in   length bytes, of which the first 8 and the last are read; no terminator is needed
 *   length  in   bytes
 *
 * It never fails: what it cannot classify is FORMAT_NONE. A tag needs at least one byte after it, except "{MD5}". An
 * untagged value of 8 bytes or more wrapped in '>' and '<' is FORMAT_QVEIL. Allocates nothing. Traced, with the code as
 * result.
 */
LDAPPW_API int check_format(const char* value, unsigned int length) LDAPPW_NOEXCEPT;

/*
 * formatted_password_length returns the number of characters that format_password writes, tag included.
 *
 *   scheme       in   a scheme code
 *   clearLength  in   bytes of clear text; a negative number goes through the same arithmetic and may give any number
 *
 * Returns -1 for a scheme that cannot be made or a value too long for an int. For FORMAT_MD5 it is 21, the least size
 * that format_password accepts, although the value has 29 characters. Not traced.
 */
LDAPPW_API int formatted_password_length(int scheme, int clearLength) LDAPPW_NOEXCEPT;

/*
 * format_password writes the stored value of a clear password.
 *
 *   scheme       in   a scheme code; FORMAT_AES256 without keyData becomes FORMAT_QVEIL in silence
 *   salt         in   FORMAT_CRYPT only: its first two characters salt the crypt (see generate_crypt_salt)
 *   keyData      in   the AES schemes: the key and salt; g_CipherName must have been set
 *   clear        in   clearLength bytes, of which nothing behind a first NUL is read by the one-way schemes and
 *                     FORMAT_QVEIL; must not be the same buffer as out
 *   clearLength  in   bytes
 *   out          out  outSize bytes, cleared first; a NUL follows the value where there is room
 *   outSize      in   bytes
 *
 *   scheme          what counts of clear                         least outSize
 *   FORMAT_NONE     all bytes                                    clearLength
 *   FORMAT_SHA      all bytes; those behind a NUL count as NUL   33
 *   FORMAT_MD5      up to the first NUL                          21, but 29 characters are written: give 30 or more
 *   FORMAT_CRYPT    the first 8 bytes, up to a NUL               20
 *   FORMAT_SSHA     up to the first NUL                          62
 *   FORMAT_QVEIL    the first 46 bytes, up to a NUL              171
 *   the AES ones    all bytes                                    formatted_password_length
 *
 * A clear text that begins with "{SHA}" is a special case of FORMAT_SHA: of 33 bytes it is a value in its final form
 * from a supplier, and 0 is returned; of any other length the 20 bytes after the tag are taken as the digest itself.
 *
 * Returns the length of the value, or 0 when nothing was formatted; out then holds zeros, or the tag alone. Traced.
 */
LDAPPW_API int format_password(int scheme, char* salt, AesKeyData* keyData, const char* clear, int clearLength,
                               char* out, int outSize) LDAPPW_NOEXCEPT;

/*
 * verify_password checks whether a presented password matches a stored value. Either may carry a tag.
 *
 *   presented         in   presentedLength bytes; no terminator is needed
 *   presentedLength   in   bytes
 *   stored            in   storedLength bytes; no terminator is needed
 *   storedLength      in   bytes
 *   presentedIsClear  in   not 0: presented is clear text, whatever it begins with
 *   keyData           in   of the AES schemes
 *
 * Two clear texts, two masked ones, and two values of one scheme other than {SHA} are compared over their first 46
 * bytes. An AES value of a password of more than 751 bytes matches none: compare with unformat_password's result.
 *
 * Returns 0 for a match. Anything else is no match: 99 when nothing could be compared, LDAPPW_INVALID_CREDENTIALS or
 * another code for {SSHA}, the difference of the tags, or -1 or 1 from the comparison of bytes. The time does not
 * depend on where the first difference is. Traced.
 */
LDAPPW_API int verify_password(const char* presented, int presentedLength, const char* stored, int storedLength,
                               int presentedIsClear, AesKeyData* keyData) LDAPPW_NOEXCEPT;

/*
 * unformat_password turns a {qVEIL} or AES value back into clear text.
 *
 *   value        in   a NUL-terminated value
 *   clear        out  a new NUL-terminated text: released with _morva_utils_decode_buffer_free
 *   keyData      in   of the AES schemes
 *   clearLength  out  bytes of the clear text; may be null
 *
 * Returns 1 for success and 0 for failure. Traced.
 */
LDAPPW_API int unformat_password(const char* value, char** clear, AesKeyData* keyData,
                                 int* clearLength) LDAPPW_NOEXCEPT;

/*
 * morva_decodePW is the server's entry for reading clear text out of a value.
 *
 *   clear    out  always set: as from unformat_password for a value of a reversible scheme; any other value as it is,
 *                 or unmasked when it is wrapped in ">" and "<"; null after a failure
 *   value    in   a NUL-terminated value
 *   keyData  in   of the AES schemes
 *
 * Returns 0; 1 for a null argument; LDAPPW_OTHER for a value that cannot be reversed; LDAPPW_NO_MEMORY when nothing was
 * produced. Not traced.
 */
LDAPPW_API int morva_decodePW(char** clear, const char* value, AesKeyData* keyData) LDAPPW_NOEXCEPT;

/* ---- Unix crypt: DES (FIPS 46-3) applied 25 times under a salted expansion ---- */

/* The state of the reentrant forms. Each byte of the first three arrays holds one bit. */
typedef struct ldappw_crypt_data {
  char E[48];      /* the expansion in use, as bit numbers from 1, perturbed by the salt */
  char KS[16][48]; /* the round keys */
  char block[66];  /* 64 bits, and two zeros that pad the output to 11 times 6 bits */
  char iobuf[16];  /* 2 salt characters, 11 hash characters, NUL */
} ldappw_crypt_data;

/*
 * _crypt_r hashes the first 8 characters of key (7 bits each) with the two characters of salt and returns state's
 * iobuf, 13 characters and a NUL; null for a null argument. Any salt byte is taken; of a salt of one character the
 * output shows that one twice. Allocates nothing. __crypt_std_r is the public form.
 */
LDAPPW_API char* _crypt_r(char const* key, char const* salt, ldappw_crypt_data* state) LDAPPW_NOEXCEPT;
LDAPPW_API char* __crypt_std_r(char const* key, char const* salt, ldappw_crypt_data* state) LDAPPW_NOEXCEPT;

/* Builds the round keys and the unsalted expansion from 64 bytes of one bit each. -1 for a null argument, else 0. */
LDAPPW_API int _setkey_r(char const* key, ldappw_crypt_data* state) LDAPPW_NOEXCEPT;

/* Enciphers 64 bytes of one bit each in place. -1 for a null argument or when decrypt is not 0 (deciphering is refused
 * and the block left alone), else 0. */
LDAPPW_API int _encrypt_r(char* block, int decrypt, ldappw_crypt_data* state) LDAPPW_NOEXCEPT;

/* The same on one process-wide state: not from two threads at once. */
LDAPPW_API char* _crypt(char const* key, char const* salt) LDAPPW_NOEXCEPT;
LDAPPW_API char* __crypt_std(char const* key, char const* salt) LDAPPW_NOEXCEPT;
LDAPPW_API int _setkey(char const* key) LDAPPW_NOEXCEPT;
LDAPPW_API int _encrypt(char* block, int decrypt) LDAPPW_NOEXCEPT;

/* The public forms, which always return 0. System headers declare functions of these names with another result, so
 * sources know them as ldappw_...; they are exported as setkey, setkey_r, encrypt and encrypt_r. */
LDAPPW_API int ldappw_setkey_r(char const* key, ldappw_crypt_data* state) LDAPPW_NOEXCEPT LDAPPW_SYMBOL("setkey_r");
LDAPPW_API int ldappw_encrypt_r(char* block, int decrypt, ldappw_crypt_data* state) LDAPPW_NOEXCEPT
    LDAPPW_SYMBOL("encrypt_r");
LDAPPW_API int ldappw_setkey(char const* key) LDAPPW_NOEXCEPT LDAPPW_SYMBOL("setkey");
LDAPPW_API int ldappw_encrypt(char* block, int decrypt) LDAPPW_NOEXCEPT LDAPPW_SYMBOL("encrypt");

/* Writes two salt characters and a NUL. Drawn from the clock and the process number: two calls within one second give
 * the same salt. */
LDAPPW_API void generate_crypt_salt(char* out) LDAPPW_NOEXCEPT;

/* ---- Digests ---- */

/* The 20 bytes of a SHA-1 digest in published order. */
typedef struct sha_digest {
  uint32_t word[5];
} sha_digest;

/* SHA-1 (FIPS 180-1) of length bytes. Needs no provider and allocates nothing. */
LDAPPW_API void SHA(char* data, unsigned long length, sha_digest* digest) LDAPPW_NOEXCEPT;

/*
 * saltedHashEncrypt makes base64(digest(clear + salt) + salt) with a random salt as long as the digest;
 * unsaltedHashEncrypt base64(digest(clear)).
 *
 *   clear       in   a NUL-terminated text
 *   out         out  a new NUL-terminated text, without a tag
 *   digestName  in   a name that the provider knows
 *
 * Return 0; 1 for a null argument or a failed provider or base64 step; LDAPPW_NO_MEMORY; or the code of initQelCrypto
 * or initQelDigest. *out is untouched when the arguments are refused or initQelCrypto fails. Traced.
 */
LDAPPW_API int saltedHashEncrypt(const char* clear, char** out, const char* digestName) LDAPPW_NOEXCEPT;
LDAPPW_API int unsaltedHashEncrypt(const char* digestName, const char* clear, char** out) LDAPPW_NOEXCEPT;

/*
 * saltedHashVerify checks clear against such a salted text: the first bytes, as many as the digest has, are the digest,
 * all others the salt, whatever their number.
 *
 * Returns 0 for a match and LDAPPW_INVALID_CREDENTIALS for none; 1 also for a text that is not base64 or holds less
 * than a digest; otherwise the codes above. Traced.
 */
LDAPPW_API int saltedHashVerify(const char* clear, const char* stored, const char* digestName) LDAPPW_NOEXCEPT;

#ifdef __cplusplus
}
#endif

#endif
