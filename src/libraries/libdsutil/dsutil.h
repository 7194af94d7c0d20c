/* SPDX-License-Identifier: Apache-2.0 */
/*
 * The directory server's utility library, as far as password protection calls it: the debug printer, the environment,
 * the install directory and a bounded append. A server that has its own library of this name puts it in place of this.
 *
 * Texts are NUL-terminated. What a function allocates the caller releases with free(). Reading the environment is safe
 * from many threads as long as no thread changes it.
 */
#ifndef DSUTIL_DSUTIL_H
#define DSUTIL_DSUTIL_H

#include <stddef.h>

#include "ldtr.h"

#ifdef __cplusplus
extern "C" {
#endif

/* Writes the class and the printf-style text to standard error when the debug level is not 0. */
LDTR_API void PrintDebug(unsigned debugClass, const char* format, ...) LDTR_PRINTF(2, 3);

/* The debug level: 0 is off. At start it is the number in LDAP_DEBUG, 0 without one. */
LDTR_API int read_ldap_debug(void);
LDTR_API void set_ldap_debug(int level);

/* A copy of the variable's value, or null: not set, no memory, or the process runs with raised privileges. */
LDTR_API char* ldap_getenv(const char* name);

/* Non-zero when the variable is set and not empty, under the same rule. */
LDTR_API int ldap_chkenv(const char* name);

/* Sets the variable to a copy of value; 0 on success. */
LDTR_API int putEnvVar(const char* name, const char* value);

/* The absolute path of the directory that this library was loaded from, without a slash at its end, or null. */
LDTR_API char* getKUBInstallLibPath(void);

/* Appends source to the text in the buffer of size bytes, cutting what does not fit and always terminating, and
 * returns the length that it tried to make: a result of size or more means that the text was cut (BSD strlcat). */
LDTR_API size_t kub_strlcat(char* destination, const char* source, size_t size);

#ifdef __cplusplus
}
#endif

#endif
