// SPDX-License-Identifier: Apache-2.0
// Salted digests through the crypto provider: the payload of {SSHA} values.
#include "password_schemes.h"

#include <climits>
#include <cstring>

#include "provider/qel_utils.h"
#include "support/text_target.h"
#include "support/trace_scope.h"

namespace ldappw {
namespace {

constexpr TraceInfo kEncrypt = operation(kSaltedHash, 1, "saltedHashEncrypt", {"clear", "out", "digestName"});
constexpr TraceInfo kVerify = operation(kSaltedHash, 2, "saltedHashVerify", {"clear", "stored", "digestName"});

// What needs no allocation; a {SSHA} value is well within it.
constexpr size_t kUsualDigest = 64;
constexpr size_t kUsualText = 128;

struct Bytes {
  const void* data;
  size_t length;
};

bool update(const Digest& digest, const Bytes& bytes) noexcept {
  return bytes.length <= UINT32_MAX && digest.update(bytes.data, static_cast<uint32_t>(bytes.length)) == 1;
}

// Digests clear text and salt into out.
int digestSalted(TracedCall& call, const Digest& digest, const Bytes& clear, const Bytes& salt,
                 unsigned char* out) noexcept {
  if (digest.init() != 1) return call.fail(LDAPPW_OPERATIONS_ERROR, "QEL_EVP_DigestInit() failed.");
  if (!update(digest, clear) || !update(digest, salt)) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "QEL_EVP_DigestUpdate() failed.");
  }
  unsigned written = 0;
  if (digest.final(out, &written) != 1) return call.fail(LDAPPW_OPERATIONS_ERROR, "QEL_EVP_DigestFinal() failed.");
  return LDAPPW_SUCCESS;
}

}  // namespace

int saltedHashTo(TextTarget& target, const char* clear, size_t clearBytes, const char* digestName) noexcept {
  TracedCall call{kEncrypt, clear, target.address(), digestName};
  if (anyNull(clear, target.address(), digestName)) return call.invalid();
  void* qelCtx = nullptr;
  if (const int rc = initQelCrypto(&qelCtx); rc != 0) return call.fail(rc, "initQelCrypto() failed.");
  OutGuard<char> result(target.slot);
  DigestOwner digest(qelCtx);
  if (const int rc = digest.open(digestName); rc != 0) return call.fail(rc, "initQelDigest() failed.");

  const size_t size = digest.size();
  if (size == 0) return call.fail(LDAPPW_OPERATIONS_ERROR, "QEL_EVP_MD_size() failed.");
  SecretBytes<2 * kUsualDigest> raw(2 * size);
  if (!raw) return call.fail(LDAPPW_NO_MEMORY, "calloc() returned NULL.");
  unsigned char* salt = raw.get() + size;
  if (randomBytes(qelCtx, salt, static_cast<int>(size)) != 1) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "QEL_RAND_bytes() failed.");
  }
  if (const int rc = digestSalted(call, digest, {clear, clearBytes}, {salt, size}, raw.get()); rc != 0) return rc;
  if (!writeBase64(target, raw.get(), 2 * size)) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "binaryBlobToBase64() returned NULL.");
  }
  result.keep();
  return call.leave(LDAPPW_SUCCESS);
}

int saltedHashCheck(const char* clear, size_t clearBytes, const char* stored, size_t storedBytes,
                    const char* digestName) noexcept {
  TracedCall call{kVerify, clear, stored, digestName};
  if (anyNull(clear, stored, digestName)) return call.invalid();
  PlainBytes<decodedRoom(kUsualText)> decoded(decodedRoom(storedBytes));
  const DecodedText given = decoded ? decodeText(stored, storedBytes, pBase64, decoded.get()) : DecodedText{0, false};
  if (!given.isClean || storedBytes > INT_MAX) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "base64ToBinaryBlob() returned NULL.");
  }
  void* qelCtx = nullptr;
  if (const int rc = initQelCrypto(&qelCtx); rc != 0) return call.fail(rc, "initQelCrypto() failed.");
  DigestOwner digest(qelCtx);
  if (const int rc = digest.open(digestName); rc != 0) return call.fail(rc, "initQelDigest() failed.");

  const size_t size = digest.size();
  if (size == 0) return call.fail(LDAPPW_OPERATIONS_ERROR, "QEL_EVP_MD_size() failed.");
  SecretBytes<kUsualDigest> fresh(size);
  if (!fresh) return call.fail(LDAPPW_NO_MEMORY, "calloc() returned NULL.");
  if (given.bytes < size) return call.fail(LDAPPW_OPERATIONS_ERROR, "Stored value shorter than the digest.");
  const Bytes salt{decoded.get() + size, given.bytes - size};
  if (const int rc = digestSalted(call, digest, {clear, clearBytes}, salt, fresh.get()); rc != 0) return rc;
  return call.leave(equalBytes(fresh.get(), decoded.get(), size) ? LDAPPW_SUCCESS : LDAPPW_INVALID_CREDENTIALS);
}

}  // namespace ldappw

using namespace ldappw;

extern "C" {

// Documented in password_schemes.h.

int saltedHashEncrypt(const char* clear, char** out, const char* digestName) noexcept {
  TextTarget target = toSlot(out);
  return saltedHashTo(target, clear, lengthOf(clear), digestName);
}

int saltedHashVerify(const char* clear, const char* stored, const char* digestName) noexcept {
  return saltedHashCheck(clear, lengthOf(clear), stored, lengthOf(stored), digestName);
}

}  // extern "C"
