// SPDX-License-Identifier: Apache-2.0
// Salted digests through the crypto provider: the payload of {SSHA} values.
#include <climits>
#include <cstring>

#include "base64.h"
#include "password_schemes.h"
#include "qel_utils.h"
#include "text_target.h"
#include "trace_scope.h"

namespace ldappw {
namespace {

constexpr TraceInfo kEncrypt{"saltedHashEncrypt", operationScope(moduleId(kSaltedHash, 1)), LineClass::debug};
constexpr TraceInfo kVerify{"saltedHashVerify", operationScope(moduleId(kSaltedHash, 2)), LineClass::debug};

// What needs no allocation; a {SSHA} value is well within it.
constexpr size_t kUsualDigest = 64;
constexpr size_t kUsualText = 128;

// Digests clear text and salt into out.
int digestSalted(TracedCall& call, void* qelCtx, const DigestContext& digest, const char* clear, size_t clearBytes,
                 const unsigned char* salt, unsigned saltBytes, unsigned char* out) noexcept {
  if (pQEL_EVP_DigestInit(qelCtx, digest.get(), digest.algorithm()) != 1) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "QEL_EVP_DigestInit() failed.");
  }
  if (pQEL_EVP_DigestUpdate(qelCtx, digest.get(), clear, static_cast<unsigned>(clearBytes)) != 1 ||
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

int saltedHashTo(TextTarget& target, const char* clear, size_t clearBytes, const char* digestName) noexcept {
  TracedCall call{kEncrypt, "clear", clear, "out", target.slot(), "digestName", digestName};
  if (clear == nullptr || target.slot() == nullptr || digestName == nullptr) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "Invalid parameter.");
  }
  void* qelCtx = nullptr;
  if (const int rc = initQelCrypto(&qelCtx); rc != 0) return call.fail(rc, "initQelCrypto() failed.");
  target.claim();
  DigestContext digest(qelCtx);
  if (const int rc = digest.init(digestName); rc != 0) return call.fail(rc, "initQelDigest() failed.");

  const int size = pQEL_EVP_MD_size(qelCtx, digest.algorithm());
  if (size <= 0) return call.fail(LDAPPW_OPERATIONS_ERROR, "QEL_EVP_MD_size() failed.");
  const auto bytes = static_cast<unsigned>(size);
  SecretBytes<2 * kUsualDigest> raw(size_t{2} * bytes);
  if (!raw) return call.fail(LDAPPW_NO_MEMORY, "calloc() returned NULL.");
  std::memset(raw.get(), 0, size_t{2} * bytes);
  unsigned char* salt = raw.get() + bytes;
  if (pQEL_RAND_bytes(qelCtx, salt, size) != 1) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "QEL_RAND_bytes() failed.");
  }
  if (const int rc = digestSalted(call, qelCtx, digest, clear, clearBytes, salt, bytes, raw.get()); rc != 0) return rc;
  if (!target.write(raw.get(), size_t{2} * bytes)) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "binaryBlobToBase64() returned NULL.");
  }
  return call.leave(LDAPPW_SUCCESS);
}

int saltedHashCheck(const char* clear, size_t clearBytes, const char* stored, size_t storedBytes,
                    const char* digestName) noexcept {
  TracedCall call{kVerify, "clear", clear, "stored", stored, "digestName", digestName};
  if (clear == nullptr || stored == nullptr || digestName == nullptr) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "Invalid parameter.");
  }
  PlainBytes<decodedRoom(kUsualText)> decoded(decodedRoom(storedBytes));
  const DecodedText given = decoded ? decodeText(stored, storedBytes, pBase64, decoded.get()) : DecodedText{0, false};
  if (!given.isClean || storedBytes > INT_MAX) {
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
  if (const int rc = digestSalted(call, qelCtx, digest, clear, clearBytes, salt, decodedBytes - bytes, fresh.get());
      rc != 0) {
    return rc;
  }
  return call.leave(equalBytes(fresh.get(), decoded.get(), bytes) ? LDAPPW_SUCCESS : LDAPPW_INVALID_CREDENTIALS);
}

}  // namespace ldappw

using namespace ldappw;

extern "C" {

// Documented in password_schemes.h.

int saltedHashEncrypt(const char* clear, char** out, const char* digestName) noexcept {
  TextTarget target(out);
  return saltedHashTo(target, clear, lengthOf(clear), digestName);
}

int saltedHashVerify(const char* clear, const char* stored, const char* digestName) noexcept {
  return saltedHashCheck(clear, lengthOf(clear), stored, lengthOf(stored), digestName);
}

}  // extern "C"
