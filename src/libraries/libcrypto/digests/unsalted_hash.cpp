// SPDX-License-Identifier: Apache-2.0
// Plain digests through the crypto provider: the payload of {MD5} values. Log readers match the lines as they are,
// which lack the code, the newline or a blank here and there, and there is none about entering. Any value of the
// provider but 0 is a success. Ledger and SaltedAndUnsalted pin both.
#include "password_schemes.h"

#include <cstring>

#include "provider/qel_utils.h"
#include "support/text_target.h"
#include "support/trace_scope.h"

namespace ldappw {
namespace {

constexpr TraceInfo kEncrypt{{moduleId(kUnsaltedHash, 1), kOperationLevel, kOperationMask},
                             "unsaltedHashEncrypt",
                             LineClass::debug,
                             {},
                             Lines::leavingOnly,
                             nullptr,
                             "unsaltedHashEncrypt: Leaving. rc=%d\n"};

constexpr size_t kUsualDigest = 64;  // what needs no allocation

}  // namespace

int unsaltedHashTo(TextTarget& target, const char* digestName, const char* clear, size_t clearBytes) noexcept {
  TracedCall call{kEncrypt};
  if (anyNull(clear, target.address()) || clearBytes > UINT32_MAX) return call.leave(LDAPPW_OPERATIONS_ERROR);
  void* qelCtx = nullptr;
  if (const int rc = initQelCrypto(&qelCtx); rc != 0) return call.leave(rc);
  DigestOwner digest(qelCtx);
  if (const int rc = digest.open(digestName); rc != 0) {
    return call.failText(rc, "Error - unsaltedHashEncrypt: initQelDigest() failed");
  }
  if (digest.init() == 0) {
    return call.failText(LDAPPW_OPERATIONS_ERROR, "Error - unsaltedHashEncrypt: QEL_EVP_DigestInit() failed");
  }
  OutGuard<char> result(target.slot);
  const size_t bytes = digest.size();
  if (bytes == 0)
    return call.failText(LDAPPW_OPERATIONS_ERROR, "Error - unsaltedHashEncrypt: QEL_EVP_MD_size() failed");
  SecretBytes<kUsualDigest> raw(bytes);
  if (!raw) return call.failText(LDAPPW_NO_MEMORY, "Error - unsaltedHashEncrypt : calloc() failed\n");
  if (digest.update(clear, static_cast<uint32_t>(clearBytes)) == 0) {
    return call.failText(LDAPPW_OPERATIONS_ERROR, "Error - unsaltedHashEncrypt: QEL_EVP_DigestUpdate() failed");
  }
  if (digest.final(raw.get(), nullptr) == 0) {
    return call.failText(LDAPPW_OPERATIONS_ERROR, "Error - unsaltedHashEncrypt: QEL_EVP_DigestFinal() failed");
  }
  if (!writeBase64(target, raw.get(), bytes)) {
    return call.failText(LDAPPW_OPERATIONS_ERROR,
                         "Error - unsaltedHashEncrypt: binaryBlobToBase64()returned NULL. rc = %d\n",
                         static_cast<int>(LDAPPW_OPERATIONS_ERROR));
  }
  result.keep();
  return call.leave(LDAPPW_SUCCESS);
}

}  // namespace ldappw

using namespace ldappw;

extern "C" {

// Documented in password_schemes.h.

int unsaltedHashEncrypt(const char* digestName, const char* clear, char** out) noexcept {
  TextTarget target = toSlot(out);
  return unsaltedHashTo(target, digestName, clear, lengthOf(clear));
}

}  // extern "C"
