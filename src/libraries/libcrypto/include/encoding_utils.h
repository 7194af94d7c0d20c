/* SPDX-License-Identifier: Apache-2.0 */
/*
 * ldappw encoding utilities: base64 over any alphabet, DES, the masked encoding, run-time loading of libraries, the
 * library path and the terminal password prompt.
 *
 * Rules of all ldappw headers:
 *  1. An operation that returns a result code returns one of the LDAPPW_ codes below; an operation with another
 *     convention says so.
 *  2. A null pointer where a value is needed is refused with a code or a null result; nothing is read through it.
 *  3. What an operation allocates belongs to the caller, who releases it with free() unless a matching _free function
 *     is named. A null pointer may always be released.
 *  4. An out-argument must point to null on entry. Unless stated otherwise a failure releases what it holds and sets it
 *     to null; a success stores the new pointer and leaves the old value to the caller.
 *  5. Lengths are in bytes. Nothing is read beyond a length or a terminator that the caller gave; where a fixed number
 *     of bytes is to be taken, what is not there counts as NUL.
 *  6. Operations may be called from many threads at once unless stated otherwise, from a process that forks at any
 *     moment, in its child, and from a trace sink. No exception leaves the library, and no cancellation is acted on
 *     inside it.
 *  7. Buffers of the library's own that held clear text, keys or key schedules are wiped before they are released; what
 *     was handed to the caller is the caller's to wipe. A program that handles passwords is best linked with -z now:
 *     at the first call of each function a lazily bound one saves registers on the stack, with what is in them.
 *  8. Exported variables are the library's own, never the host's of the same name. Programs reach them through these
 *     headers when they are compiled position-independent (-fPIE or -fPIC, the default of most systems).
 */
#ifndef LDAPPW_ENCODING_UTILS_H
#define LDAPPW_ENCODING_UTILS_H

#include <stddef.h>
#include <stdint.h>

/* The version that these headers belong to, as a number (10000 * major + 100 * minor + patch) and as a text. */
#define LDAPPW_VERSION 10000
#define LDAPPW_VERSION_TEXT "1.0.0"

/* A program that refers to a variable directly gets a copy of its own, and the library would never see it change. A
 * weak reference goes through the global offset table instead, in code compiled position-independent. */
#ifdef LDAPPW_BUILDING
#define LDAPPW_DATA extern __attribute__((visibility("default")))
#else
#define LDAPPW_DATA extern __attribute__((visibility("default"), weak))
#endif
#define LDAPPW_API __attribute__((visibility("default")))
/* The exported name of an operation whose C name would meet another declaration of a system header. */
#define LDAPPW_SYMBOL(name) __asm__(name)

#ifdef __cplusplus
#define LDAPPW_NOEXCEPT noexcept
extern "C" {
#else
#define LDAPPW_NOEXCEPT
#endif

/* Result codes: those of LDAP (RFC 4511), and LDAPPW_NO_MEMORY of the LDAP client interface. */
enum {
  LDAPPW_SUCCESS = 0,
  LDAPPW_OPERATIONS_ERROR = 1,      /* null argument, unknown type, failed file or provider operation */
  LDAPPW_CONSTRAINT_VIOLATION = 19, /* unacceptable seed or salt text */
  LDAPPW_INVALID_CREDENTIALS = 49,  /* the password does not match */
  LDAPPW_OTHER = 80,                /* output overflow, missing handle, a value that cannot be reversed */
  LDAPPW_NOT_SUPPORTED = 89,        /* cipher selector, scatter width, a masked record that does not hold together */
  LDAPPW_NO_MEMORY = 90
};

/* ---- Base64 (RFC 4648, section 4) over the standard or any other alphabet ----
 *
 * An alphabet is a text whose first 64 characters stand for the values 0 to 63. The pad character is always "=". Text
 * has no line breaks.
 */

/* The standard alphabet, 64 characters. The base64 operations read it through this pointer at call time; it is not to
 * be changed while other threads call them. */
LDAPPW_DATA const char* pBase64;

/* The standard alphabet followed by "=". Nothing in the library reads it. */
LDAPPW_DATA const char* pBase64Find;

/*
 * binaryBlobToString encodes data over an alphabet; binaryBlobToBase64 does so over *pBase64.
 *
 *   data      in   length bytes
 *   length    in   bytes; 0 or less gives an empty text
 *   alphabet  in   64 characters or more
 *
 * Returns a new text of 4 * ceil(length / 3) characters and a NUL; null for a null data with a positive length, a null
 * or short alphabet, or when memory runs out.
 */
LDAPPW_API char* binaryBlobToString(const unsigned char* data, int length, const char* alphabet) LDAPPW_NOEXCEPT;
LDAPPW_API char* binaryBlobToBase64(const unsigned char* data, int length) LDAPPW_NOEXCEPT;

/*
 * stringToBinaryBlob decodes text over an alphabet; base64ToBinaryBlob does so over *pBase64.
 *
 *   text       in   a NUL-terminated text
 *   outLength  out  the number of decoded bytes; untouched after a failure
 *   alphabet   in   a NUL-terminated text
 *
 * Nothing is rejected. Each group of four characters gives 3 bytes without "=", 2 with the first "=" in the fourth
 * place, 1 with it in the second or third, none with it in the first; missing characters of a short last group count as
 * "=". Groups lie three bytes apart whatever they give: gaps are zeros. A character of neither the alphabet nor "="
 * stands for the value 65, whose bits spill over as they fall.
 *
 * Returns a new buffer that ends in a NUL byte; null for a null argument, a text too long for *outLength, or when
 * memory runs out.
 */
LDAPPW_API unsigned char* stringToBinaryBlob(const char* text, unsigned int* outLength,
                                             const char* alphabet) LDAPPW_NOEXCEPT;
LDAPPW_API unsigned char* base64ToBinaryBlob(const char* text, unsigned int* outLength) LDAPPW_NOEXCEPT;

/*
 * compactToOnlyString returns a new text with only those characters of text that are in the alphabet;
 * compactToOnlyBase64 does so with *pBase64 (so "=" goes as well). When there is none, or when memory runs out, a line
 * on standard output says so and the result is null.
 */
LDAPPW_API char* compactToOnlyString(const char* text, const char* alphabet) LDAPPW_NOEXCEPT;
LDAPPW_API char* compactToOnlyBase64(const char* text) LDAPPW_NOEXCEPT;

/* ---- DES (FIPS 46-3) ----
 *
 * A key schedule is 32 words: one pair a round, in the order of use, so that a deciphering schedule holds the round
 * keys backwards. Word 0 of a pair holds the 6-bit groups 1, 3, 5 and 7 of the round key, one a byte, the first in the
 * top byte; word 1 holds groups 2, 4, 6 and 8.
 */

/* Non-zero makes the schedule builders multiply each word by 4, for a cipher that indexes by byte offsets; des itself
 * is not such a cipher. 0 at start; not to be changed while other threads build schedules. */
LDAPPW_DATA int Asmversion;

/* Enciphers or deciphers, as the schedule was built, the 8-byte block in place. */
LDAPPW_API void des(const uint32_t* schedule, unsigned char* block) LDAPPW_NOEXCEPT;

/* Builds the schedule of the 8-byte key, whose parity bits (the lowest of each byte) are ignored; decrypt 0 is for
 * enciphering. deskey56 is the same operation. */
LDAPPW_API void deskey(uint32_t* schedule, const unsigned char* key, int decrypt) LDAPPW_NOEXCEPT;
LDAPPW_API void deskey56(uint32_t* schedule, const unsigned char* key, int decrypt) LDAPPW_NOEXCEPT;

/* The reduced-key form: 40 selected key bits, and only the first 32 of each round key's 48 bits. */
LDAPPW_API void deskey40(uint32_t* schedule, const unsigned char* key, int decrypt) LDAPPW_NOEXCEPT;

/* Builds the three schedules (96 words) of triple DES (FIPS 46-3, TDEA keying option 1) from the 24-byte key; applied
 * in order they encipher, decipher and encipher, or undo that. */
LDAPPW_API void des3key(uint32_t* schedules, const unsigned char* key, int decrypt) LDAPPW_NOEXCEPT;

/* The 58-character key text of simpleCrypt. */
LDAPPW_DATA const char* pEncrypt;

/* Returns length + 1 new bytes: data XORed with the key text from its fifth character on, round and round, then a NUL.
 * Its own inverse. A length of 0 or less gives an empty text. Null when memory runs out. */
LDAPPW_API char* simpleCrypt(const char* data, int length) LDAPPW_NOEXCEPT;

/* ---- The masked encoding: the payload of {qVEIL} values ----
 *
 * A text ">1" + alphabet identifier + masked record + "<". Reversible by whoever has this library: it hides, it does
 * not protect. Background and keys are drawn from the clock, so calls within one second share them.
 */

/* The cipher that masks: 11 DES (at start), 7 DES whose reading side uses deskey40, 1 simpleCrypt; any other is not
 * supported. Not to be changed while other threads mask. */
LDAPPW_DATA int encryptionType;

/*
 * Mask text with its terminating NUL (_morva_utils_encode_buffer) or length bytes (_morva_utils_encode_binary) into a
 * new text. 48 bytes or fewer give 164 characters.
 *
 * Return 0; 1 for a null argument; LDAPPW_OTHER for a negative length or one above 16777215, the largest that a record
 * can state; LDAPPW_NOT_SUPPORTED for an encryptionType that is not supported; LDAPPW_NO_MEMORY. *out is untouched
 * after a failure.
 */
LDAPPW_API int _morva_utils_encode_buffer(const char* text, char** out) LDAPPW_NOEXCEPT;
LDAPPW_API int _morva_utils_encode_binary(const unsigned char* data, int length, char** out) LDAPPW_NOEXCEPT;

/*
 * Undo the masking. A text that is not wrapped in ">" and "<" is clear and comes back as a copy, its terminating NUL
 * counted in *outLength; ">0" wraps simpleCrypt output in base64, any second character but "0" and "1" wraps plain
 * base64. In each wrapped form the final "<" of the caller's text is overwritten with a NUL, and the result ends in a
 * NUL that *outLength does not count. No checksum guards a masked text: a damaged one gives other bytes, or
 * LDAPPW_NOT_SUPPORTED.
 *
 * Return 0; 1 for a null argument; LDAPPW_NOT_SUPPORTED for a record that does not hold together; LDAPPW_NO_MEMORY;
 * LDAPPW_OTHER for a text too long for *outLength. An unknown alphabet identifier gives 0 and leaves the result null.
 */
LDAPPW_API int _morva_utils_decode_buffer(char* text, char** out) LDAPPW_NOEXCEPT;
LDAPPW_API int _morva_utils_decode_binary(char* text, unsigned char** out, int* outLength) LDAPPW_NOEXCEPT;

/* Wipe a result up to its first NUL, release it and set the caller's pointer to null. A null pointer, or a pointer to
 * null, does nothing. Binary data behind a zero byte is the caller's to wipe. */
LDAPPW_API void _morva_utils_encode_buffer_free(char** result) LDAPPW_NOEXCEPT;
LDAPPW_API void _morva_utils_encode_binary_free(char** result) LDAPPW_NOEXCEPT;
LDAPPW_API void _morva_utils_decode_buffer_free(char** result) LDAPPW_NOEXCEPT;
LDAPPW_API void _morva_utils_decode_binary_free(char** result) LDAPPW_NOEXCEPT;

/* Returns the size of a buffer, terminator included, that holds the masked form of length bytes, also for lengths that
 * cannot be masked; 0 for a size that no int can state. */
LDAPPW_API int _morva_utils_getEncodedSize(int length) LDAPPW_NOEXCEPT;

/* ---- Run-time loading and the library path; failures are reported by the server's debug printer alone ---- */

/* The dlopen flags of ldapLoadLib when it is given 0; RTLD_NOW | RTLD_GLOBAL at start. */
LDAPPW_DATA int defFlags;

/* Opens the library with dlopen and returns a new cell that holds its handle, or null; the caller may ask dlerror for
 * the reason unless debugging is on. ldapUnloadLib releases the cell. */
LDAPPW_API void** ldapLoadLib(const char* fileName, int flags) LDAPPW_NOEXCEPT;

/* Closes the library and releases the cell. Returns 0, or LDAPPW_OTHER for a null cell. */
LDAPPW_API int ldapUnloadLib(void** handle) LDAPPW_NOEXCEPT;

/* Returns the address of the symbol in the cell's library, or null, with the reason in dlerror as above. */
LDAPPW_API void* ldapGetSymAddress(void** handle, const char* symbol) LDAPPW_NOEXCEPT;

/* Appends "/usr/lib" to LD_LIBRARY_PATH unless it is an element of it already. Returns 0, or LDAPPW_NO_MEMORY or -1
 * with the path as it was when memory runs out. With its name a path has at most 2048 characters: a longer one is cut.
 * The text outlives the library. For start-up: one thread only. */
LDAPPW_API int setDefLibpath(void) LDAPPW_NOEXCEPT;

/* In a text of two-character SSL cipher codes whose first "0A" follows its first "09", puts another "0A" before that
 * "09". The buffer needs room for two more characters; a result is cut at 64. */
LDAPPW_API void fixupCipherSpecs(char* specs) LDAPPW_NOEXCEPT;

/* ---- The terminal ---- */

/*
 * getPassword prompts "Enter password ==> " on standard output and reads one line of at most 254 characters from the
 * descriptor of standard input, without echo where that is a terminal. Nothing of it stays in a stdio buffer: what the
 * caller's stdio has read ahead is not seen, and nothing behind the line is read. A program that reads from stdin
 * before calls setvbuf(stdin, NULL, _IONBF, 0) first, so that nothing is read ahead.
 *
 * Returns the line without its last character, whatever that is, as a new text, empty at the end of input; null when
 * memory runs out. When echo cannot be switched off the process ends with errno as its exit status. SIGINT, SIGTERM,
 * SIGHUP and SIGQUIT bring the terminal back before they act as they would without the prompt; where the process goes
 * on, so does the prompt. Changes the terminal and signal actions while it runs: one call at a time.
 */
LDAPPW_API char* getPassword(void) LDAPPW_NOEXCEPT;

#ifdef __cplusplus
} /* extern "C" */

/* For callers that hold the result as _morva_utils_decode_binary gave it. */
inline void _morva_utils_decode_binary_free(unsigned char** result) noexcept {
  _morva_utils_decode_binary_free(reinterpret_cast<char**>(result));
}
#endif

#endif
