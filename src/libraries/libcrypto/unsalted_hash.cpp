// SPDX-License-Identifier: Apache-2.0
// Plain digests through the crypto provider: the payload of {MD5} values. Its lines differ from the usual shape, and
// any provider value but 0 is a success here: both are meant.
#include <cstring>

#include "password_schemes.h"
#include "qel_utils.h"
#include "text_target.h"
#include "trace_scope.h"

namespace ldappw {
namespace {

constexpr TraceInfo kEncrypt{"unsaltedHashEncrypt",
                             operationScope(moduleId(kUnsaltedHash, 1)),
                             LineClass::debug,
                             Lines::leavingOnly,
                             nullptr,
                             "unsaltedHashEncrypt: Leaving. rc=%d\n"};

constexpr size_t kUsualDigest = 64;  // what needs no allocation

}  // namespace

int unsaltedHashTo(TextTarget& target, const char* digestName, const char* clear, size_t clearBytes) noexcept {
  TracedCall call{kEncrypt};
  if (clear == nullptr || target.slot() == nullptr) return call.leave(LDAPPW_OPERATIONS_ERROR);
  void* qelCtx = nullptr;
  if (const int rc = initQelCrypto(&qelCtx); rc != 0) return call.leave(rc);
  DigestContext digest(qelCtx);
  if (const int rc = digest.init(digestName); rc != 0) {
    return call.failText(rc, "Error - unsaltedHashEncrypt: initQelDigest() failed");
  }
  if (pQEL_EVP_DigestInit(qelCtx, digest.get(), digest.algorithm()) == 0) {
    return call.failText(LDAPPW_OPERATIONS_ERROR, "Error - unsaltedHashEncrypt: QEL_EVP_DigestInit() failed");
  }
  target.claim();
  const int size = pQEL_EVP_MD_size(qelCtx, digest.algorithm());
  const size_t bytes = size < 0 ? 0 : static_cast<size_t>(size);
  SecretBytes<kUsualDigest> raw(bytes);
  if (size < 0 || !raw) return call.failText(LDAPPW_NO_MEMORY, "Error - unsaltedHashEncrypt : calloc() failed\n");
  std::memset(raw.get(), 0, bytes);
  if (pQEL_EVP_DigestUpdate(qelCtx, digest.get(), clear, static_cast<unsigned>(clearBytes)) == 0) {
    return call.failText(LDAPPW_OPERATIONS_ERROR, "Error - unsaltedHashEncrypt: QEL_EVP_DigestUpdate() failed");
  }
  if (pQEL_EVP_DigestFinal(qelCtx, digest.get(), raw.get(), nullptr) == 0) {
    return call.failText(LDAPPW_OPERATIONS_ERROR, "Error - unsaltedHashEncrypt: QEL_EVP_DigestFinal() failed");
  }
  if (!target.write(raw.get(), bytes)) {
    return call.failText(LDAPPW_OPERATIONS_ERROR,
                         "Error - unsaltedHashEncrypt: binaryBlobToBase64()returned NULL. rc = %d\n",
                         static_cast<int>(LDAPPW_OPERATIONS_ERROR));
  }
  return call.leave(LDAPPW_SUCCESS);
}

}  // namespace ldappw

using namespace ldappw;

extern "C" {

// Documented in password_schemes.h.

int unsaltedHashEncrypt(const char* digestName, const char* clear, char** out) noexcept {
  TextTarget target(out);
  return unsaltedHashTo(target, digestName, clear, lengthOf(clear));
}

}  // extern "C"
