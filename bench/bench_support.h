// SPDX-License-Identifier: Apache-2.0
// What the benchmarks share: fixed passwords and a key record.
#pragma once

#include <cstdint>
#include <cstring>
#include <string>

#include "password_schemes.h"

namespace bench {

inline const std::string kPassword = "correct horse 42";
inline const std::string kWrong = "correct horse 43";

// A record with keys 0, 1, 2 ...; lives as long as the process.
inline AesKeyData* keys() {
  static AesKeyData* const record = [] {
    AesKeyData* made = nullptr;
    initAesKeyData(&made);
    for (SecBuffer& key : made->aesKeys) {
      for (uint32_t i = 0; i < key.length; ++i) key.data[i] = static_cast<unsigned char>(i);
    }
    setCipherNameGlobal();
    return made;
  }();
  return record;
}

inline std::string formatted(int scheme, const std::string& password) {
  char salt[] = "ab";
  char out[1024];
  const int length = format_password(scheme, salt, keys(), password.data(), static_cast<int>(password.size()), out,
                                     static_cast<int>(sizeof out));
  return std::string(out, static_cast<size_t>(length));
}

inline int verified(const std::string& password, const std::string& stored) {
  return verify_password(password.data(), static_cast<int>(password.size()), stored.data(),
                         static_cast<int>(stored.size()), 1, keys());
}

}  // namespace bench
