// SPDX-License-Identifier: Apache-2.0
// Checking presented passwords against stored values, and turning reversible values back into clear text.
#include <algorithm>
#include <cstring>

#include "owners.h"
#include "password_schemes.h"
#include "rdbm_pwd_schemes.h"
#include "text_target.h"

namespace ldappw {
namespace {

constexpr TraceInfo kVerifyPassword{"verify_password", smallScope(passwordId(kVerifyPasswordId)), LineClass::debug,
                                    Lines::none};
constexpr TraceInfo kUnformatPassword = passwordOperation("unformat_password", kUnformatPasswordId);

constexpr int kNotCompared = 99;
constexpr size_t kWorkSize = 1024;
constexpr size_t kFixedRoom = 192;  // more than the longest value of fixed length
constexpr size_t kLeading = 46;     // what is compared of two values of one scheme, and of unmasked texts
constexpr size_t kMaskedTag = sizeof qVEIL_BRACED;
constexpr size_t kMaskedCharacters = 164;
constexpr size_t kLongestUnmasked = 170;

struct Text {
  const char* data;
  size_t length;
};

// One comparison: both texts, and the scheme that each is taken for.
struct Comparison {
  Text presented;
  int presentedScheme;
  Text stored;
  int storedScheme;
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

// Room for a formatted value. format_password clears it, so it starts as it is, and only what was formatted is wiped.
class WorkBuffer {
 public:
  WorkBuffer() = default;
  ~WorkBuffer() { wipe(bytes_, length_); }
  WorkBuffer(const WorkBuffer&) = delete;
  WorkBuffer& operator=(const WorkBuffer&) = delete;

  // Formats a clear text in the scheme, and with the salt, of the value that it is compared with.
  Text formatLike(const Text& clear, int scheme, const Text& value, AesKeyData* keyData) noexcept {
    CryptSalt salt(value);
    char* saltText = scheme == FORMAT_CRYPT ? salt.characters : nullptr;
    length_ = static_cast<size_t>(format_password(scheme, saltText, keyData, clear.data, static_cast<int>(clear.length),
                                                  bytes_, roomFor(scheme)));
    return {bytes_, length_};
  }

 private:
  // format_password clears its whole buffer, so it is told of no more than a value of fixed length needs.
  static int roomFor(int scheme) noexcept {
    const Scheme* row = findScheme(scheme);
    return static_cast<int>(row != nullptr && row->fixedLength != kMeasured ? kFixedRoom : kWorkSize);
  }

  char bytes_[kWorkSize];
  size_t length_ = 0;
};

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
  return compareTexts(work.formatLike(c.stored, c.presentedScheme, c.presented, c.keyData), c.presented);
}

// Tags compare without regard to case, payloads exactly. The tags differ when a missing key made another scheme of it.
int compareFormattedPresented(const Comparison& c) noexcept {
  WorkBuffer work;
  const Text made = work.formatLike(c.presented, c.storedScheme, c.stored, c.keyData);
  if (made.length != c.stored.length) return kNotCompared;
  const size_t tagBytes = findScheme(c.storedScheme)->tagBytes;
  if (!beginsWith(made.data, c.stored.data, tagBytes)) return kNotCompared;
  return compareTexts(behind(made, tagBytes), behind(c.stored, tagBytes));
}

// Two {SHA} values: one that carries a raw digest matches its base64 form.
int compareDigests(const Comparison& c) noexcept {
  WorkBuffer work;
  const Text made = work.formatLike(c.presented, FORMAT_SHA, c.presented, g_DirKeyData);
  return compareTexts(made.length != 0 ? made : c.presented, c.stored);
}

// The fixed number of characters that are taken of a masked value, terminated.
class MaskedText {
 public:
  explicit MaskedText(const Text& masked) noexcept {
    std::memcpy(copy_.text(), masked.data, masked.length < kMaskedCharacters ? masked.length : kMaskedCharacters);
  }
  int decode(char** clear) noexcept { return _morva_utils_decode_buffer(copy_.text(), clear); }

 private:
  SecretArray<kMaskedCharacters + 1> copy_;
};

// One side of a comparison in clear: a masked one decoded, any other as it is.
class Unmasked {
 public:
  Unmasked(const Text& side, int scheme) noexcept : text_(side) {
    if (scheme != FORMAT_QVEIL) return;
    char* clear = nullptr;
    failed_ = MaskedText(behind(side, kMaskedTag)).decode(&clear) != 0;
    clear_.reset(clear);
    if (!failed_ && clear != nullptr) text_ = {clear, std::strlen(clear)};
  }
  bool failed() const noexcept { return failed_; }
  const Text& text() const noexcept { return text_; }

 private:
  Text text_;
  bool failed_ = false;
  SecretOwner<char> clear_;
};

int compareUnmasked(const Comparison& c) noexcept {
  const Unmasked presented(c.presented, c.presentedScheme);
  const Unmasked stored(c.stored, c.storedScheme);
  if (presented.failed() || stored.failed()) return kNotCompared;
  return compareTexts(leading(presented.text()), leading(stored.text()));
}

// Which comparison a pair of schemes gets: the first row that fits.
constexpr int kAny = -1;
constexpr int kSameAsStored = -2;

struct Rule {
  int stored;
  int presented;
  int (*compare)(const Comparison&);
};

// The usual pairs, with a clear presented password, come first.
constexpr Rule kRules[] = {
    {FORMAT_SSHA, FORMAT_NONE, verifySalted},       {FORMAT_NONE, FORMAT_NONE, compareLeading},
    {FORMAT_QVEIL, kAny, compareUnmasked},          {FORMAT_VLDL, FORMAT_NONE, notComparable},
    {kAny, FORMAT_NONE, compareFormattedPresented}, {kAny, FORMAT_QVEIL, compareUnmasked},
    {FORMAT_SHA, FORMAT_SHA, compareDigests},       {kAny, kSameAsStored, compareLeading},
    {FORMAT_NONE, FORMAT_SSHA, verifySalted},  // not exchanged, so that no such pair of values matches: meant
    {FORMAT_NONE, kAny, compareFormattedStored},    {kAny, kAny, compareWhole},
};

int compare(const Comparison& c) noexcept {
  for (const Rule& rule : kRules) {
    const int presented = rule.presented == kSameAsStored ? c.storedScheme : rule.presented;
    if ((rule.stored == kAny || rule.stored == c.storedScheme) &&
        (presented == kAny || presented == c.presentedScheme)) {
      return rule.compare(c);
    }
  }
  return kNotCompared;
}

int unmaskValue(const char* value, char** clear, int* clearLength) noexcept {
  const char* masked = value[0] == '>' ? value : value + kMaskedTag;
  const int rc = MaskedText({masked, strnlen(masked, kMaskedCharacters)}).decode(clear);
  if (rc == 0 && *clear != nullptr && std::strlen(*clear) <= kLongestUnmasked) {
    if (clearLength != nullptr) *clearLength = static_cast<int>(std::strlen(*clear));
    return 1;
  }
  _morva_utils_decode_buffer_free(clear);
  return 0;
}

int decryptValue(const Scheme& scheme, const char* value, char** clear, AesKeyData* keyData,
                 int* clearLength) noexcept {
  if (keyData == nullptr) return 0;
  const int rc = aesDecryptBuffer(value + scheme.tagBytes, clear, g_CipherName[scheme.keyIndex],
                                  &keyData->aesKeys[scheme.keyIndex], &keyData->cryptoSalt, clearLength);
  return rc == 0 ? 1 : 0;
}

constexpr int kReversibleBit = 0x80;

}  // namespace
}  // namespace ldappw

using namespace ldappw;

extern "C" {

// Documented in password_schemes.h.

int verify_password(const char* presented, int presentedLength, const char* stored, int storedLength,
                    int presentedIsClear, AesKeyData* keyData) noexcept {
  TracedCall call{kVerifyPassword};
  if (presented == nullptr || stored == nullptr || presentedLength < 0 || storedLength < 0) {
    return call.leave(kNotCompared);
  }
  const int storedScheme = check_format(stored, static_cast<unsigned>(storedLength));
  const int presentedScheme =
      presentedIsClear != 0 ? int{FORMAT_NONE} : check_format(presented, static_cast<unsigned>(presentedLength));
  return call.leave(compare({{presented, static_cast<size_t>(presentedLength)},
                             presentedScheme,
                             {stored, static_cast<size_t>(storedLength)},
                             storedScheme,
                             keyData}));
}

int unformat_password(const char* value, char** clear, AesKeyData* keyData, int* clearLength) noexcept {
  TracedCall call{kUnformatPassword};
  if (value == nullptr || clear == nullptr) return call.leave(0);
  const int code = check_format(value, static_cast<unsigned>(std::strlen(value)));
  if (code == FORMAT_QVEIL) return call.leave(unmaskValue(value, clear, clearLength));
  const Scheme* scheme = findScheme(code);
  if (scheme != nullptr && scheme->fixedLength == kMeasured) {
    return call.leave(decryptValue(*scheme, value, clear, keyData, clearLength));
  }
  return call.failText(0, "Format:UNIMPLEMENTED pwd encoding %d\n", code);
}

int morva_decodePW(char** clear, const char* value, AesKeyData* keyData) noexcept {
  if (clear == nullptr) return LDAPPW_OPERATIONS_ERROR;
  *clear = nullptr;
  if (value == nullptr) return LDAPPW_OPERATIONS_ERROR;
  const size_t length = std::strlen(value);
  char* result = nullptr;
  int rc = LDAPPW_SUCCESS;
  if ((check_format(value, static_cast<unsigned>(length)) & kReversibleBit) != 0) {
    if (unformat_password(value, &result, keyData, nullptr) == 0) rc = LDAPPW_OTHER;
  } else {
    SecretText copy(value, length);  // the decoder writes to its text
    if (copy) _morva_utils_decode_buffer(copy.get(), &result);
  }
  *clear = result;
  return rc == LDAPPW_SUCCESS && result == nullptr ? LDAPPW_NO_MEMORY : rc;
}

}  // extern "C"
