// SPDX-License-Identifier: Apache-2.0
// The forms of foreign payloads: what is wrong with one, and its parts.
#pragma once

#include <cstdint>
#include <string_view>

#include "schemes/scheme.h"

namespace tool {

// What is wrong with a payload, or null; the rule's least is the number of bytes, or of characters of the hash.
const char* hexProblem(const PayloadRule& rule, std::string_view payload);
const char* cryptStringProblem(const PayloadRule& rule, std::string_view payload);
const char* bigcryptProblem(const PayloadRule& rule, std::string_view payload);
const char* pbkdf2Problem(const PayloadRule& rule, std::string_view payload);
const char* scramProblem(const PayloadRule& rule, std::string_view payload);
const char* argon2Problem(const PayloadRule& rule, std::string_view payload);

// A decimal number without sign; false when it is none or too large.
bool parseNumber(std::string_view text, std::uint32_t& number) noexcept;

// Bytes of base64 with or without padding, "." standing for "+" as some programs write it; false when it is none.
bool decodeAnyBase64(std::string_view text, Secret& bytes);

bool decodeHex(std::string_view text, Secret& bytes);

// Base64 without padding and with "." for "+".
void appendAdaptedBase64(const Secret& bytes, Secret& out);

// The parts of a PBKDF2 payload, decoded, in any of the spellings: iterations$salt$hash; Dovecot's
// $1$salt$iterations$hash, the salt as it is and the hash in hexadecimal; 389's base64 of 4 bytes of iterations, 64 of
// salt and the hash.
struct Pbkdf2Parts {
  std::uint32_t iterations = 0;
  Secret salt;
  Secret hash;
};
bool parsePbkdf2(std::string_view payload, Pbkdf2Parts& parts);
// iterations,salt,stored key,server key; hash is the stored key.
bool parseScram(std::string_view payload, Pbkdf2Parts& parts);
bool pbkdf2CostsAreBounded(std::uint32_t iterations, size_t hashBytes) noexcept;

// $type[$v=number]$m=number,t=number,p=number$salt$hash.
struct Argon2Parts {
  std::uint32_t memoryKib = 0;
  std::uint32_t passes = 0;
  std::uint32_t lanes = 0;
};
bool parseArgon2(std::string_view payload, Argon2Parts& parts);
bool argon2CostsAreBounded(const Argon2Parts& parts) noexcept;

// The memory that crypt(3) takes for a value, in bytes; the most there is for one whose costs cannot be read.
std::uint64_t cryptMemory(std::string_view value) noexcept;
// Costs as crypt(3) reads them in a value; those that cannot be read count as unbounded.
bool cryptCostsAreBounded(std::string_view value) noexcept;

}  // namespace tool
