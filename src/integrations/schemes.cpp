// SPDX-License-Identifier: Apache-2.0
// The scheme table, and one check for each kind of scheme.
#include "schemes.h"

#include <strings.h>

#include <cstring>

#include "secret_bytes.h"

namespace plugin {
namespace {

constexpr size_t kMaskedBytes = 46;               // of a password that {qVEIL} holds
constexpr size_t kMaskedPayload = 164;            // characters of a {qVEIL} payload
constexpr size_t kMaskedHead = sizeof ">1?" - 1;  // before the record: the form and the alphabet

bool isAlphabetic(char c) noexcept {
  return (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z') || (c >= '0' && c <= '9') || c == '+' || c == '/';
}

// The decoder takes a text that is not wrapped for clear text, so that a damaged payload would be its own password.
bool isMasked(std::string_view payload) noexcept {
  if (payload.size() != kMaskedPayload || payload[0] != '>' || payload[1] != '1' || payload.back() != '<') return false;
  for (size_t i = kMaskedHead; i + 1 < payload.size(); ++i) {
    if (!isAlphabetic(payload[i])) return false;
  }
  return true;
}

// Masked values of longer passwords were cut when they were made, so no more of the presented one counts.
bool matchesMasked(const Scheme& scheme, const Check& check) noexcept {
  if (!isMasked(check.payload)) return false;
  SecretBytes text(check.payload.size());
  if (!text) return false;
  std::memcpy(text.data(), check.payload.data(), check.payload.size());  // the decoder writes to its text
  unsigned char* decoded = nullptr;
  int decodedBytes = 0;
  if (check.library.unmask(text.data(), &decoded, &decodedBytes) != LDAPPW_SUCCESS || decoded == nullptr) return false;
  const SecretBytes clear(reinterpret_cast<char*>(decoded), static_cast<size_t>(decodedBytes));
  // The terminator was masked with the text: one that is elsewhere shows damage.
  const size_t clearBytes = strnlen(clear.data(), clear.size());
  const size_t counted = check.presented.size() < scheme.holdsBytes ? check.presented.size() : scheme.holdsBytes;
  return clearBytes <= scheme.holdsBytes && clearBytes + 1 == clear.size() &&
         equalBytes({clear.data(), clearBytes}, {check.presented.data(), counted});
}

// By making the value again: it has one form under one key, of any length.
bool matchesEnciphered(const Scheme& scheme, const Check& check) noexcept {
  const int clearBytes = static_cast<int>(check.presented.size());
  const int length = check.library.formattedPasswordLength(scheme.code, clearBytes);
  const std::string_view tag(scheme.tag);
  if (length < 0 || static_cast<size_t>(length) != tag.size() + check.payload.size()) return false;
  SecretBytes made(static_cast<size_t>(length));
  if (!made || check.library.formatPassword(scheme.code, nullptr, check.keys, check.presented.data(), clearBytes,
                                            made.data(), length + 1) != length) {
    return false;
  }
  return equalBytes({made.data() + tag.size(), check.payload.size()}, check.payload);
}

bool matchesDigest(const Scheme& scheme, const Check& check) noexcept {
  const std::string_view tag(scheme.tag);
  SecretBytes value(tag.size() + check.payload.size());
  if (!value) return false;
  std::memcpy(value.data(), tag.data(), tag.size());
  std::memcpy(value.data() + tag.size(), check.payload.data(), check.payload.size());
  return check.library.verifyPassword(check.presented.data(), static_cast<int>(check.presented.size()), value.data(),
                                      static_cast<int>(value.size()), 1, nullptr) == 0;
}

// The library takes any byte for salt, and some outside the alphabet mean the same as one inside.
bool matchesCrypt(const Scheme& scheme, const Check& check) noexcept {
  for (const char c : check.payload) {
    if (c != '.' && (c == '+' || !isAlphabetic(c))) return false;
  }
  return matchesDigest(scheme, check);
}

// The library reads a salted text without its padding as well: one that was cut short.
bool matchesSalted(const Scheme& scheme, const Check& check) noexcept {
  return check.payload.size() % 4 == 0 && matchesDigest(scheme, check);
}

bool sameText(std::string_view a, std::string_view b) noexcept {
  return a.size() == b.size() && strncasecmp(a.data(), b.data(), a.size()) == 0;
}

}  // namespace

// clang-format off
const Scheme kSchemes[kSchemeCount] = {
    // name     tag         code           key lacking holds          NUL    digest  check
    {"qveil",  "{qVEIL}",  FORMAT_QVEIL,  -1, true,  kMaskedBytes, false, false, matchesMasked},
    {"aes128", "{AES128}", FORMAT_AES128,  0, true,  0,            true,  false, matchesEnciphered},
    {"aes192", "{AES192}", FORMAT_AES192,  1, true,  0,            true,  false, matchesEnciphered},
    {"aes256", "{AES256}", FORMAT_AES256,  2, true,  0,            true,  false, matchesEnciphered},
    {"vldl",   "{VLDL}",   FORMAT_VLDL,   -1, true,  0,            false, false, nullptr},
    {"crypt",  "{crypt}",  FORMAT_CRYPT,  -1, false, 8,            false, false, matchesCrypt},
    {"sha",    "{SHA}",    FORMAT_SHA,    -1, false, 0,            false, true,  matchesDigest},
    {"ssha",   "{SSHA}",   FORMAT_SSHA,   -1, false, 0,            false, false, matchesSalted},
    {"md5",    "{MD5}",    FORMAT_MD5,    -1, false, 0,            false, false, matchesDigest},
};
// clang-format on

const Scheme* findScheme(std::string_view nameOrTag) noexcept {
  for (const Scheme& scheme : kSchemes) {
    if (sameText(nameOrTag, scheme.name) || sameText(nameOrTag, scheme.tag)) return &scheme;
  }
  return nullptr;
}

}  // namespace plugin
