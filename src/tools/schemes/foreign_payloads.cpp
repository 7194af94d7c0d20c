// SPDX-License-Identifier: Apache-2.0
#include "schemes/foreign_payloads.h"

#include <algorithm>
#include <charconv>
#include <new>
#include <string>

#include "base/base64.h"
#include "base/text.h"

namespace tool {
namespace {

constexpr char kCryptCharacters[] = "./0123456789ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz";
constexpr size_t kNone = std::string_view::npos;
constexpr size_t kMaxPayload = 2048;  // beyond it no maker writes one
constexpr size_t kOldSaltBytes = 64;  // of 389's {PBKDF2_SHA256}

// A check may take five seconds of processor time and 1 GiB. Measured: Argon2 1.0 s a GiB that it writes, a million
// iterations of PBKDF2 0.24 s with SHA-1 and 0.56 s with SHA-512, a million rounds of sha512-crypt 0.27 s, bcrypt of
// cost 12 0.21 s.
constexpr std::uint64_t kMaxIterations = 10000000;
constexpr std::uint64_t kMaxMemory = std::uint64_t{1} << 30;
constexpr std::uint64_t kMaxMemoryPasses = std::uint64_t{1} << 32;  // bytes that Argon2 writes
constexpr std::uint32_t kMaxLanes = 64;
constexpr std::uint32_t kMaxBcryptLog = 16;

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

// The place of a character among those of crypt(3), or 64.
std::uint32_t digitOf(char c) noexcept {
  const size_t place = std::string_view(kCryptCharacters).find(c);
  return place == kNone ? 64 : static_cast<std::uint32_t>(place);
}

// Of log2 of the blocks, and their size in 128 bytes.
std::uint64_t scryptMemory(std::uint32_t blocksLog, std::uint64_t blockSize) noexcept {
  constexpr std::uint32_t kMostLog = 24;
  if (blocksLog > kMostLog || blockSize == 0 || blockSize > kMaxMemory / 128) return UINT64_MAX;
  return (std::uint64_t{128} << blocksLog) * blockSize;
}

// "j", log2 of the blocks less one, the block size less one: the short form, which is all that crypt_gensalt writes.
std::uint64_t yescryptMemory(std::string_view settings) noexcept {
  constexpr std::uint32_t kLongDigits = 48;  // those from here on go on in the next character
  if (settings.size() != 3 || settings[0] != 'j') return UINT64_MAX;
  const std::uint32_t blocksLog = digitOf(settings[1]);
  const std::uint32_t blockSize = digitOf(settings[2]);
  return blocksLog < kLongDigits && blockSize < kLongDigits ? scryptMemory(blocksLog + 1, blockSize + 1) : UINT64_MAX;
}

// log2 of the blocks, then block size and lanes in five characters each, the lowest bits first.
std::uint64_t plainScryptMemory(std::string_view settings) noexcept {
  if (settings.size() < 11) return UINT64_MAX;
  std::uint64_t numbers[2] = {};
  for (size_t i = 0; i < 10; ++i) numbers[i / 5] |= std::uint64_t{digitOf(settings[1 + i])} << (i % 5 * 6);
  return numbers[1] <= 4 ? scryptMemory(digitOf(settings[0]), numbers[0]) : UINT64_MAX;
}

bool roundsAreBounded(std::string_view text) noexcept {
  std::uint32_t rounds = 0;
  return parseNumber(text, rounds) && rounds <= kMaxIterations;
}

bool parseDovecot(std::string_view payload, Pbkdf2Parts& parts) {
  take(payload, '$');
  take(payload, '$');
  parts.salt = Secret(take(payload, '$'));
  return parseNumber(take(payload, '$'), parts.iterations) && decodeHex(payload, parts.hash);
}

bool parseUsual(std::string_view payload, Pbkdf2Parts& parts) {
  const std::string_view iterations = take(payload, '$');
  const std::string_view salt = take(payload, '$');
  return parseNumber(iterations, parts.iterations) && decodeAnyBase64(salt, parts.salt) &&
         decodeAnyBase64(payload, parts.hash);
}

bool parsePacked(std::string_view payload, Pbkdf2Parts& parts) {
  Secret bytes;
  if (!decodeAnyBase64(payload, bytes) || bytes.size() <= sizeof parts.iterations + kOldSaltBytes) return false;
  for (size_t i = 0; i < sizeof parts.iterations; ++i) {
    parts.iterations = parts.iterations << 8 | static_cast<unsigned char>(bytes.view()[i]);
  }
  parts.salt = Secret(bytes.view().substr(sizeof parts.iterations, kOldSaltBytes));
  parts.hash = Secret(bytes.view().substr(sizeof parts.iterations + kOldSaltBytes));
  return true;
}

}  // namespace

bool parseNumber(std::string_view text, std::uint32_t& number) noexcept {
  const char* end = text.data() + text.size();
  const auto [stopped, error] = std::from_chars(text.data(), end, number);
  return error == std::errc() && stopped == end;
}

bool decodeAnyBase64(std::string_view text, Secret& bytes) {
  while (!text.empty() && text.back() == '=') text.remove_suffix(1);
  Secret usual(text);
  std::replace(usual.data(), usual.data() + usual.size(), '.', '+');
  while (usual.size() % 4 != 0) usual.append('=');
  return decodeBase64(usual.view(), bytes);
}

bool decodeHex(std::string_view text, Secret& bytes) {
  bytes.clear();
  if (text.size() % 2 != 0) return false;
  for (; !text.empty(); text.remove_prefix(2)) {
    unsigned char byte = 0;
    const auto [stopped, error] = std::from_chars(text.data(), text.data() + 2, byte, 16);
    if (error != std::errc() || stopped != text.data() + 2) return false;
    bytes.append(static_cast<char>(byte));
  }
  return true;
}

void appendAdaptedBase64(const Secret& bytes, Secret& out) {
  const size_t before = out.size();
  appendBase64(bytes.view(), out);
  while (out.view().back() == '=') out.resize(out.size() - 1);
  std::replace(out.data() + before, out.data() + out.size(), '+', '.');
}

bool parsePbkdf2(std::string_view payload, Pbkdf2Parts& parts) {
  if (payload.size() > kMaxPayload) return false;
  const size_t mark = payload.find('$');
  const bool parsed = mark == 0       ? parseDovecot(payload, parts)
                      : mark == kNone ? parsePacked(payload, parts)
                                      : parseUsual(payload, parts);
  return parsed && parts.iterations > 0 && !parts.hash.empty();
}

bool parseScram(std::string_view payload, Pbkdf2Parts& parts) {
  if (payload.size() > kMaxPayload) return false;
  const std::string_view iterations = take(payload, ',');
  const std::string_view salt = take(payload, ',');
  return parseNumber(iterations, parts.iterations) && parts.iterations > 0 && decodeAnyBase64(salt, parts.salt) &&
         decodeAnyBase64(take(payload, ','), parts.hash);
}

bool pbkdf2CostsAreBounded(std::uint32_t iterations, size_t hashBytes) noexcept {
  constexpr size_t kBlockBytes = 32;  // each takes all the iterations
  return iterations * std::uint64_t{hashBytes / kBlockBytes + 1} <= kMaxIterations * 2;
}

bool parseArgon2(std::string_view payload, Argon2Parts& parts) {
  if (payload.size() > kMaxPayload) return false;
  take(payload, '$');
  take(payload, '$');  // the type, which the row of the table knows
  std::uint32_t version = 0;
  if (payload.substr(0, 2) == "v=" && !parseSetting(take(payload, '$'), "v=", version)) return false;
  const bool costs = parseSetting(take(payload, ','), "m=", parts.memoryKib) &&
                     parseSetting(take(payload, ','), "t=", parts.passes) &&
                     parseSetting(take(payload, '$'), "p=", parts.lanes);
  Secret bytes;
  return costs && decodeAnyBase64(take(payload, '$'), bytes) && bytes.size() >= 8 && decodeAnyBase64(payload, bytes) &&
         bytes.size() >= 4;
}

bool argon2CostsAreBounded(const Argon2Parts& parts) noexcept {
  const std::uint64_t bytes = std::uint64_t{parts.memoryKib} << 10;
  return bytes <= kMaxMemory && parts.lanes <= kMaxLanes && bytes * parts.passes <= kMaxMemoryPasses;
}

std::uint64_t cryptMemory(std::string_view value) noexcept {
  std::string_view rest = value;
  take(rest, '$');
  const std::string_view name = take(rest, '$');
  const std::string_view settings = take(rest, '$');
  if (name == "y" || name == "gy") return yescryptMemory(settings);
  return name == "7" ? plainScryptMemory(settings) : 0;
}

bool cryptCostsAreBounded(std::string_view value) noexcept {
  constexpr std::string_view kRounds = "rounds=";
  std::string_view rest = value;
  take(rest, '$');
  const std::string_view name = take(rest, '$');
  const std::string_view settings = take(rest, '$');
  const size_t rounds = value.find(kRounds);
  std::uint32_t number = 0;
  if (cryptMemory(value) > kMaxMemory) return false;
  if (name == "sha1") return roundsAreBounded(settings);
  if (name.substr(0, 1) == "2") return parseNumber(settings, number) && number <= kMaxBcryptLog;
  if (rounds == kNone) return true;
  const std::string_view digits = value.substr(rounds + kRounds.size());
  return roundsAreBounded(digits.substr(0, digits.find_first_not_of("0123456789")));
}

const char* hexProblem(const PayloadRule& rule, std::string_view payload) {
  const bool hex = payload.find_first_not_of("0123456789abcdefABCDEF") == kNone && payload.size() % 2 == 0;
  return hex && payload.size() / 2 >= static_cast<size_t>(rule.least) ? nullptr : rule.text;
}

const char* cryptStringProblem(const PayloadRule& rule, std::string_view payload) {
  const bool printed = std::all_of(payload.begin(), payload.end(), [](char c) { return c > ' ' && c < 127; });
  const size_t mark = payload.rfind('$');
  const std::string_view hash = payload.substr(mark == kNone ? 0 : mark + 1);
  const auto characters = static_cast<size_t>(rule.least);
  const bool whole = hash.size() == characters && (mark == kNone ? hash.front() == '_' : isHash(hash));
  return printed && whole ? nullptr : rule.text;
}

const char* bigcryptProblem(const PayloadRule& rule, std::string_view payload) {
  return payload.size() >= 24 && payload.size() % 11 == 2 && isHash(payload) ? nullptr : rule.text;
}

const char* pbkdf2Problem(const PayloadRule& rule, std::string_view payload) {
  Pbkdf2Parts parts;
  const bool right = parsePbkdf2(payload, parts) && parts.hash.size() >= static_cast<size_t>(rule.least);
  return right ? nullptr : rule.text;
}

const char* scramProblem(const PayloadRule& rule, std::string_view payload) {
  Pbkdf2Parts parts;
  const bool right = parseScram(payload, parts) && parts.hash.size() == static_cast<size_t>(rule.least);
  return right ? nullptr : rule.text;
}

const char* argon2Problem(const PayloadRule& rule, std::string_view payload) {
  Argon2Parts parts;
  return parseArgon2(payload, parts) ? nullptr : rule.text;
}

}  // namespace tool
