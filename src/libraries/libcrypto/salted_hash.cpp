// SPDX-License-Identifier: Apache-2.0
// Salted digests through the crypto provider: the payload of {SSHA} values.
#include <climits>
#include <cstring>

#include "base64.h"
#include "password_schemes.h"
#include "qel_utils.h"
#include "trace_scope.h"

namespace ldappw {
namespace {

constexpr TraceInfo kEncrypt{"saltedHashEncrypt", operationScope(moduleId(kSaltedHash, 1)), LineClass::debug};
constexpr TraceInfo kVerify{"saltedHashVerify", operationScope(moduleId(kSaltedHash, 2)), LineClass::debug};

// What needs no allocation; a {SSHA} value is well within it.
constexpr size_t kUsualDigest = 64;
constexpr size_t kUsualText = 128;

// Digests clear text and salt into out.
int digestSalted(TracedCall& call, void* qelCtx, const DigestContext& digest, const char* clear,
                 const unsigned char* salt, unsigned saltBytes, unsigned char* out) noexcept {
  if (pQEL_EVP_DigestInit(qelCtx, digest.get(), digest.algorithm()) != 1) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "QEL_EVP_DigestInit() failed.");
  }
  const auto clearBytes = static_cast<unsigned>(std::strlen(clear));
  if (pQEL_EVP_DigestUpdate(qelCtx, digest.get(), clear, clearBytes) != 1 ||
      pQEL_EVP_DigestUpdate(qelCtx, digest.get(), salt, saltBytes) != 1) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "QEL_EVP_DigestUpdate() failed.");
  }
  unsigned written = 0;
  if (pQEL_EVP_DigestFinal(qelCtx, digest.get(), out, &written) != 1) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "QEL_EVP_DigestFinal() failed.");
  }
  return LDAPPW_SUCCESS;
}

}  // namespace
}  // namespace ldappw

using namespace ldappw;

extern "C" {

// Documented in password_schemes.h.

int saltedHashEncrypt(const char* clear, char** out, const char* digestName) noexcept {
  TracedCall call{kEncrypt, "clear", clear, "out", out, "digestName", digestName};
  if (clear == nullptr || out == nullptr || digestName == nullptr) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "Invalid parameter.");
  }
  void* qelCtx = nullptr;
  if (const int rc = initQelCrypto(&qelCtx); rc != 0) return call.fail(rc, "initQelCrypto() failed.");
  OutGuard result{out};
  DigestContext digest(qelCtx);
  if (const int rc = digest.init(digestName); rc != 0) return call.fail(rc, "initQelDigest() failed.");

  const int size = pQEL_EVP_MD_size(qelCtx, digest.algorithm());
  if (size <= 0) return call.fail(LDAPPW_OPERATIONS_ERROR, "QEL_EVP_MD_size() failed.");
  const auto bytes = static_cast<unsigned>(size);
  *out = zeroedBytes<char>(size_t{2} * bytes);
  if (*out == nullptr) return call.fail(LDAPPW_NO_MEMORY, "calloc() returned NULL.");
  auto* raw = reinterpret_cast<unsigned char*>(*out);
  unsigned char* salt = raw + bytes;
  if (pQEL_RAND_bytes(qelCtx, salt, size) != 1) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "QEL_RAND_bytes() failed.");
  }
  if (const int rc = digestSalted(call, qelCtx, digest, clear, salt, bytes, raw); rc != 0) return rc;
  char* text = binaryBlobToBase64(raw, 2 * size);
  if (text == nullptr) return call.fail(LDAPPW_OPERATIONS_ERROR, "binaryBlobToBase64() returned NULL.");
  result.keep(text);
  return call.leave(LDAPPW_SUCCESS);
}

int saltedHashVerify(const char* clear, const char* stored, const char* digestName) noexcept {
  TracedCall call{kVerify, "clear", clear, "stored", stored, "digestName", digestName};
  if (clear == nullptr || stored == nullptr || digestName == nullptr) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "Invalid parameter.");
  }
  const size_t storedLength = std::strlen(stored);
  PlainBytes<decodedRoom(kUsualText)> decoded(decodedRoom(storedLength));
  const DecodedText given = decoded ? decodeText(stored, storedLength, pBase64, decoded.get()) : DecodedText{0, false};
  if (!given.isClean || storedLength > INT_MAX) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "base64ToBinaryBlob() returned NULL.");
  }
  const auto decodedBytes = static_cast<unsigned>(given.bytes);
  void* qelCtx = nullptr;
  if (const int rc = initQelCrypto(&qelCtx); rc != 0) return call.fail(rc, "initQelCrypto() failed.");
  DigestContext digest(qelCtx);
  if (const int rc = digest.init(digestName); rc != 0) return call.fail(rc, "initQelDigest() failed.");

  const int size = pQEL_EVP_MD_size(qelCtx, digest.algorithm());
  if (size <= 0) return call.fail(LDAPPW_OPERATIONS_ERROR, "QEL_EVP_MD_size() failed.");
  const auto bytes = static_cast<unsigned>(size);
  if (decodedBytes < bytes) return call.fail(LDAPPW_OPERATIONS_ERROR, "Stored value shorter than the digest.");
  SecretBytes<kUsualDigest> fresh(bytes);
  if (!fresh) return call.fail(LDAPPW_NO_MEMORY, "calloc() returned NULL.");
  const unsigned char* salt = decoded.get() + bytes;
  if (const int rc = digestSalted(call, qelCtx, digest, clear, salt, decodedBytes - bytes, fresh.get()); rc != 0) {
    return rc;
  }
  return call.leave(equalBytes(fresh.get(), decoded.get(), bytes) ? LDAPPW_SUCCESS : LDAPPW_INVALID_CREDENTIALS);
}

}  // extern "C"
