// SPDX-License-Identifier: Apache-2.0
// The scheme table, one row per scheme: its code and tag, how long values are, which key it takes. Makers and
// verification pass rows around, so that a row is looked up once.
#pragma once

#include <cstddef>
#include <cstdint>
#include <cstring>

#include "password_schemes.h"
#include "support/trace_scope.h"

namespace ldappw {

struct Scheme {
  int code;
  const char* tag;  // of tagBytes characters, without a terminator; clear text has none
  size_t tagBytes;
  size_t longerThan;   // a value with the tag has more bytes than this
  int fixedLength;     // of a formatted value, and the least buffer for it; or one of the constants below
  size_t payloadRoom;  // that must be left behind the tag
  int keyIndex;        // of the AES schemes
};

constexpr int kPadded = -1;     // fixedLength: the clear text in whole cipher blocks, as base64
constexpr int kAsClear = -2;    // fixedLength: as long as the clear text
constexpr int kNeverMade = -3;  // fixedLength: recognised only
constexpr int kNoKey = -1;

// The lengths that a value must exceed are uneven, and the 21 of {MD5} is less than the 29 characters that it writes:
// values and callers' buffers of every server out there fit these numbers. CheckFormat.FollowsTheUnevenLengthsOfTheTags
// and the EachScheme suite pin them.
// clang-format off
inline constexpr Scheme kSchemes[] = {
    //                                              longer than  length      room  key
    {FORMAT_NONE,   "",            0,                         0, kAsClear,      0, kNoKey},
    {FORMAT_SSHA,   SSHA_BRACED,   sizeof SSHA_BRACED,        6, 62,           40, kNoKey},
    {FORMAT_SHA,    SHA_BRACED,    sizeof SHA_BRACED,         5, 33,           20, kNoKey},
    {FORMAT_CRYPT,  crypt_BRACED,  sizeof crypt_BRACED,       7, 20,           13, kNoKey},
    {FORMAT_MD5,    MD5_BRACED,    sizeof MD5_BRACED,         4, 21,           16, kNoKey},
    {FORMAT_QVEIL,  qVEIL_BRACED,  sizeof qVEIL_BRACED,       7, 171,         164, kNoKey},
    {FORMAT_AES256, AES256_BRACED, sizeof AES256_BRACED,      8, kPadded,       0, 2},
    {FORMAT_AES192, AES192_BRACED, sizeof AES192_BRACED,      8, kPadded,       0, 1},
    {FORMAT_AES128, AES128_BRACED, sizeof AES128_BRACED,      8, kPadded,       0, 0},
    {FORMAT_VLDL,   VLDL_BRACED,   sizeof VLDL_BRACED,        6, kNeverMade,    0, kNoKey},
};
// clang-format on

// The rows that need no search.
constexpr size_t kClearRow = 0;  // the one without a tag
constexpr size_t kMaskedRow = 5;
static_assert(kSchemes[kClearRow].code == FORMAT_NONE && kSchemes[kMaskedRow].code == FORMAT_QVEIL);

// The row of a code, or null.
const Scheme* findScheme(int code) noexcept;

// The length of the value that a scheme makes of so many bytes; -1 when it makes none, or one that no int can state.
int valueLength(const Scheme& scheme, int clearLength) noexcept;

// The first difference between the beginnings of two texts, without regard to the case of ASCII letters, or 0. The
// locale has no say: a host's may have other ideas of case.
int compareTag(const char* left, const char* right, size_t bytes) noexcept;

// Whether a value of at least as many bytes begins with the scheme's tag, in any case.
inline bool hasTag(const char* value, const Scheme& scheme) noexcept {
  // Tags have 5 to 8 bytes, which two words that overlap cover. The cases of a letter differ in one bit.
  const auto differences = [&](size_t at) {
    uint32_t words[2];
    std::memcpy(&words[0], value + at, sizeof words[0]);
    std::memcpy(&words[1], scheme.tag + at, sizeof words[1]);
    return words[0] ^ words[1];
  };
  constexpr uint32_t kCaseBits = 0x20202020;
  const uint32_t first = differences(0);
  if ((first & ~kCaseBits) != 0) return false;
  const uint32_t last = differences(scheme.tagBytes - sizeof(uint32_t));
  if ((first | last) == 0) return true;  // the usual spelling
  return (last & ~kCaseBits) == 0 && compareTag(value, scheme.tag, scheme.tagBytes) == 0;
}

// The functions of the password module in the order of their trace identifiers. They write no lines about entering and
// leaving.
enum PasswordFunction : unsigned { kCheckFormatId = 1, kFormatPasswordId, kVerifyPasswordId, kUnformatPasswordId };

constexpr TraceInfo passwordOperation(const char* name, PasswordFunction function) {
  return {{passwordId(function), kOperationLevel, kOperationMask}, name, LineClass::debug, {}, Lines::none};
}

}  // namespace ldappw
