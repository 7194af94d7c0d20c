/* SPDX-License-Identifier: Apache-2.0 */
/*
 * The scheme tags of password_schemes.h: nine symbols over one run of bytes, with a single NUL behind the last, so that
 * the run also reads as one text. C++ has no way to declare that, and link-time optimisation moves separate arrays.
 */
#ifdef __CET__
#include <cet.h>
#endif

    .macro tag name, text
    .globl \name
    .type \name, @object
\name:
    .ascii "\text"
    .size \name, . - \name
    .endm

    .data
    tag SHA_BRACED, "{SHA}"
    tag SSHA_BRACED, "{SSHA}"
    tag MD5_BRACED, "{MD5}"
    tag crypt_BRACED, "{crypt}"
    tag qVEIL_BRACED, "{qVEIL}"
    tag AES128_BRACED, "{AES128}"
    tag AES192_BRACED, "{AES192}"
    tag AES256_BRACED, "{AES256}"
    tag VLDL_BRACED, "{VLDL}"
    .byte 0

    .section .note.GNU-stack, "", @progbits
