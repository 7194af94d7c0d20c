// SPDX-License-Identifier: Apache-2.0
// Plain digests through the crypto provider: the payload of {MD5} values. Its lines differ from the usual shape, and
// any provider value but 0 is a success here: both are meant.
#include <cstring>

#include "password_schemes.h"
#include "qel_utils.h"
#include "trace_scope.h"

namespace ldappw {
namespace {

constexpr TraceInfo kEncrypt{"unsaltedHashEncrypt",
                             operationScope(moduleId(kUnsaltedHash, 1)),
                             LineClass::debug,
                             Lines::leavingOnly,
                             nullptr,
                             "unsaltedHashEncrypt: Leaving. rc=%d\n"};

}  // namespace
}  // namespace ldappw

using namespace ldappw;

extern "C" {

// Documented in password_schemes.h.

int unsaltedHashEncrypt(const char* digestName, const char* clear, char** out) noexcept {
  TracedCall call{kEncrypt};
  if (clear == nullptr || out == nullptr) return call.leave(LDAPPW_OPERATIONS_ERROR);
  void* qelCtx = nullptr;
  if (const int rc = initQelCrypto(&qelCtx); rc != 0) return call.leave(rc);
  DigestContext digest(qelCtx);
  if (const int rc = digest.init(digestName); rc != 0) {
    return call.failText(rc, "Error - unsaltedHashEncrypt: initQelDigest() failed");
  }
  if (pQEL_EVP_DigestInit(qelCtx, digest.get(), digest.algorithm()) == 0) {
    return call.failText(LDAPPW_OPERATIONS_ERROR, "Error - unsaltedHashEncrypt: QEL_EVP_DigestInit() failed");
  }
  OutGuard result{out};
  const int size = pQEL_EVP_MD_size(qelCtx, digest.algorithm());
  *out = size < 0 ? nullptr : zeroedBytes<char>(static_cast<size_t>(size));
  if (*out == nullptr) return call.failText(LDAPPW_NO_MEMORY, "Error - unsaltedHashEncrypt : calloc() failed\n");
  auto* raw = reinterpret_cast<unsigned char*>(*out);
  if (pQEL_EVP_DigestUpdate(qelCtx, digest.get(), clear, static_cast<unsigned>(std::strlen(clear))) == 0) {
    return call.failText(LDAPPW_OPERATIONS_ERROR, "Error - unsaltedHashEncrypt: QEL_EVP_DigestUpdate() failed");
  }
  if (pQEL_EVP_DigestFinal(qelCtx, digest.get(), raw, nullptr) == 0) {
    return call.failText(LDAPPW_OPERATIONS_ERROR, "Error - unsaltedHashEncrypt: QEL_EVP_DigestFinal() failed");
  }
  char* text = binaryBlobToBase64(raw, size);
  if (text == nullptr) {
    return call.failText(LDAPPW_OPERATIONS_ERROR,
                         "Error - unsaltedHashEncrypt: binaryBlobToBase64()returned NULL. rc = %d\n",
                         static_cast<int>(LDAPPW_OPERATIONS_ERROR));
  }
  result.keep(text);
  return call.leave(LDAPPW_SUCCESS);
}

}  // extern "C"
