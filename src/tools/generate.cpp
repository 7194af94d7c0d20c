// SPDX-License-Identifier: Apache-2.0
#include "generate.h"

#include <errno.h>
#include <sys/random.h>

#include <string_view>

#include "failure.h"

namespace tool {
namespace {

constexpr std::string_view kCharacters = "abcdefghijkmnopqrstuvwxyzABCDEFGHJKLMNPQRSTUVWXYZ23456789";

}  // namespace

Secret generatePassword(std::size_t characters) {
  Secret password;
  Secret random;
  random.resize(1);
  while (password.size() < characters) {
    const ssize_t count = getrandom(random.data(), 1, 0);
    if (count != 1 && errno == EINTR) continue;
    if (count != 1) throw Failure(kInternal, "there are no random bytes for a password");
    const std::size_t place = static_cast<unsigned char>(*random.data()) & 63U;
    if (place < kCharacters.size()) password.append(kCharacters[place]);  // others would make some more likely
  }
  return password;
}

}  // namespace tool
