// SPDX-License-Identifier: Apache-2.0
// Documented in passwords.h.
#include "passwords.h"

#include <strings.h>
#include <sys/random.h>

#include <climits>
#include <cstring>

#include "secret_bytes.h"

namespace plugin {
namespace {

constexpr size_t kLongest = INT_MAX / 4;  // of what the library is given: its lengths are int
constexpr size_t kLeastRoom = 192;        // more than any value of fixed length

bool holdsNul(std::string_view text) noexcept {
  return !text.empty() && std::memchr(text.data(), '\0', text.size()) != nullptr;
}

// Why the scheme cannot take the clear text as it is, or null.
const char* clearProblem(const Scheme& scheme, AesKeyData* keys, std::string_view clear) noexcept {
  if (scheme.matches == nullptr) return "values of this scheme cannot be made";
  if (scheme.needsKeys() && keys == nullptr) return "the server has no keys for this scheme";
  if (clear.size() > kLongest) return "the password is too long";
  if (!scheme.holdsNul && holdsNul(clear)) return "this scheme takes no password with a NUL byte";
  const size_t tagBytes = std::strlen(scheme.tag);
  if (scheme.readsTag && clear.size() >= tagBytes && strncasecmp(clear.data(), scheme.tag, tagBytes) == 0) {
    return "this scheme takes no password that begins with its own tag";
  }
  return nullptr;
}

// Two calls of the library's own maker within one second give the same salt.
bool drawSalt(char (&salt)[3]) noexcept {
  static constexpr char kCharacters[] = "./0123456789ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz";
  unsigned char random[2];
  if (getrandom(random, sizeof random, 0) != static_cast<ssize_t>(sizeof random)) return false;
  for (size_t i = 0; i < sizeof random; ++i) salt[i] = kCharacters[random[i] & 63U];
  salt[2] = '\0';
  return true;
}

}  // namespace

bool matches(const Scheme& scheme, const Check& check) noexcept {
  if (clearProblem(scheme, check.keys, check.presented) != nullptr) return false;
  // The library takes a tag with nothing behind it for a clear text.
  if (check.payload.empty() || check.payload.size() > kLongest || holdsNul(check.payload)) return false;
  return scheme.matches(scheme, check);
}

char* makeValue(const Library& library, const Scheme& scheme, AesKeyData* keys, std::string_view clear,
                void* (*allocate)(size_t), const char*& problem) noexcept {
  problem = clearProblem(scheme, keys, clear);
  if (problem == nullptr && scheme.holdsBytes != 0 && clear.size() > scheme.holdsBytes) {
    problem = "the password is longer than this scheme holds";
  }
  if (problem != nullptr) return nullptr;
  problem = "the value could not be made";
  char salt[3] = "";
  const int length = library.formattedPasswordLength(scheme.code, static_cast<int>(clear.size()));
  if (length < 0 || !drawSalt(salt)) return nullptr;
  SecretBytes made(static_cast<size_t>(length) + kLeastRoom);
  if (!made) return nullptr;
  const int written = library.formatPassword(scheme.code, salt, keys, clear.data(), static_cast<int>(clear.size()),
                                             made.data(), static_cast<int>(made.size()));
  // Without keys the library makes values of another scheme.
  if (written <= 0 || library.checkFormat(made.data(), static_cast<unsigned>(written)) != scheme.code) return nullptr;
  const auto bytes = static_cast<size_t>(written) + 1;
  auto* value = static_cast<char*>(allocate(bytes));
  if (value == nullptr) return nullptr;
  std::memcpy(value, made.data(), bytes);
  problem = nullptr;
  return value;
}

}  // namespace plugin
