// SPDX-License-Identifier: Apache-2.0
// Checking presented passwords against stored values. Which of the schemes of the two texts decide how they are
// compared stands in one table; each comparison is a few lines above it.
#include "password_schemes.h"

#include <cstring>
#include <iterator>

#include "passwords/rdbm_pwd.h"
#include "passwords/rdbm_pwd_format.h"
#include "passwords/rdbm_pwd_reverse.h"
#include "support/owners.h"
#include "support/text_target.h"

namespace ldappw {
namespace {

constexpr TraceInfo kVerifyPassword{
    {passwordId(kVerifyPasswordId), kSmallLevel, kSmallMask}, "verify_password", LineClass::debug, {}, Lines::none};

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
    for (size_t i = 0; i < 2 && sizeof crypt_BRACED + i < value.length; ++i) {
      characters[i] = value.data[sizeof crypt_BRACED + i];
    }
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
    const CryptSalt salt(scheme.code == FORMAT_CRYPT ? value : Text{});
    const FormatRequest request{text.data, text.length, salt.characters, keyData, isClear};
    length_ = static_cast<size_t>(formatValue(scheme, request, bytes_, sizeof bytes_));
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
  return compareTexts(work.formatLike(c.stored, false, c.presentedScheme, c.presented, c.keyData), c.presented);
}

// Tags compare without regard to case, payloads exactly. The tags differ only where another scheme was made.
int compareFormattedPresented(const Comparison& c) noexcept {
  WorkBuffer work;
  const Text made = work.formatLike(c.presented, true, c.storedScheme, c.stored, c.keyData);
  if (made.length != c.stored.length) return kNotCompared;
  const size_t tagBytes = c.storedScheme.tagBytes;
  if (&schemeToMake(c.storedScheme, c.keyData) != &c.storedScheme) {
    return compareTag(made.data, c.stored.data, tagBytes);
  }
  return compareTexts(behind(made, tagBytes), behind(c.stored, tagBytes));
}

// A digest, wiped when it goes.
struct OwnDigest : sha_digest {
  ~OwnDigest() { wipe(this, sizeof *this); }
  const unsigned char* bytes() const noexcept { return reinterpret_cast<const unsigned char*>(this); }
};

// Whether a payload of their length is the standard base64 text of a digest: it decodes to it, and its last group ends
// as that of a text does. VerifyPassword.TreatsTheOddPairsAsPromised pins what would decode alike.
bool isTextOf(const OwnDigest& digest, const char* payload) noexcept {
  constexpr size_t kBytes = sizeof(sha_digest);
  constexpr size_t kCharacters = encodedLength(kBytes);
  unsigned char decoded[decodedRoom(kCharacters)];
  const DecodedText given = decodeText(payload, kCharacters, kStandard, decoded);
  const bool isSame = given.isClean && given.bytes == kBytes && equalBytes(decoded, digest.bytes(), kBytes);
  const char last = kStandard[(digest.bytes()[kBytes - 1] & 15U) << 2U];
  return isSame && payload[kCharacters - 2] == last && payload[kCharacters - 1] == kPad;
}

// {SHA} values. The stored text is decoded beside the digesting, which takes half the time that encoding the digest and
// comparing texts would take after it; only what differs, or another alphabet, is compared as texts.
int compareSha(const Comparison& c) noexcept {
  OwnDigest digest;
  if (!digestValue({c.presented.data, c.presented.length, nullptr, nullptr, true}, digest)) return kNotCompared;
  if (c.stored.length != kShaValue) return kNotCompared;
  const Text payload = behind(c.stored, sizeof SHA_BRACED);
  if (isStandard(pBase64) && isTextOf(digest, payload.data)) return 0;
  char made[encodedLength(sizeof digest)];
  encodeBytes(digest.bytes(), sizeof digest, pBase64, made);
  return compareTexts({made, sizeof made}, payload);
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
    {FORMAT_SHA,   FORMAT_NONE,   compareSha},
    {kAny,         FORMAT_NONE,   compareFormattedPresented},
    {kAny,         FORMAT_QVEIL,  compareUnmasked},
    {FORMAT_SHA,   FORMAT_SHA,    compareDigests},
    {kAny,         kSameAsStored, compareLeading},
    {FORMAT_NONE,  FORMAT_SSHA,   verifySalted},
    {FORMAT_NONE,  kAny,          compareFormattedStored},
    {kAny,         kAny,          compareWhole},
};
// clang-format on

constexpr size_t ruleFor(int stored, int presented) {
  for (size_t i = 0;; ++i) {
    const Rule& rule = kRules[i];
    const bool fitsStored = rule.stored == kAny || rule.stored == stored;
    const bool fitsPresented = rule.presented == kAny || rule.presented == presented ||
                               (rule.presented == kSameAsStored && presented == stored);
    if (fitsStored && fitsPresented) return i;
  }
}

// The row for each pair of schemes, by their places in the scheme table.
struct Chosen {
  uint8_t rules[std::size(kSchemes)][std::size(kSchemes)];
};

constexpr Chosen chosenRules() {
  Chosen chosen{};
  for (size_t s = 0; s < std::size(kSchemes); ++s) {
    for (size_t p = 0; p < std::size(kSchemes); ++p) {
      chosen.rules[s][p] = static_cast<uint8_t>(ruleFor(kSchemes[s].code, kSchemes[p].code));
    }
  }
  return chosen;
}

constexpr Chosen kChosen = chosenRules();

int compare(const Comparison& c) noexcept {
  return kRules[kChosen.rules[&c.storedScheme - kSchemes][&c.presentedScheme - kSchemes]].compare(c);
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
