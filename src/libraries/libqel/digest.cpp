// SPDX-License-Identifier: Apache-2.0
// Digest contexts. Each keeps its OpenSSL context between uses, reset, which saves making one for every digest.
#include "algorithms.h"

namespace qel {

bool DigestContext::prepare() noexcept {
  if (openssl == nullptr) openssl.reset(EVP_MD_CTX_new());
  return openssl != nullptr;
}

void DigestContext::wipe() noexcept {
  if (phase == Phase::kFresh) return;
  EVP_MD_CTX_reset(openssl.get());  // overwrites the state before it is released
  phase = Phase::kFresh;
}

namespace {

// The context of a digest that is under way; null after a failure, which is recorded.
inline DigestContext* runningDigest(Call call, const QEL_MD_CTX* handle) noexcept {
  auto* slot = call.find(digestContexts, handle);
  if (slot == nullptr) return nullptr;
  if (slot->value.phase == Phase::kRunning) return &slot->value;
  call.fail(QEL_REASON_WRONG_STATE, "the digest context needs an init");
  return nullptr;
}

}  // namespace
}  // namespace qel

using qel::Call;
using qel::DigestContext;
using qel::digestContexts;
using qel::Phase;

extern "C" {

QEL_MD_CTX* QEL_EVP_MD_CTX_new(QEL_CTX* ctx) noexcept {
  return qel::handleOf<QEL_MD_CTX>(qel::makeObject(Call{ctx}, digestContexts));
}

int QEL_EVP_MD_CTX_free(QEL_CTX* ctx, QEL_MD_CTX* digestCtx) noexcept {
  return qel::releaseObject(Call{ctx}, digestContexts, digestCtx);
}

int QEL_EVP_MD_CTX_init(QEL_CTX* ctx, QEL_MD_CTX* digestCtx) noexcept {
  return qel::wipeObject(Call{ctx}, digestContexts, digestCtx);
}

int QEL_EVP_MD_CTX_cleanup(QEL_CTX* ctx, QEL_MD_CTX* digestCtx) noexcept {
  return qel::wipeObject(Call{ctx}, digestContexts, digestCtx);
}

int QEL_EVP_DigestInit(QEL_CTX* ctx, QEL_MD_CTX* digestCtx, const QEL_DIGEST* digest) noexcept {
  const Call call{ctx};
  auto* slot = call.find(digestContexts, digestCtx);
  auto* algorithm = slot == nullptr ? nullptr : call.find(qel::digests, digest);
  if (algorithm == nullptr) return 0;
  DigestContext& context = slot->value;
  context.phase = Phase::kStopped;
  if (EVP_DigestInit_ex(context.openssl.get(), qel::algorithmOf(call, *algorithm, context.replica), nullptr) != 1) {
    return call.failOpenssl(QEL_REASON_DIGEST_FAILURE, "the digest cannot be started");
  }
  context.phase = Phase::kRunning;
  return 1;
}

int QEL_EVP_DigestUpdate(QEL_CTX* ctx, QEL_MD_CTX* digestCtx, const void* data, unsigned int length) noexcept {
  const Call call{ctx};
  DigestContext* context = qel::runningDigest(call, digestCtx);
  if (context == nullptr) return 0;
  if (length == 0) return 1;
  if (data == nullptr) return call.failNull("the data is null");
  if (EVP_DigestUpdate(context->openssl.get(), data, length) == 1) return 1;
  return call.failOpenssl(QEL_REASON_DIGEST_FAILURE, "the digest cannot take the data");
}

int QEL_EVP_DigestFinal(QEL_CTX* ctx, QEL_MD_CTX* digestCtx, unsigned char* out, unsigned int* outLength) noexcept {
  const Call call{ctx};
  if (outLength != nullptr) *outLength = 0;
  DigestContext* context = qel::runningDigest(call, digestCtx);
  if (context == nullptr) return 0;
  if (out == nullptr) return call.failNull("the digest buffer is null");
  context->phase = Phase::kStopped;
  if (EVP_DigestFinal_ex(context->openssl.get(), out, outLength) == 1) return 1;
  return call.failOpenssl(QEL_REASON_DIGEST_FAILURE, "the digest cannot be ended");
}

}  // extern "C"
