// SPDX-License-Identifier: Apache-2.0
// The scheme tags, detection of a value's scheme, the lengths of values, and the crypt salt.
#include <unistd.h>

#include <climits>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <ctime>

#include "password_schemes.h"
#include "rdbm_pwd_schemes.h"

// The tag table: nine symbols over one run of bytes, which C++ has no way to declare.
extern "C" {
__attribute__((used, visibility("hidden"))) char ldappwTagTable[] =
    "{SHA}{SSHA}{MD5}{crypt}{qVEIL}{AES128}{AES192}{AES256}{VLDL}";
}
static_assert(sizeof ldappwTagTable == 61, "the tags and a single NUL");

#define LDAPPW_TAG(name, offset, length) \
  __asm__(".globl " #name                \
          "\n"                           \
          ".type " #name                 \
          ", @object\n"                  \
          ".size " #name ", " #length    \
          "\n"                           \
          ".set " #name ", ldappwTagTable + " #offset "\n")
LDAPPW_TAG(SHA_BRACED, 0, 5);
LDAPPW_TAG(SSHA_BRACED, 5, 6);
LDAPPW_TAG(MD5_BRACED, 11, 5);
LDAPPW_TAG(crypt_BRACED, 16, 7);
LDAPPW_TAG(qVEIL_BRACED, 23, 7);
LDAPPW_TAG(AES128_BRACED, 30, 8);
LDAPPW_TAG(AES192_BRACED, 38, 8);
LDAPPW_TAG(AES256_BRACED, 46, 8);
LDAPPW_TAG(VLDL_BRACED, 54, 6);
#undef LDAPPW_TAG

namespace ldappw {
namespace {

constexpr TraceInfo kCheckFormat = passwordOperation("check_format", kCheckFormatId);

// The braced tags in the order in which they are looked for, with the length that a value must exceed. The lengths are
// uneven: meant. {qVEIL} and the wrapped form are looked for before.
struct TagRow {
  const char* tag;
  size_t tagBytes;
  unsigned longerThan;
  int code;
};

constexpr unsigned kNoMatch = 4;  // values of up to this length are clear text
constexpr unsigned kMaskedLongerThan = 7;

constexpr TagRow kTagRows[] = {
    {crypt_BRACED, sizeof crypt_BRACED, 7, FORMAT_CRYPT},    {MD5_BRACED, sizeof MD5_BRACED, kNoMatch, FORMAT_MD5},
    {SHA_BRACED, sizeof SHA_BRACED, 5, FORMAT_SHA},          {SSHA_BRACED, sizeof SSHA_BRACED, 6, FORMAT_SSHA},
    {AES128_BRACED, sizeof AES128_BRACED, 8, FORMAT_AES128}, {AES192_BRACED, sizeof AES192_BRACED, 8, FORMAT_AES192},
    {AES256_BRACED, sizeof AES256_BRACED, 8, FORMAT_AES256}, {VLDL_BRACED, sizeof VLDL_BRACED, 6, FORMAT_VLDL}};

constexpr char folded(char c) {
  return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c;
}

uint32_t wordAt(const char* text) noexcept {
  uint32_t word = 0;
  std::memcpy(&word, text, sizeof word);
  return word;
}

bool isMasked(const char* value, unsigned length) noexcept {
  if (length <= kMaskedLongerThan) return false;
  if (value[0] == '>') return value[length - 1] == '<';
  return value[0] == '{' && beginsWith(value, qVEIL_BRACED, sizeof qVEIL_BRACED);
}

int detected(TracedCall& call, const char* value, unsigned length) noexcept {
  if (length <= kNoMatch || value == nullptr) return FORMAT_NONE;
  if (isMasked(value, length)) return FORMAT_QVEIL;
  if (value[0] != '{') return FORMAT_NONE;
  const char second = folded(value[1]);  // tells most tags apart
  for (const TagRow& row : kTagRows) {
    if (second == folded(row.tag[1]) && length > row.longerThan && beginsWith(value, row.tag, row.tagBytes))
      return row.code;
  }
  call.line(LineClass::debug, "CheckFormat:UNKNOWN pwd encoding,assume unencrypted\n");
  return FORMAT_NONE;
}

constexpr int kCipherBlock = 16;

int aesValueLength(int clearLength, size_t tagBytes) noexcept {
  const int64_t padded = (int64_t{clearLength} + kCipherBlock) / kCipherBlock * kCipherBlock;
  const int64_t length = (padded + 2) / 3 * 4 + static_cast<int64_t>(tagBytes);
  return length > INT_MAX ? -1 : static_cast<int>(length);
}

constexpr char kSaltCharacters[] = "abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ1234567890./";
constexpr int kSeedModulus = 2147483647;

}  // namespace

int valueLength(const Scheme& scheme, int clearLength) noexcept {
  return scheme.fixedLength != kMeasured ? scheme.fixedLength : aesValueLength(clearLength, scheme.tagBytes);
}

bool beginsWith(const char* value, const char* tag, size_t tagBytes) noexcept {
  // Tags have 5 to 8 bytes, which two words that overlap cover. Letters of the two cases differ in one bit.
  const uint32_t differences =
      (wordAt(value) ^ wordAt(tag)) | (wordAt(value + tagBytes - 4) ^ wordAt(tag + tagBytes - 4));
  if (differences == 0) return true;  // the usual spelling
  if ((differences & ~0x20202020U) != 0) return false;
  for (size_t i = 0; i < tagBytes; ++i) {
    if (folded(value[i]) != folded(tag[i])) return false;
  }
  return true;
}

}  // namespace ldappw

using namespace ldappw;

extern "C" {

// Documented in password_schemes.h.

int check_format(const char* value, unsigned int length) noexcept {
  TracedCall call{kCheckFormat};
  return call.leave(detected(call, value, length));
}

int formatted_password_length(int scheme, int clearLength) noexcept {
  if (scheme == FORMAT_NONE) return clearLength;
  if (const Scheme* row = findScheme(scheme)) return valueLength(*row, clearLength);
  globalLine(LineClass::debug, "Error - formatted_password_length: Format-UNKNOWN pwd encoding %d\n", scheme);
  return -1;
}

void generate_crypt_salt(char* out) noexcept {
  if (out == nullptr) return;
  const auto mixed = static_cast<int32_t>(static_cast<uint32_t>(std::time(nullptr)) ^ static_cast<uint32_t>(getpid()));
  auto seed = static_cast<unsigned>(mixed % kSeedModulus);
  for (unsigned i = 0; i < 2; ++i) {
    const auto drawn = static_cast<unsigned>(rand_r(&seed));
    out[i] = kSaltCharacters[(drawn >> 4U) % 64U];
  }
  out[2] = '\0';
}

}  // extern "C"
