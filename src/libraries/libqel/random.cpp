// SPDX-License-Identifier: Apache-2.0
// Random bytes. They come from OpenSSL's generators of the process, whose state in each thread OpenSSL itself releases.
#include <openssl/rand.h>

#include "provider.h"

namespace qel {
namespace {

int checkBuffer(const Call& call, const void* buffer, int count) noexcept {
  if (call.open() == nullptr) return 0;
  if (count < 0) return call.fail(QEL_REASON_BAD_LENGTH, "the count is negative");
  if (buffer == nullptr && count > 0) return call.failNull("the buffer is null");
  return 1;
}

int fill(const Call& call, int (*generate)(unsigned char*, int), unsigned char* buffer, int count) noexcept {
  if (checkBuffer(call, buffer, count) == 0) return 0;
  if (count == 0 || generate(buffer, count) == 1) return call.succeed();
  return call.failOpenssl(QEL_REASON_RANDOM_FAILURE, "the random generator failed");
}

}  // namespace
}  // namespace qel

extern "C" {

int QEL_RAND_bytes(QEL_CTX* ctx, unsigned char* buffer, int count) noexcept {
  return qel::fill(qel::Call{ctx}, RAND_bytes, buffer, count);
}

int QEL_RAND_seed(QEL_CTX* ctx, const void* data, int length) noexcept {
  const qel::Call call{ctx};
  if (qel::checkBuffer(call, data, length) == 0) return 0;
  if (length > 0) RAND_seed(data, length);
  return 1;
}

int QEL_GenerateRandomSeed(QEL_CTX* ctx, QelStatus* status, unsigned char* buffer, int count) noexcept {
  return qel::fill(qel::Call{ctx, status}, RAND_priv_bytes, buffer, count);
}

}  // extern "C"
