// SPDX-License-Identifier: Apache-2.0
// The schemes as one table, and what the password module's files share.
#pragma once

#include <cstddef>

#include "password_schemes.h"
#include "trace_scope.h"

namespace ldappw {

// The functions of the password module in the order of their trace identifiers. Their lines are the odd ones of old:
// none about entering and leaving.
enum PasswordFunction : unsigned { kCheckFormatId = 1, kFormatPasswordId, kVerifyPasswordId, kUnformatPasswordId };

constexpr TraceInfo passwordOperation(const char* name, PasswordFunction function) {
  return {name, operationScope(passwordId(function)), LineClass::debug, Lines::none};
}

constexpr char kSaltedDigest[] = "SHA1";  // of {SSHA}, by its provider name

// What is to be formatted.
struct FormatRequest {
  const char* clear;
  size_t clearBytes;
  const char* salt;
  AesKeyData* keyData;
};

struct Scheme;

// Writes a payload behind the tag and returns its length, 0 for failure.
using PayloadMaker = size_t (*)(TracedCall& call, const Scheme& scheme, const FormatRequest& request, char* payload);

constexpr int kMeasured = -1;  // the length depends on the clear text's

struct Scheme {
  int code;
  const char* tag;
  size_t tagBytes;
  int fixedLength;     // of the formatted value, and the least buffer for it
  size_t payloadRoom;  // that must be left behind the tag
  int keyIndex;        // of the AES schemes
  PayloadMaker make;
};

// The length of the value that a scheme makes of so many bytes, -1 for one that no int can tell.
int valueLength(const Scheme& scheme, int clearLength) noexcept;

// The row of a scheme that can be made, or null.
const Scheme* findScheme(int code) noexcept;

// Whether value begins with the tag, without regard to case.
bool beginsWith(const char* value, const char* tag, size_t tagBytes) noexcept;

}  // namespace ldappw
