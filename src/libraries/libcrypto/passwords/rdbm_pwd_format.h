// SPDX-License-Identifier: Apache-2.0
// Making stored values, as verification calls it.
#pragma once

#include "passwords/rdbm_pwd_schemes.h"

namespace ldappw {

constexpr int kShaValue = 33;             // the characters of a {SHA} value
constexpr char kSaltedDigest[] = "SHA1";  // of {SSHA}, by its provider name

// What is to be formatted.
struct FormatRequest {
  const char* clear;
  size_t clearBytes;
  const char* salt;  // of {crypt}
  AesKeyData* keyData;
  bool isClear;  // a "{SHA}" at its beginning is part of the password, not the tag of a digest
};

// The scheme that a value is made in: {AES256} without keys becomes {qVEIL}; the shorter keys have no such way out and
// make nothing. FormatPassword.RefusesAndLeavesAtMostTheTag pins it.
inline const Scheme& schemeToMake(const Scheme& asked, const AesKeyData* keyData) noexcept {
  return asked.code == FORMAT_AES256 && keyData == nullptr ? kSchemes[kMaskedRow] : asked;
}

// The work of format_password, traced as such. Writes the value and nothing behind it, and returns its length, 0 for
// failure.
int formatValue(const Scheme& scheme, const FormatRequest& request, char* out, size_t outSize) noexcept;

// The same for {SHA} and a clear text, of which the caller wants the digest before it is written as base64. False for
// failure.
bool digestValue(const FormatRequest& request, sha_digest& digest) noexcept;

}  // namespace ldappw
