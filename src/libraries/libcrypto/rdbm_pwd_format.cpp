// SPDX-License-Identifier: Apache-2.0
// Making stored values: the scheme table and one payload maker a scheme.
#include <cstring>

#include "crypt_state.h"
#include "mutex_lock.h"
#include "owners.h"
#include "password_schemes.h"
#include "rdbm_pwd_schemes.h"
#include "text_target.h"

namespace ldappw {
namespace {

constexpr TraceInfo kFormatPassword = passwordOperation("format_password", kFormatPasswordId);

constexpr size_t kDigestBytes = sizeof(sha_digest);
constexpr size_t kCryptKeySize = 1024;
constexpr size_t kCryptCharacters = 13;
constexpr size_t kMaskedKeySize = 50;
constexpr size_t kMaskedClear = 46;  // longer passwords are cut without notice: meant
constexpr size_t kMaskedCharacters = 164;
constexpr size_t kFormattedSha = 33;

// _crypt works on one process-wide state; this is the library's only lock on the way of passwords.
pthread_mutex_t cryptMutex = PTHREAD_MUTEX_INITIALIZER;

// Bytes of the clear text from offset on, zeros where there are none.
void takeFixed(unsigned char* to, size_t bytes, const FormatRequest& request, size_t offset) noexcept {
  std::memset(to, 0, bytes);
  if (request.clearBytes <= offset) return;
  const size_t given = request.clearBytes - offset;
  std::memcpy(to, request.clear + offset, given < bytes ? given : bytes);
}

// The digest of the clear text, in which every byte after a first NUL counts as NUL. False when memory runs out.
bool digestClear(const FormatRequest& request, sha_digest& digest) noexcept {
  const void* nul = request.clearBytes == 0 ? nullptr : std::memchr(request.clear, '\0', request.clearBytes);
  if (nul == nullptr) {
    SHA(const_cast<char*>(request.clear), request.clearBytes, &digest);
    return true;
  }
  SecretText copy(request.clear, request.clearBytes);
  if (!copy) return false;
  const auto before = static_cast<size_t>(static_cast<const char*>(nul) - request.clear);
  std::memset(copy.get() + before, 0, request.clearBytes - before);
  SHA(copy.get(), request.clearBytes, &digest);
  return true;
}

size_t makeSha(TracedCall& call, const Scheme& scheme, const FormatRequest& request, char* payload) noexcept {
  sha_digest digest{};
  auto* digestBytes = reinterpret_cast<unsigned char*>(&digest);
  const bool tagged = request.clearBytes >= scheme.tagBytes && beginsWith(request.clear, scheme.tag, scheme.tagBytes);
  if (tagged && request.clearBytes == kFormattedSha) {
    call.line(LineClass::debug,
              "format_password: This pwd update is in SHA format and is from an ORVEX supplier. Do nothing.\n");
    return 0;
  }
  if (tagged) {
    call.line(LineClass::debug,
              "format_password: This pwd update is in SHA format and is NOT from an ORVEX supplier. Base64 it.\n");
    takeFixed(digestBytes, kDigestBytes, request, scheme.tagBytes);
  } else if (!digestClear(request, digest)) {
    return 0;
  }
  TextTarget target(payload);
  return target.write(digestBytes, kDigestBytes) ? target.length() : 0;
}

// What the digests of the provider take: the clear text up to a first NUL.
size_t bytesBeforeNul(const FormatRequest& request) noexcept {
  return strnlen(request.clear, request.clearBytes);
}

size_t makeMd5(TracedCall&, const Scheme&, const FormatRequest& request, char* payload) noexcept {
  TextTarget target(payload);
  return unsaltedHashTo(target, "md5", request.clear, bytesBeforeNul(request)) == 0 ? target.length() : 0;
}

size_t makeSsha(TracedCall&, const Scheme&, const FormatRequest& request, char* payload) noexcept {
  TextTarget target(payload);
  return saltedHashTo(target, request.clear, bytesBeforeNul(request), kSaltedDigest) == 0 ? target.length() : 0;
}

size_t makeCrypt(TracedCall&, const Scheme&, const FormatRequest& request, char* payload) noexcept {
  SecretArray<kCryptKeySize> key;
  takeFixed(key.data(), kCryptKeySize - 1, request, 0);
  const MutexLock lock(cryptMutex);
  std::memcpy(payload, _crypt(key.text(), request.salt), kCryptCharacters);
  wipeCryptState();
  return kCryptCharacters;
}

size_t makeMasked(TracedCall&, const Scheme&, const FormatRequest& request, char* payload) noexcept {
  SecretArray<kMaskedKeySize> clear;
  takeFixed(clear.data(), kMaskedClear, request, 0);
  char* made = nullptr;
  const int rc = _morva_utils_encode_buffer(clear.text(), &made);
  const PlainOwner<char> encoded(made);
  if (rc != 0) return 0;
  std::memcpy(payload, encoded.get(), kMaskedCharacters);
  return kMaskedCharacters;
}

size_t makeAes(TracedCall&, const Scheme& scheme, const FormatRequest& request, char* payload) noexcept {
  if (request.keyData == nullptr) return 0;
  TextTarget target(payload);
  const int rc =
      aesEncryptTo(target, request.clear, g_CipherName[scheme.keyIndex], &request.keyData->aesKeys[scheme.keyIndex],
                   &request.keyData->cryptoSalt, static_cast<int>(request.clearBytes));
  return rc == 0 ? target.length() : 0;
}

constexpr int kNoKey = -1;

// The most wanted come first. The 21 of MD5 is less than the 29 characters that it writes: meant, as are the shorter
// rooms of the digests.
constexpr Scheme kSchemes[] = {{FORMAT_AES256, AES256_BRACED, sizeof AES256_BRACED, kMeasured, 0, 2, makeAes},
                               {FORMAT_SSHA, SSHA_BRACED, sizeof SSHA_BRACED, 62, 40, kNoKey, makeSsha},
                               {FORMAT_SHA, SHA_BRACED, sizeof SHA_BRACED, 33, 20, kNoKey, makeSha},
                               {FORMAT_MD5, MD5_BRACED, sizeof MD5_BRACED, 21, 16, kNoKey, makeMd5},
                               {FORMAT_CRYPT, crypt_BRACED, sizeof crypt_BRACED, 20, 13, kNoKey, makeCrypt},
                               {FORMAT_QVEIL, qVEIL_BRACED, sizeof qVEIL_BRACED, 171, 164, kNoKey, makeMasked},
                               {FORMAT_AES192, AES192_BRACED, sizeof AES192_BRACED, kMeasured, 0, 1, makeAes},
                               {FORMAT_AES128, AES128_BRACED, sizeof AES128_BRACED, kMeasured, 0, 0, makeAes}};

int copyClear(const FormatRequest& request, char* out, size_t outSize) noexcept {
  if (outSize < request.clearBytes) return 0;
  if (request.clearBytes != 0) std::memcpy(out, request.clear, request.clearBytes);
  return static_cast<int>(request.clearBytes);
}

// Writes the value into the cleared buffer.
int formatValue(TracedCall& call, const Scheme& scheme, const FormatRequest& request, char* out,
                size_t outSize) noexcept {
  const int least = valueLength(scheme, static_cast<int>(request.clearBytes));
  if (least < 0 || outSize < static_cast<size_t>(least)) return 0;
  if (scheme.code == FORMAT_CRYPT && request.salt == nullptr) return 0;
  std::memcpy(out, scheme.tag, scheme.tagBytes);
  if (outSize - scheme.tagBytes < scheme.payloadRoom) return 0;
  const size_t payload = scheme.make(call, scheme, request, out + scheme.tagBytes);
  return payload == 0 ? 0 : static_cast<int>(scheme.tagBytes + payload);
}

}  // namespace

const Scheme* findScheme(int code) noexcept {
  for (const Scheme& scheme : kSchemes) {
    if (scheme.code == code) return &scheme;
  }
  return nullptr;
}

}  // namespace ldappw

using namespace ldappw;

extern "C" {

// Documented in password_schemes.h.

int format_password(int scheme, char* salt, AesKeyData* keyData, const char* clear, int clearLength, char* out,
                    int outSize) noexcept {
  TracedCall call{kFormatPassword};
  if (clear == out) return call.leave(0);
  if (out == nullptr || outSize < 0) return call.leave(0);
  const auto room = static_cast<size_t>(outSize);
  std::memset(out, 0, room);  // also for what is refused
  if (clear == nullptr || clearLength < 0) return call.leave(0);
  if (keyData == nullptr && scheme == FORMAT_AES256) scheme = FORMAT_QVEIL;  // this one alone: meant
  const FormatRequest request{clear, static_cast<size_t>(clearLength), salt, keyData};
  if (scheme == FORMAT_NONE) return call.leave(copyClear(request, out, room));
  if (const Scheme* row = findScheme(scheme)) return call.leave(formatValue(call, *row, request, out, room));
  return call.failText(0, "Error - format_password: Format-UNKNOWN pwd encoding %d\n", scheme);
}

}  // extern "C"
