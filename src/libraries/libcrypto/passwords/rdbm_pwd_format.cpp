// SPDX-License-Identifier: Apache-2.0
// Making stored values: one payload maker a scheme.
#include "passwords/rdbm_pwd_format.h"

#include <cstring>
#include <iterator>

#include "crypt/crypt_hash.h"
#include "digests/sha.h"
#include "support/text_target.h"

namespace ldappw {
namespace {

constexpr TraceInfo kFormatPassword = passwordOperation("format_password", kFormatPasswordId);

constexpr size_t kDigestBytes = sizeof(sha_digest);
constexpr size_t kCryptKeyBytes = 8;  // that count
constexpr size_t kMaskedClear = 46;   // a longer password is cut silently, as in every stored value (EachScheme suite)
constexpr size_t kMaskedCharacters = 164;

// The clear text up to a first NUL, behind which nothing is read, since it may be the end of what there is.
size_t bytesBeforeNul(const FormatRequest& request) noexcept {
  return strnlen(request.clear, request.clearBytes);
}

size_t least(size_t a, size_t b) noexcept {
  return a < b ? a : b;
}

size_t most(size_t a, size_t b) noexcept {
  return a > b ? a : b;
}

// ---- The makers ----

// Each writes a payload to its target, where the scheme's own always fits, and returns its length, 0 for failure.
using PayloadMaker = size_t (*)(TracedCall& call, const Scheme& scheme, const FormatRequest& request,
                                TextTarget& target);

size_t makeClear(TracedCall&, const Scheme&, const FormatRequest& request, TextTarget& target) noexcept {
  if (request.clearBytes != 0) std::memcpy(target.payload, request.clear, request.clearBytes);
  return request.clearBytes;
}

// Digests a clear text in which every byte after a first NUL counts as NUL. False when memory runs out.
bool digestBeforeNul(const FormatRequest& request, size_t before, sha_digest& digest) noexcept {
  SecretBytes<256> copy(request.clearBytes);
  if (!copy) return false;
  std::memcpy(copy.get(), request.clear, before);
  digestBytes(copy.get(), request.clearBytes, &digest);
  return true;
}

bool digestClear(const FormatRequest& request, sha_digest& digest) noexcept {
  const size_t before = bytesBeforeNul(request);
  if (before != request.clearBytes) return digestBeforeNul(request, before, digest);
  digestBytes(reinterpret_cast<const unsigned char*>(request.clear), request.clearBytes, &digest);
  return true;
}

// The bytes after the tag as a digest; what is not there counts as NUL.
void takeDigest(const FormatRequest& request, size_t tagBytes, unsigned char* digest) noexcept {
  std::memcpy(digest, request.clear + tagBytes, least(request.clearBytes - tagBytes, kDigestBytes));
}

size_t makeSha(TracedCall& call, const Scheme& scheme, const FormatRequest& request, TextTarget& target) noexcept {
  sha_digest digest{};
  auto* digestBytes = reinterpret_cast<unsigned char*>(&digest);
  const bool isTagged = !request.isClear && bytesBeforeNul(request) >= scheme.tagBytes && hasTag(request.clear, scheme);
  if (isTagged && request.clearBytes == kShaValue) {
    call.line(LineClass::debug,
              "format_password: This pwd update is in SHA format and is from an ORVEX supplier. Do nothing.\n");
    return 0;
  }
  if (isTagged) {
    call.line(LineClass::debug,
              "format_password: This pwd update is in SHA format and is NOT from an ORVEX supplier. Base64 it.\n");
    takeDigest(request, scheme.tagBytes, digestBytes);
  } else if (!digestClear(request, digest)) {
    return 0;
  }
  return writeBase64(target, digestBytes, kDigestBytes) ? target.length : 0;
}

size_t makeMd5(TracedCall&, const Scheme&, const FormatRequest& request, TextTarget& target) noexcept {
  return unsaltedHashTo(target, "md5", request.clear, bytesBeforeNul(request)) == 0 ? target.length : 0;
}

size_t makeSsha(TracedCall&, const Scheme&, const FormatRequest& request, TextTarget& target) noexcept {
  return saltedHashTo(target, request.clear, bytesBeforeNul(request), kSaltedDigest) == 0 ? target.length : 0;
}

size_t makeCrypt(TracedCall&, const Scheme&, const FormatRequest& request, TextTarget& target) noexcept {
  SecretArray<kCryptKeyBytes + 1> key;
  std::memcpy(key.data(), request.clear, strnlen(request.clear, least(request.clearBytes, kCryptKeyBytes)));
  const CryptInput input(key.text(), request.salt);
  writeCryptText(input.salt(), input.hash(), target.payload);
  return kCryptCharacters;
}

size_t makeMasked(TracedCall&, const Scheme&, const FormatRequest& request, TextTarget& target) noexcept {
  SecretArray<kMaskedClear + 1> clear;
  std::memcpy(clear.data(), request.clear, strnlen(request.clear, least(request.clearBytes, kMaskedClear)));
  char* made = nullptr;
  const int rc = _morva_utils_encode_buffer(clear.text(), &made);
  const PlainOwner<char> encoded(made);
  if (rc != 0) return 0;
  std::memcpy(target.payload, encoded.get(), kMaskedCharacters);
  return kMaskedCharacters;
}

size_t makeAes(TracedCall&, const Scheme& scheme, const FormatRequest& request, TextTarget& target) noexcept {
  if (request.keyData == nullptr) return 0;
  const int rc =
      aesEncryptTo(target, request.clear, g_CipherName[scheme.keyIndex], &request.keyData->aesKeys[scheme.keyIndex],
                   &request.keyData->cryptoSalt, static_cast<int>(request.clearBytes));
  return rc == 0 ? target.length : 0;
}

struct MakerRow {
  int code;
  PayloadMaker make;
};

// In the order of the scheme table.
constexpr MakerRow kMakers[] = {
    {FORMAT_NONE, makeClear}, {FORMAT_SSHA, makeSsha},    {FORMAT_SHA, makeSha},    {FORMAT_CRYPT, makeCrypt},
    {FORMAT_MD5, makeMd5},    {FORMAT_QVEIL, makeMasked}, {FORMAT_AES256, makeAes}, {FORMAT_AES192, makeAes},
    {FORMAT_AES128, makeAes}, {FORMAT_VLDL, nullptr},
};

constexpr bool fitTheSchemes() {
  for (size_t i = 0; i < std::size(kSchemes); ++i) {
    const bool isMade = kSchemes[i].fixedLength != kNeverMade;
    if (kMakers[i].code != kSchemes[i].code || (kMakers[i].make != nullptr) != isMade) return false;
  }
  return std::size(kMakers) == std::size(kSchemes);
}
static_assert(fitTheSchemes(), "a maker for each scheme that can be made");

// ---- Formatting ----

int unknown(TracedCall& call, int code) noexcept {
  call.line(LineClass::debug, "Error - format_password: Format-UNKNOWN pwd encoding %d\n", code);
  return 0;
}

int formattedValue(TracedCall& call, const Scheme& asked, const FormatRequest& request, char* out,
                   size_t outSize) noexcept {
  const Scheme& scheme = schemeToMake(asked, request.keyData);
  if (scheme.fixedLength == kNeverMade) return unknown(call, scheme.code);
  const int length = valueLength(scheme, static_cast<int>(request.clearBytes));
  if (length < 0 || outSize < static_cast<size_t>(length)) return 0;
  if (scheme.code == FORMAT_CRYPT && request.salt == nullptr) return 0;
  std::memcpy(out, scheme.tag, scheme.tagBytes);
  if (outSize - scheme.tagBytes < scheme.payloadRoom) return 0;
  // A {MD5} value takes the room of its text whatever outSize is, as long as that is the scheme's least.
  const size_t room = most(outSize - scheme.tagBytes, encodedLength(scheme.payloadRoom));
  TextTarget target = behindTag(out + scheme.tagBytes, room);
  const size_t payload = kMakers[&scheme - kSchemes].make(call, scheme, request, target);
  return payload == 0 ? 0 : static_cast<int>(scheme.tagBytes + payload);
}

}  // namespace

bool digestValue(const FormatRequest& request, sha_digest& digest) noexcept {
  TracedCall call{kFormatPassword};
  return call.leave(isWholeAlphabet(pBase64) && digestClear(request, digest) ? kShaValue : 0) != 0;
}

int formatValue(const Scheme& scheme, const FormatRequest& request, char* out, size_t outSize) noexcept {
  TracedCall call{kFormatPassword};
  return call.leave(formattedValue(call, scheme, request, out, outSize));
}

}  // namespace ldappw

using namespace ldappw;

extern "C" {

// Documented in password_schemes.h.

int format_password(int scheme, char* salt, AesKeyData* keyData, const char* clear, int clearLength, char* out,
                    int outSize) noexcept {
  TracedCall call{kFormatPassword};
  if (clear == out || out == nullptr || outSize < 0) return call.leave(0);
  const auto room = static_cast<size_t>(outSize);
  std::memset(out, 0, room);  // also for what is refused
  if (clear == nullptr || clearLength < 0) return call.leave(0);
  const Scheme* row = findScheme(scheme);
  if (row == nullptr) return call.leave(unknown(call, scheme));
  const FormatRequest request{clear, static_cast<size_t>(clearLength), salt, keyData, false};
  return call.leave(formattedValue(call, *row, request, out, room));
}

}  // extern "C"
