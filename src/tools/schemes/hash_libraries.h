// SPDX-License-Identifier: Apache-2.0
// The libraries that compute foreign schemes: OpenSSL's digests and key derivation, crypt(3), and Argon2. Each is
// opened at the first value that needs it, so that nothing else pays for its start.
#pragma once

#include <argon2.h>
#include <crypt.h>
#include <openssl/evp.h>
#include <openssl/hmac.h>

namespace tool {

struct DigestLibrary {
  decltype(&EVP_get_digestbyname) byName;
  decltype(&EVP_Digest) digest;
  decltype(&HMAC) hmac;
  decltype(&PKCS5_PBKDF2_HMAC) pbkdf2;
};

struct CryptLibrary {
  decltype(&crypt_rn) hash;
  decltype(&crypt_gensalt_rn) makeSetting;
};

struct Argon2Library {
  decltype(&argon2_hash) hash;
  decltype(&argon2_verify) verify;
};

// Each throws Failure with kInternal when the library cannot be opened. They may be called from many threads.
const DigestLibrary& digestLibrary();
const CryptLibrary& cryptLibrary();
const Argon2Library& argon2Library();

}  // namespace tool
