// SPDX-License-Identifier: Apache-2.0
// Cipher contexts. Each keeps its OpenSSL context between uses, reset, as digest contexts do. The two directions share
// their code: the direction is part of the context, and a step in the other one is out of order.
#include "algorithms.h"

namespace qel {

bool CipherContext::prepare() noexcept {
  if (openssl == nullptr) openssl.reset(EVP_CIPHER_CTX_new());
  return openssl != nullptr;
}

void CipherContext::wipe() noexcept {
  if (phase != Phase::kFresh) EVP_CIPHER_CTX_reset(openssl.get());  // overwrites the key before it is released
  phase = Phase::kFresh;
  cipher = 0;
  padding = true;
  keyLength = 0;
}

namespace {

struct CipherKey {
  const unsigned char* key;
  const unsigned char* iv;
};

int checkKey(const Call& call, const CipherContext& context, const Cipher& cipher, const CipherKey& key) noexcept {
  if (key.key == nullptr) return call.failNull("the key is null");
  if (key.iv == nullptr && cipher.ivLength > 0) return call.failNull("the initial vector is null");
  if (context.keyLength != 0 && context.keyLength != cipher.keyLength) {
    return call.fail(QEL_REASON_BAD_LENGTH, "the cipher has no keys of the length that was set");
  }
  return 1;
}

int start(const QEL_CTX* ctx, const QEL_CIPHER_CTX* cipherCtx, const QEL_CIPHER* handle, const CipherKey& key,
          bool encrypts) noexcept {
  const Call call{ctx};
  auto* slot = call.find(cipherContexts, cipherCtx);
  auto* cipher = slot == nullptr ? nullptr : call.find(ciphers, handle);
  if (cipher == nullptr) return 0;
  CipherContext& context = slot->value;
  if (context.phase == Phase::kRunning) context.phase = Phase::kStopped;
  context.cipher = 0;
  if (checkKey(call, context, cipher->value, key) == 0) return 0;
  context.phase = Phase::kStopped;
  EVP_CIPHER_CTX* openssl = context.openssl.get();
  // OpenSSL asks the cipher for its vector length whenever it is given a vector, and that takes a while.
  const unsigned char* iv = cipher->value.ivLength > 0 ? key.iv : nullptr;
  if (EVP_CipherInit_ex(openssl, algorithmOf(call, *cipher, context.replica), nullptr, key.key, iv, encrypts ? 1 : 0) !=
      1) {
    return call.failOpenssl(QEL_REASON_CIPHER_FAILURE, "the cipher cannot be started");
  }
  if (!context.padding) EVP_CIPHER_CTX_set_padding(openssl, 0);
  context.cipher = valueOf(handle);
  context.encrypts = encrypts;
  context.phase = Phase::kRunning;
  return 1;
}

// Whether a context may be used after its final step, which is OpenSSL's to judge when the checks are not strict.
[[gnu::cold]] bool mayGoOn(const Call& call, const CipherContext& context) noexcept {
  const ProviderPool::Slot* slot = context.phase == Phase::kStopped ? call.open() : nullptr;
  return slot != nullptr && !slot->value.context->strict.load(std::memory_order_relaxed);
}

// The context of a cipher that is under way in this direction; null after a failure, which is recorded.
inline CipherContext* runningCipher(Call call, const QEL_CIPHER_CTX* handle, bool encrypts) noexcept {
  auto* slot = call.find(cipherContexts, handle);
  if (slot == nullptr) return nullptr;
  CipherContext& context = slot->value;
  const bool matches = context.cipher != 0 && context.encrypts == encrypts;
  if (matches && (context.phase == Phase::kRunning || mayGoOn(call, context))) return &context;
  call.fail(QEL_REASON_WRONG_STATE, encrypts ? "the cipher context needs an init for encryption"
                                             : "the cipher context needs an init for decryption");
  return nullptr;
}

int update(Call call, CipherContext* context, unsigned char* out, int* outLength, const unsigned char* in,
           int inLength) noexcept {
  if (outLength == nullptr) return call.failNull("the output length is null");
  *outLength = 0;
  if (context == nullptr) return 0;
  if (out == nullptr) return call.failNull("the output buffer is null");
  if (inLength < 0) return call.fail(QEL_REASON_BAD_LENGTH, "the input length is negative");
  if (inLength == 0) return 1;
  if (in == nullptr) return call.failNull("the input is null");
  if (EVP_CipherUpdate(context->openssl.get(), out, outLength, in, inLength) == 1) return 1;
  *outLength = 0;
  return call.failOpenssl(QEL_REASON_CIPHER_FAILURE, "the cipher cannot take the data");
}

int finish(Call call, CipherContext* context, unsigned char* out, int* outLength) noexcept {
  if (outLength == nullptr) return call.failNull("the output length is null");
  *outLength = 0;
  if (context == nullptr) return 0;
  if (out == nullptr) return call.failNull("the output buffer is null");
  context->phase = Phase::kStopped;
  if (EVP_CipherFinal_ex(context->openssl.get(), out, outLength) == 1) return 1;
  *outLength = 0;
  return call.failOpenssl(QEL_REASON_CIPHER_FAILURE, "the cipher cannot be ended");
}

}  // namespace
}  // namespace qel

using qel::Call;
using qel::CipherContext;
using qel::cipherContexts;

extern "C" {

QEL_CIPHER_CTX* QEL_EVP_CIPHER_CTX_new(QEL_CTX* ctx) noexcept {
  return qel::handleOf<QEL_CIPHER_CTX>(qel::makeObject(Call{ctx}, cipherContexts));
}

int QEL_EVP_CIPHER_CTX_free(QEL_CTX* ctx, QEL_CIPHER_CTX* cipherCtx) noexcept {
  return qel::releaseObject(Call{ctx}, cipherContexts, cipherCtx);
}

int QEL_EVP_CIPHER_CTX_init(QEL_CTX* ctx, QEL_CIPHER_CTX* cipherCtx) noexcept {
  return qel::wipeObject(Call{ctx}, cipherContexts, cipherCtx);
}

int QEL_EVP_CIPHER_CTX_cleanup(QEL_CTX* ctx, QEL_CIPHER_CTX* cipherCtx) noexcept {
  return qel::wipeObject(Call{ctx}, cipherContexts, cipherCtx);
}

int QEL_EVP_CIPHER_CTX_set_key_length(QEL_CTX* ctx, QEL_CIPHER_CTX* cipherCtx, int length) noexcept {
  const Call call{ctx};
  auto* slot = call.find(cipherContexts, cipherCtx);
  if (slot == nullptr) return 0;
  CipherContext& context = slot->value;
  const auto* cipher = context.cipher == 0 ? nullptr : qel::ciphers.find(context.cipher);
  const bool fits = cipher == nullptr ? length > 0 && length <= EVP_MAX_KEY_LENGTH : length == cipher->value.keyLength;
  if (!fits) return call.fail(QEL_REASON_BAD_LENGTH, "the cipher has no keys of this length");
  context.keyLength = length;
  return 1;
}

int QEL_EVP_CIPHER_CTX_set_padding(QEL_CTX* ctx, QEL_CIPHER_CTX* cipherCtx, int padding) noexcept {
  auto* slot = Call{ctx}.find(cipherContexts, cipherCtx);
  if (slot == nullptr) return 0;
  CipherContext& context = slot->value;
  if (context.padding == (padding != 0)) return 1;
  context.padding = padding != 0;
  if (context.phase != qel::Phase::kFresh) EVP_CIPHER_CTX_set_padding(context.openssl.get(), context.padding ? 1 : 0);
  return 1;
}

int QEL_EVP_EncryptInit(QEL_CTX* ctx, QEL_CIPHER_CTX* cipherCtx, const QEL_CIPHER* cipher, const unsigned char* key,
                        const unsigned char* iv) noexcept {
  return qel::start(ctx, cipherCtx, cipher, {key, iv}, true);
}

int QEL_EVP_DecryptInit(QEL_CTX* ctx, QEL_CIPHER_CTX* cipherCtx, const QEL_CIPHER* cipher, const unsigned char* key,
                        const unsigned char* iv) noexcept {
  return qel::start(ctx, cipherCtx, cipher, {key, iv}, false);
}

int QEL_EVP_EncryptUpdate(QEL_CTX* ctx, QEL_CIPHER_CTX* cipherCtx, unsigned char* out, int* outLength,
                          const unsigned char* in, int inLength) noexcept {
  const Call call{ctx};
  return qel::update(call, qel::runningCipher(call, cipherCtx, true), out, outLength, in, inLength);
}

int QEL_EVP_DecryptUpdate(QEL_CTX* ctx, QEL_CIPHER_CTX* cipherCtx, unsigned char* out, int* outLength,
                          const unsigned char* in, int inLength) noexcept {
  const Call call{ctx};
  return qel::update(call, qel::runningCipher(call, cipherCtx, false), out, outLength, in, inLength);
}

int QEL_EVP_EncryptFinal(QEL_CTX* ctx, QEL_CIPHER_CTX* cipherCtx, unsigned char* out, int* outLength) noexcept {
  const Call call{ctx};
  return qel::finish(call, qel::runningCipher(call, cipherCtx, true), out, outLength);
}

int QEL_EVP_DecryptFinal(QEL_CTX* ctx, QEL_CIPHER_CTX* cipherCtx, unsigned char* out, int* outLength) noexcept {
  const Call call{ctx};
  return qel::finish(call, qel::runningCipher(call, cipherCtx, false), out, outLength);
}

const QEL_CIPHER* QEL_EVP_CIPHER_CTX_cipher(QEL_CTX* ctx, QEL_CIPHER_CTX* cipherCtx) noexcept {
  const Call call{ctx};
  auto* slot = call.find(cipherContexts, cipherCtx);
  if (slot == nullptr) return nullptr;
  if (slot->value.cipher == 0) call.fail(QEL_REASON_WRONG_STATE, "the cipher context has no cipher yet");
  return qel::handleOf<const QEL_CIPHER>(slot->value.cipher);
}

}  // extern "C"
