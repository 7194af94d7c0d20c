// SPDX-License-Identifier: Apache-2.0
// Making stored values, as verification calls it.
#pragma once

#include "rdbm_pwd_schemes.h"

namespace ldappw {

constexpr char kSaltedDigest[] = "SHA1";  // of {SSHA}, by its provider name

// What is to be formatted.
struct FormatRequest {
  const char* clear;
  size_t clearBytes;
  const char* salt;  // of {crypt}
  AesKeyData* keyData;
  bool isClear;  // a "{SHA}" at its beginning is part of the password, not the tag of a digest
};

// The work of format_password, traced as such. Writes the value and nothing behind it, and returns its length, 0 for
// failure. A {SSHA} or {MD5} value is written whatever outSize is, as long as that is the scheme's least.
int formatValue(int code, const FormatRequest& request, char* out, size_t outSize) noexcept;

}  // namespace ldappw
