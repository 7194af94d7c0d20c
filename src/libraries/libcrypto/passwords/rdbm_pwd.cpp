// SPDX-License-Identifier: Apache-2.0
// Telling which scheme a value uses, and how long values are.
#include "passwords/rdbm_pwd.h"

#include <iterator>

namespace ldappw {
namespace {

constexpr TraceInfo kCheckFormat = passwordOperation("check_format", kCheckFormatId);

constexpr size_t kNoTag = 4;  // values of up to this length are clear text

// A masked value without its tag.
bool isWrapped(const char* value, size_t length) noexcept {
  return value[0] == '>' && length > kSchemes[kMaskedRow].longerThan && value[length - 1] == '<';
}

const Scheme& detected(TracedCall& call, const char* value, size_t length) noexcept {
  if (length <= kNoTag || value == nullptr) return kSchemes[kClearRow];
  if (isWrapped(value, length)) return kSchemes[kMaskedRow];
  if (value[0] != '{') return kSchemes[kClearRow];
  for (const Scheme* scheme = kSchemes + kClearRow + 1; scheme != std::end(kSchemes); ++scheme) {
    if (length > scheme->longerThan && hasTag(value, *scheme)) return *scheme;
  }
  call.line(LineClass::debug, "CheckFormat:UNKNOWN pwd encoding,assume unencrypted\n");
  return kSchemes[kClearRow];
}

}  // namespace

const Scheme& schemeOf(const char* value, size_t length) noexcept {
  TracedCall call{kCheckFormat};
  const Scheme& scheme = detected(call, value, length);
  call.leave(scheme.code);
  return scheme;
}

}  // namespace ldappw

using namespace ldappw;

extern "C" {

// Documented in password_schemes.h.

int check_format(const char* value, unsigned int length) noexcept {
  return schemeOf(value, length).code;
}

int formatted_password_length(int scheme, int clearLength) noexcept {
  const Scheme* row = findScheme(scheme);
  if (row != nullptr && row->fixedLength != kNeverMade) return valueLength(*row, clearLength);
  globalLine(LineClass::debug, "Error - formatted_password_length: Format-UNKNOWN pwd encoding %d\n", scheme);
  return -1;
}

}  // extern "C"
