// SPDX-License-Identifier: Apache-2.0
// The library by handle. Servers open plug-ins with global scope, and the library exports names such as encrypt that
// must not meet theirs; so nothing links it, and it is opened with a scope of its own.
#pragma once

#include "aes_keys.h"
#include "crypto_provider.h"
#include "encoding_utils.h"
#include "password_schemes.h"

namespace plugin {

struct Library {
  decltype(&check_format) checkFormat;
  decltype(&formatted_password_length) formattedPasswordLength;
  decltype(&format_password) formatPassword;
  decltype(&verify_password) verifyPassword;
  int (*unmask)(char* text, unsigned char** out, int* outLength);  // _morva_utils_decode_binary, which is overloaded
  decltype(&initAesKeyData) makeKeys;
  decltype(&freeAesKeyData) freeKeys;
  decltype(&setCipherNameGlobal) nameCiphers;
  decltype(&validateCryptoString) validateText;
  decltype(&initQelCrypto) startProvider;
};

// Opens the library. It stays open until the process ends. False, with a text of the loader, when it cannot be used.
bool openLibrary(Library& library, const char*& problem) noexcept;

}  // namespace plugin
