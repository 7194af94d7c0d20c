// SPDX-License-Identifier: Apache-2.0
// Digests and ciphers. The two directions of a cipher share their code: the direction is part of the context, and a
// step in the other one is out of order.
#include <openssl/evp.h>

#include <climits>
#include <cstring>
#include <type_traits>
#include <utility>

#include "call.h"

using namespace qel;

namespace {

template <typename T>
constexpr Type kTypeOf = std::is_same_v<T, QEL_CIPHER> || std::is_same_v<T, QEL_CIPHER_CTX> ? kCipher : kDigest;

template <typename T>
const T* byName(const QEL_CTX* ctx, const char* name) noexcept {
  const Call call{ctx};
  if (call.context() == nullptr) return nullptr;
  const Algorithm* found = name == nullptr ? nullptr : findAlgorithm(kTypeOf<T>, name);
  if (found != nullptr) return static_cast<const T*>(call.handleOf(*found));
  return call.fail(name == nullptr ? QEL_REASON_NULL_ARGUMENT : QEL_REASON_UNKNOWN_ALGORITHM,
                   "not an algorithm's name");
}

template <typename T>
int sizeOf(const QEL_CTX* ctx, const T* handle, size_t Algorithm::*size) noexcept {
  const Call call{ctx};
  const Algorithm* found = call.context() == nullptr ? nullptr : call.algorithm(kTypeOf<T>, handle);
  return found == nullptr ? 0 : static_cast<int>(found->*size);
}

// Uses the thread's own room, or a place that any thread may take when that room is full.
template <typename T>
T* make(const QEL_CTX* ctx) noexcept {
  const Call call{ctx};
  if (call.context() == nullptr) return nullptr;
  Room* room = ownRoom();
  Work* work = room == nullptr ? nullptr : room->idle(kTypeOf<T>);
  if (room != nullptr && work == nullptr) work = room->takeShared(kTypeOf<T>);
  if (work == nullptr) return call.fail(QEL_REASON_OUT_OF_MEMORY, "no memory for a context");
  work->owner.store(valueOf(ctx), std::memory_order_relaxed);
  work->user.store(pthread_self(), std::memory_order_relaxed);
  return static_cast<T*>(work->publish());
}

template <typename T>
int wipe(const QEL_CTX* ctx, const T* handle, bool isLast = false) noexcept {
  Work* work = Call{ctx}.work(kTypeOf<T>, handle);
  if (work == nullptr) return 0;
  isLast ? work->end() : work->wipe();
  return 1;
}

// For an init: the thread takes the context over, with a state of the algorithm.
Work* prepare(const Call& call, Type type, const void* handle, const void* algorithmHandle) noexcept {
  Work* work = call.work(type, handle);
  const Algorithm* algorithm = work == nullptr ? nullptr : call.algorithm(type, algorithmHandle);
  if (algorithm == nullptr) return nullptr;
  work->phase = Phase::kFailed;
  work->held = 0;
  const bool isOwn = work->user.load(std::memory_order_relaxed) == pthread_self() || work->takeOver();
  if (isOwn && work->take(*algorithm)) return work;
  return call.fail(QEL_REASON_OUT_OF_MEMORY, "no memory for the state of an algorithm");
}

// For a step: the context that an init has started, in this direction. When the checks are not strict, it may go on
// after the end of a cipher that has nothing left.
Work* running(const Call& call, Type type, const void* handle, bool encrypts = false) noexcept {
  Work* work = call.work(type, handle);
  if (work == nullptr || (work->phase == Phase::kRunning && work->encrypts == encrypts)) return work;
  const bool isEnded = type == kCipher && work->phase == Phase::kEnded && work->held == 0 && work->encrypts == encrypts;
  const Context* context = isEnded ? call.context() : nullptr;
  if (context != nullptr && context->isLenient.load(std::memory_order_relaxed)) return work;
  return call.fail(QEL_REASON_WRONG_STATE, "the context needs an init for this step");
}

int start(const QEL_CTX* ctx, const void* handle, const void* algorithm, const unsigned char* key,
          const unsigned char* iv, bool encrypts) noexcept {
  const Call call{ctx};
  Work* work = prepare(call, kCipher, handle, algorithm);
  if (work == nullptr) return 0;
  const Algorithm& cipher = *work->algorithm;
  const bool isComplete = key != nullptr && (iv != nullptr || cipher.ivLength == 0);
  if (!isComplete) return call.fail(QEL_REASON_NULL_ARGUMENT, "the key or its initial vector is null");
  if (work->keyLength != 0 && work->keyLength != static_cast<int>(cipher.keyLength)) {
    return call.fail(QEL_REASON_BAD_LENGTH, "the cipher has no keys of the length that was set");
  }
  const int id = encrypts ? OSSL_FUNC_CIPHER_ENCRYPT_INIT : OSSL_FUNC_CIPHER_DECRYPT_INIT;
  auto* init = work->function<OSSL_FUNC_cipher_encrypt_init_fn>(id);
  if (init(work->state, key, cipher.keyLength, iv, cipher.ivLength, nullptr) != 1) {
    return call.fail(QEL_REASON_CIPHER_FAILURE, "the cipher cannot be started");
  }
  work->phase = Phase::kRunning;
  work->encrypts = encrypts;
  return 1;
}

int update(const QEL_CTX* ctx, const void* handle, bool encrypts, unsigned char* out, int* outLength,
           const unsigned char* in, int inLength) noexcept {
  const Call call{ctx};
  if (outLength != nullptr) *outLength = 0;
  Work* work = running(call, kCipher, handle, encrypts);
  if (work == nullptr) return 0;
  if (out == nullptr || outLength == nullptr) return call.fail(QEL_REASON_NULL_ARGUMENT, "there is no output");
  const auto inBytes = static_cast<size_t>(inLength);
  const size_t room = inBytes + work->algorithm->endSize;
  if (inLength < 0 || room > INT_MAX) return call.fail(QEL_REASON_BAD_LENGTH, "the input length cannot be served");
  if (inLength == 0) return 1;
  if (in == nullptr) return call.fail(QEL_REASON_NULL_ARGUMENT, "the input is null");
  const Handle ahead = valueOf(out) - valueOf(in);
  const bool overlaps = ahead < inBytes || -ahead < inBytes + work->held;
  if (overlaps && (ahead != 0 || work->held != 0)) {
    return call.fail(QEL_REASON_OVERLAP, "the output would overwrite input that is still to be read");
  }
  size_t written = 0;
  auto* take = work->function<OSSL_FUNC_cipher_update_fn>(OSSL_FUNC_CIPHER_UPDATE);
  if (take(work->state, out, &written, room, in, inBytes) != 1) {
    work->phase = Phase::kFailed;
    return call.fail(QEL_REASON_CIPHER_FAILURE, "the cipher cannot take the data");
  }
  work->held += inBytes - written;
  *outLength = static_cast<int>(written);
  return 1;
}

// The last block of a padded text is held back until another one comes. Its padding is judged here, since OpenSSL would
// raise an error for a wrong key.
bool endPadded(Work& work, unsigned char* out, size_t* written) noexcept {
  static constexpr unsigned char kNext[EVP_MAX_BLOCK_LENGTH] = {};
  const size_t size = work.algorithm->blockSize;
  auto* take = work.function<OSSL_FUNC_cipher_update_fn>(OSSL_FUNC_CIPHER_UPDATE);
  if (take(work.state, out, written, size, kNext, size) != 1) return false;
  const size_t padding = out[size - 1];
  bool isWrong = padding == 0 || padding > size;
  *written = isWrong ? 0 : size - padding;
  for (size_t i = *written; i < size; ++i) isWrong |= std::exchange(out[i], '\0') != padding;
  if (isWrong) std::memset(out, 0, size);
  return !isWrong;
}

// The functions that end a digest and a cipher are alike.
template <typename T, typename Length>
int finish(const QEL_CTX* ctx, const T* handle, bool encrypts, unsigned char* out, Length* outLength) noexcept {
  constexpr bool kIsCipher = kTypeOf<T> == kCipher;
  const Call call{ctx};
  if (outLength != nullptr) *outLength = 0;
  Work* work = running(call, kTypeOf<T>, handle, encrypts);
  if (work == nullptr) return 0;
  const bool hasOutput = out != nullptr && (outLength != nullptr || !kIsCipher);
  if (!hasOutput) return call.fail(QEL_REASON_NULL_ARGUMENT, "there is no output");
  work->phase = Phase::kEnded;
  size_t written = 0;
  if (kIsCipher && !work->isWhole()) return call.fail(QEL_REASON_CIPHER_FAILURE, "the last block is not whole");
  if (kIsCipher && work->isPadded() && !encrypts) {
    if (!endPadded(*work, out, &written)) return call.fail(QEL_REASON_CIPHER_FAILURE, "the padding is wrong");
  } else {
    auto* end = work->function<OSSL_FUNC_digest_final_fn>(kIsCipher ? OSSL_FUNC_CIPHER_FINAL : OSSL_FUNC_DIGEST_FINAL);
    if (end(work->state, out, &written, work->algorithm->endSize) != 1) {
      return call.fail(kIsCipher ? QEL_REASON_CIPHER_FAILURE : QEL_REASON_DIGEST_FAILURE, "the end failed");
    }
    if (kIsCipher) work->held = 0;
  }
  if (outLength != nullptr) *outLength = static_cast<Length>(written);
  return 1;
}

}  // namespace

extern "C" {

// clang-format off
const QEL_DIGEST* QEL_EVP_get_digestbyname(QEL_CTX* c, const char* n) noexcept { return byName<QEL_DIGEST>(c, n); }
const QEL_CIPHER* QEL_EVP_get_cipherbyname(QEL_CTX* c, const char* n) noexcept { return byName<QEL_CIPHER>(c, n); }
int QEL_EVP_MD_size(QEL_CTX* c, const QEL_DIGEST* digest) noexcept { return sizeOf(c, digest, &Algorithm::size); }
int QEL_EVP_MD_block_size(QEL_CTX* c, const QEL_DIGEST* d) noexcept { return sizeOf(c, d, &Algorithm::blockSize); }
int QEL_EVP_CIPHER_block_size(QEL_CTX* c, const QEL_CIPHER* d) noexcept { return sizeOf(c, d, &Algorithm::blockSize); }
int QEL_EVP_CIPHER_key_length(QEL_CTX* c, const QEL_CIPHER* d) noexcept { return sizeOf(c, d, &Algorithm::keyLength); }
int QEL_EVP_CIPHER_iv_length(QEL_CTX* c, const QEL_CIPHER* d) noexcept { return sizeOf(c, d, &Algorithm::ivLength); }
QEL_MD_CTX* QEL_EVP_MD_CTX_new(QEL_CTX* ctx) noexcept { return make<QEL_MD_CTX>(ctx); }
int QEL_EVP_MD_CTX_free(QEL_CTX* ctx, QEL_MD_CTX* digestCtx) noexcept { return wipe(ctx, digestCtx, true); }
int QEL_EVP_MD_CTX_init(QEL_CTX* ctx, QEL_MD_CTX* digestCtx) noexcept { return wipe(ctx, digestCtx); }
int QEL_EVP_MD_CTX_cleanup(QEL_CTX* ctx, QEL_MD_CTX* digestCtx) noexcept { return wipe(ctx, digestCtx); }
QEL_CIPHER_CTX* QEL_EVP_CIPHER_CTX_new(QEL_CTX* ctx) noexcept { return make<QEL_CIPHER_CTX>(ctx); }
int QEL_EVP_CIPHER_CTX_free(QEL_CTX* ctx, QEL_CIPHER_CTX* cipherCtx) noexcept { return wipe(ctx, cipherCtx, true); }
int QEL_EVP_CIPHER_CTX_init(QEL_CTX* ctx, QEL_CIPHER_CTX* cipherCtx) noexcept { return wipe(ctx, cipherCtx); }
int QEL_EVP_CIPHER_CTX_cleanup(QEL_CTX* ctx, QEL_CIPHER_CTX* cipherCtx) noexcept { return wipe(ctx, cipherCtx); }
// clang-format on

int QEL_EVP_DigestInit(QEL_CTX* ctx, QEL_MD_CTX* digestCtx, const QEL_DIGEST* digest) noexcept {
  const Call call{ctx};
  Work* work = prepare(call, kDigest, digestCtx, digest);
  if (work == nullptr) return 0;
  auto* init = work->function<OSSL_FUNC_digest_init_fn>(OSSL_FUNC_DIGEST_INIT);
  const bool isStarted = std::exchange(work->isStarted, false);
  if (!isStarted && init(work->state, nullptr) != 1) {
    return call.fail(QEL_REASON_DIGEST_FAILURE, "it cannot be started");
  }
  work->phase = Phase::kRunning;
  return 1;
}

int QEL_EVP_DigestUpdate(QEL_CTX* ctx, QEL_MD_CTX* digestCtx, const void* data, unsigned int length) noexcept {
  const Call call{ctx};
  Work* work = running(call, kDigest, digestCtx);
  if (work == nullptr) return 0;
  if (length == 0) return 1;
  if (data == nullptr) return call.fail(QEL_REASON_NULL_ARGUMENT, "the data is null");
  auto* take = work->function<OSSL_FUNC_digest_update_fn>(OSSL_FUNC_DIGEST_UPDATE);
  if (take(work->state, static_cast<const unsigned char*>(data), length) == 1) return 1;
  work->phase = Phase::kFailed;
  return call.fail(QEL_REASON_DIGEST_FAILURE, "the digest cannot take the data");
}

int QEL_EVP_DigestFinal(QEL_CTX* ctx, QEL_MD_CTX* digestCtx, unsigned char* out, unsigned int* outLength) noexcept {
  return finish(ctx, digestCtx, false, out, outLength);
}

int QEL_EVP_CIPHER_CTX_set_key_length(QEL_CTX* ctx, QEL_CIPHER_CTX* cipherCtx, int length) noexcept {
  const Call call{ctx};
  Work* work = call.work(kCipher, cipherCtx);
  if (work == nullptr) return 0;
  const int fixed = work->phase >= Phase::kEnded ? static_cast<int>(work->algorithm->keyLength) : length;
  const bool fits = length > 0 && length <= EVP_MAX_KEY_LENGTH && length == fixed;
  if (!fits) return call.fail(QEL_REASON_BAD_LENGTH, "the cipher has no keys of this length");
  work->keyLength = length;
  return 1;
}

int QEL_EVP_CIPHER_CTX_set_padding(QEL_CTX* ctx, QEL_CIPHER_CTX* cipherCtx, int padding) noexcept {
  const Call call{ctx};
  Work* work = call.work(kCipher, cipherCtx);
  if (work == nullptr) return 0;
  if (work->padding == (padding != 0) || work->setPadding(padding != 0)) return 1;
  return call.fail(QEL_REASON_CIPHER_FAILURE, "the padding cannot be set");
}

int QEL_EVP_EncryptInit(QEL_CTX* ctx, QEL_CIPHER_CTX* cipherCtx, const QEL_CIPHER* cipher, const unsigned char* key,
                        const unsigned char* iv) noexcept {
  return start(ctx, cipherCtx, cipher, key, iv, true);
}
int QEL_EVP_DecryptInit(QEL_CTX* ctx, QEL_CIPHER_CTX* cipherCtx, const QEL_CIPHER* cipher, const unsigned char* key,
                        const unsigned char* iv) noexcept {
  return start(ctx, cipherCtx, cipher, key, iv, false);
}
int QEL_EVP_EncryptUpdate(QEL_CTX* ctx, QEL_CIPHER_CTX* cipherCtx, unsigned char* out, int* outLength,
                          const unsigned char* in, int inLength) noexcept {
  return update(ctx, cipherCtx, true, out, outLength, in, inLength);
}
int QEL_EVP_DecryptUpdate(QEL_CTX* ctx, QEL_CIPHER_CTX* cipherCtx, unsigned char* out, int* outLength,
                          const unsigned char* in, int inLength) noexcept {
  return update(ctx, cipherCtx, false, out, outLength, in, inLength);
}
int QEL_EVP_EncryptFinal(QEL_CTX* ctx, QEL_CIPHER_CTX* cipherCtx, unsigned char* out, int* outLength) noexcept {
  return finish(ctx, cipherCtx, true, out, outLength);
}
int QEL_EVP_DecryptFinal(QEL_CTX* ctx, QEL_CIPHER_CTX* cipherCtx, unsigned char* out, int* outLength) noexcept {
  return finish(ctx, cipherCtx, false, out, outLength);
}

const QEL_CIPHER* QEL_EVP_CIPHER_CTX_cipher(QEL_CTX* ctx, QEL_CIPHER_CTX* cipherCtx) noexcept {
  const Call call{ctx};
  const Work* work = call.work(kCipher, cipherCtx);
  if (work == nullptr) return nullptr;
  if (work->phase < Phase::kEnded) return call.fail(QEL_REASON_WRONG_STATE, "the cipher context has no cipher yet");
  return static_cast<const QEL_CIPHER*>(call.handleOf(*work->algorithm));
}

}  // extern "C"
