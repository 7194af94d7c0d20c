// SPDX-License-Identifier: Apache-2.0
// Checking presented passwords against stored values. Which of the schemes of the two texts decide how they are
// compared stands in one table; each comparison is a few lines above it.
#include "password_schemes.h"

#include <cstring>

#include "owners.h"
#include "rdbm_pwd.h"
#include "rdbm_pwd_format.h"
#include "rdbm_pwd_reverse.h"
#include "text_target.h"

namespace ldappw {
namespace {

constexpr TraceInfo kVerifyPassword{
    "verify_password", {passwordId(kVerifyPasswordId), kSmallLevel, kSmallMask}, LineClass::debug, {}, Lines::none};

constexpr int kNotCompared = 99;
constexpr size_t kWorkSize = 1024;  // no longer value is compared by formatting
constexpr size_t kLeading = 46;     // what is compared of two values of one scheme, and of unmasked texts

struct Text {
  const char* data;
  size_t length;
};

// One comparison: both texts, and the scheme that each is taken for.
struct Comparison {
  Text presented;
  const Scheme& presentedScheme;
  Text stored;
  const Scheme& storedScheme;
  AesKeyData* keyData;
};

// What lies behind the first bytes of a text; nothing when it is shorter.
Text behind(const Text& text, size_t bytes) noexcept {
  const size_t skipped = bytes < text.length ? bytes : text.length;
  return {text.data + skipped, text.length - skipped};
}

Text leading(const Text& text) noexcept {
  return {text.data, text.length < kLeading ? text.length : kLeading};
}

int compareTexts(const Text& a, const Text& b) noexcept {
  if (a.length != b.length) return kNotCompared;
  return equalBytes(a.data, b.data, a.length) ? 0 : compareBytes(a.data, b.data, a.length);
}

// The two salt characters of a {crypt} value, terminated whatever the value's length.
struct CryptSalt {
  explicit CryptSalt(const Text& value) noexcept {
    const Text payload = behind(value, sizeof crypt_BRACED);
    std::memcpy(characters, payload.data, payload.length < 2 ? payload.length : 2);
  }
  char characters[3] = {};
};

// Room for a formatted value, of which only what was written is looked at and wiped.
class WorkBuffer {
 public:
  WorkBuffer() = default;
  ~WorkBuffer() { wipe(bytes_, length_); }
  WorkBuffer(const WorkBuffer&) = delete;
  WorkBuffer& operator=(const WorkBuffer&) = delete;

  // Formats in the scheme, and with the salt, of the value that the result is compared with. isClear: the text is a
  // password, whatever it begins with.
  Text formatLike(const Text& text, bool isClear, const Scheme& scheme, const Text& value,
                  AesKeyData* keyData) noexcept {
    const CryptSalt salt(value);
    const FormatRequest request{text.data, text.length, salt.characters, keyData, isClear};
    length_ = static_cast<size_t>(formatValue(scheme.code, request, bytes_, sizeof bytes_));
    return {bytes_, length_};
  }

 private:
  char bytes_[kWorkSize];
  size_t length_ = 0;
};

// ---- The comparisons ----

int notComparable(const Comparison&) noexcept {
  return kNotCompared;
}

int compareWhole(const Comparison& c) noexcept {
  return compareTexts(c.presented, c.stored);
}

int compareLeading(const Comparison& c) noexcept {
  return compareTexts(leading(c.presented), leading(c.stored));
}

int verifySalted(const Comparison& c) noexcept {
  const Text payload = behind(c.stored, sizeof SSHA_BRACED);
  return saltedHashCheck(c.presented.data, strnlen(c.presented.data, c.presented.length), payload.data,
                         strnlen(payload.data, payload.length), kSaltedDigest);
}

int compareFormattedStored(const Comparison& c) noexcept {
  WorkBuffer work;
  return compareTexts(work.formatLike(c.stored, true, c.presentedScheme, c.presented, c.keyData), c.presented);
}

// Tags compare without regard to case, payloads exactly. The tags differ when a missing key made another scheme of it.
int compareFormattedPresented(const Comparison& c) noexcept {
  WorkBuffer work;
  const Text made = work.formatLike(c.presented, true, c.storedScheme, c.stored, c.keyData);
  if (made.length != c.stored.length) return kNotCompared;
  const size_t tagBytes = c.storedScheme.tagBytes;
  if (const int difference = compareTag(made.data, c.stored.data, tagBytes); difference != 0) return difference;
  return compareTexts(behind(made, tagBytes), behind(c.stored, tagBytes));
}

// Two {SHA} values: one that carries a raw digest matches its base64 form.
int compareDigests(const Comparison& c) noexcept {
  WorkBuffer work;
  const Text made = work.formatLike(c.presented, false, c.storedScheme, c.presented, g_DirKeyData);
  return compareTexts(made.length != 0 ? made : c.presented, c.stored);
}

// One side of a comparison in clear: a masked one decoded, any other as it is.
class Unmasked {
 public:
  Unmasked(const Text& side, const Scheme& scheme) noexcept : text_(side) {
    if (scheme.code != FORMAT_QVEIL) return;
    const Text payload = behind(side, scheme.tagBytes);
    char* clear = nullptr;
    failed_ = unmaskPayload(payload.data, payload.length, &clear) != 0;
    clear_.reset(clear);
    if (!failed_ && clear != nullptr) text_ = {clear, std::strlen(clear)};
  }
  bool failed() const noexcept { return failed_; }
  const Text& text() const noexcept { return text_; }

 private:
  Text text_;
  bool failed_ = false;
  SecretText clear_;
};

int compareUnmasked(const Comparison& c) noexcept {
  const Unmasked presented(c.presented, c.presentedScheme);
  const Unmasked stored(c.stored, c.storedScheme);
  if (presented.failed() || stored.failed()) return kNotCompared;
  return compareTexts(leading(presented.text()), leading(stored.text()));
}

// ---- Which comparison a pair of schemes gets ----

constexpr int kAny = -1;
constexpr int kSameAsStored = -2;

struct Rule {
  int stored;
  int presented;
  int (*compare)(const Comparison&);
};

// The first row that fits counts. The usual pairs, with a clear presented password, come first. A {SSHA} value
// presented against a clear stored text is checked as the password of a value whose payload is that text, so that a
// value never matches the password that it was made of: VerifyPassword.TreatsTheOddPairsAsPromised pins it.
// clang-format off
constexpr Rule kRules[] = {
    // stored      presented
    {FORMAT_SSHA,  FORMAT_NONE,   verifySalted},
    {FORMAT_NONE,  FORMAT_NONE,   compareLeading},
    {FORMAT_QVEIL, kAny,          compareUnmasked},
    {FORMAT_VLDL,  FORMAT_NONE,   notComparable},
    {kAny,         FORMAT_NONE,   compareFormattedPresented},
    {kAny,         FORMAT_QVEIL,  compareUnmasked},
    {FORMAT_SHA,   FORMAT_SHA,    compareDigests},
    {kAny,         kSameAsStored, compareLeading},
    {FORMAT_NONE,  FORMAT_SSHA,   verifySalted},
    {FORMAT_NONE,  kAny,          compareFormattedStored},
    {kAny,         kAny,          compareWhole},
};
// clang-format on

int compare(const Comparison& c) noexcept {
  const int stored = c.storedScheme.code;
  const int presented = c.presentedScheme.code;
  for (const Rule& rule : kRules) {
    const bool fitsStored = rule.stored == kAny || rule.stored == stored;
    const bool fitsPresented = rule.presented == kAny || rule.presented == presented ||
                               (rule.presented == kSameAsStored && presented == stored);
    if (fitsStored && fitsPresented) return rule.compare(c);
  }
  return kNotCompared;
}

}  // namespace
}  // namespace ldappw

using namespace ldappw;

extern "C" {

// Documented in password_schemes.h.

int verify_password(const char* presented, int presentedLength, const char* stored, int storedLength,
                    int presentedIsClear, AesKeyData* keyData) noexcept {
  TracedCall call{kVerifyPassword};
  if (anyNull(presented, stored) || presentedLength < 0 || storedLength < 0) return call.leave(kNotCompared);
  const Text presentedText{presented, static_cast<size_t>(presentedLength)};
  const Text storedText{stored, static_cast<size_t>(storedLength)};
  const Scheme& storedScheme = schemeOf(storedText.data, storedText.length);
  const Scheme& presentedScheme =
      presentedIsClear != 0 ? kSchemes[kClearRow] : schemeOf(presentedText.data, presentedText.length);
  return call.leave(compare({presentedText, presentedScheme, storedText, storedScheme, keyData}));
}

}  // extern "C"
