// SPDX-License-Identifier: Apache-2.0
// Documented in library.h.
#include "library.h"

#include <dlfcn.h>

namespace plugin {
namespace {

constexpr char kFile[] = "libldappw.so.1";

template <typename Function>
bool resolve(void* handle, const char* name, Function& function) noexcept {
  function = reinterpret_cast<Function>(dlsym(handle, name));
  return function != nullptr;
}

}  // namespace

bool openLibrary(Library& library, const char*& problem) noexcept {
  void* handle = dlopen(kFile, RTLD_NOW | RTLD_LOCAL);
  const bool complete = handle != nullptr && resolve(handle, "check_format", library.checkFormat) &&
                        resolve(handle, "formatted_password_length", library.formattedPasswordLength) &&
                        resolve(handle, "format_password", library.formatPassword) &&
                        resolve(handle, "verify_password", library.verifyPassword) &&
                        resolve(handle, "_morva_utils_decode_binary", library.unmask) &&
                        resolve(handle, "initAesKeyData", library.makeKeys) &&
                        resolve(handle, "freeAesKeyData", library.freeKeys) &&
                        resolve(handle, "setCipherNameGlobal", library.nameCiphers) &&
                        resolve(handle, "validateCryptoString", library.validateText) &&
                        resolve(handle, "initQelCrypto", library.startProvider);
  if (!complete) {
    problem = dlerror();
    if (problem == nullptr) problem = kFile;
  }
  return complete;
}

}  // namespace plugin
