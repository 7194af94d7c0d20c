// SPDX-License-Identifier: Apache-2.0
#include "base/generate.h"

#include <string_view>

#include "base/random.h"

namespace tool {
namespace {

constexpr std::string_view kCharacters = "abcdefghijkmnopqrstuvwxyzABCDEFGHJKLMNPQRSTUVWXYZ23456789";

}  // namespace

Secret generatePassword(size_t characters) {
  Secret password;
  Secret random;
  random.resize(1);
  while (password.size() < characters) {
    drawRandom(random.data(), 1);
    const size_t place = static_cast<unsigned char>(*random.data()) & 63U;
    if (place < kCharacters.size()) password.append(kCharacters[place]);  // others would make some more likely
  }
  return password;
}

}  // namespace tool
