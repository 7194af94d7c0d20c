// SPDX-License-Identifier: Apache-2.0
#include "foreign_payloads.h"

#include <algorithm>
#include <charconv>
#include <new>
#include <string>

#include "encoding_utils.h"
#include "text.h"

namespace tool {
namespace {

constexpr char kCryptCharacters[] = "./0123456789ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz";
constexpr std::size_t kNone = std::string_view::npos;

bool isHash(std::string_view text) noexcept {
  return !text.empty() && text.find_first_not_of(kCryptCharacters) == kNone;
}

// Cuts off the text before the mark, which goes; all of it when there is no mark.
std::string_view take(std::string_view& text, char mark) noexcept {
  const std::string_view part = text.substr(0, text.find(mark));
  text.remove_prefix(std::min(text.size(), part.size() + 1));
  return part;
}

// "m=4096" with the key "m=".
bool parseSetting(std::string_view text, std::string_view key, std::uint32_t& number) noexcept {
  return text.substr(0, key.size()) == key && parseNumber(text.substr(std::min(key.size(), text.size())), number);
}

}  // namespace

bool parseNumber(std::string_view text, std::uint32_t& number) noexcept {
  const char* end = text.data() + text.size();
  const auto [stopped, error] = std::from_chars(text.data(), end, number);
  return error == std::errc() && stopped == end;
}

bool decodeBase64(std::string_view text, Secret& bytes) {
  bytes.clear();
  while (!text.empty() && text.back() == '=') text.remove_suffix(1);
  Secret usual(text);
  std::replace(usual.data(), usual.data() + usual.size(), '.', '+');
  while (usual.size() % 4 != 0) usual.append('=');
  const long expected = base64Bytes(usual.view());
  if (expected <= 0) return expected == 0;
  unsigned int length = 0;
  unsigned char* decoded = base64ToBinaryBlob(usual.c_str(), &length);
  if (decoded == nullptr) throw std::bad_alloc();
  bytes.append({reinterpret_cast<const char*>(decoded), length});
  explicit_bzero(decoded, length);
  free(decoded);
  return length == static_cast<unsigned long>(expected);
}

bool parsePbkdf2(std::string_view payload, Pbkdf2Parts& parts) {
  const std::string_view iterations = take(payload, '$');
  const std::string_view salt = take(payload, '$');
  return parseNumber(iterations, parts.iterations) && parts.iterations > 0 && decodeBase64(salt, parts.salt) &&
         decodeBase64(payload, parts.hash) && !parts.hash.empty();
}

bool parseArgon2(std::string_view payload, Argon2Parts& parts) {
  take(payload, '$');
  take(payload, '$');  // the type, which the row of the table knows
  std::uint32_t version = 0;
  if (payload.substr(0, 2) == "v=" && !parseSetting(take(payload, '$'), "v=", version)) return false;
  const bool costs = parseSetting(take(payload, ','), "m=", parts.memoryKib) &&
                     parseSetting(take(payload, ','), "t=", parts.passes) &&
                     parseSetting(take(payload, '$'), "p=", parts.lanes);
  Secret bytes;
  return costs && decodeBase64(take(payload, '$'), bytes) && bytes.size() >= 8 && decodeBase64(payload, bytes) &&
         bytes.size() >= 4;
}

const char* hexProblem(const PayloadRule& rule, std::string_view payload) {
  const bool hex = payload.find_first_not_of("0123456789abcdefABCDEF") == kNone && payload.size() % 2 == 0;
  return hex && payload.size() / 2 >= static_cast<std::size_t>(rule.least) ? nullptr : rule.text;
}

const char* cryptStringProblem(const PayloadRule& rule, std::string_view payload) {
  const bool printed = std::all_of(payload.begin(), payload.end(), [](char c) { return c > ' ' && c < 127; });
  const std::size_t mark = payload.rfind('$');
  const std::string_view hash = payload.substr(mark == kNone ? 0 : mark + 1);
  const auto characters = static_cast<std::size_t>(rule.least);
  const bool whole = hash.size() == characters && (mark == kNone ? hash.front() == '_' : isHash(hash));
  return printed && whole ? nullptr : rule.text;
}

const char* bigcryptProblem(const PayloadRule& rule, std::string_view payload) {
  return payload.size() >= 24 && payload.size() % 11 == 2 && isHash(payload) ? nullptr : rule.text;
}

const char* pbkdf2Problem(const PayloadRule& rule, std::string_view payload) {
  Pbkdf2Parts parts;
  const bool right = parsePbkdf2(payload, parts) && parts.hash.size() >= static_cast<std::size_t>(rule.least);
  return right ? nullptr : rule.text;
}

const char* argon2Problem(const PayloadRule& rule, std::string_view payload) {
  Argon2Parts parts;
  return parseArgon2(payload, parts) ? nullptr : rule.text;
}

}  // namespace tool
