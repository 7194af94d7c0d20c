// SPDX-License-Identifier: Apache-2.0
// The system's own Unix crypt as the other opinion.
#pragma once

#include <crypt.h>

#include <string>

namespace test {

inline std::string systemCrypt(const std::string& key, const std::string& salt) {
  crypt_data state{};
  return crypt_r(key.c_str(), salt.c_str(), &state);
}

}  // namespace test
