// SPDX-License-Identifier: Apache-2.0
// Provider contexts, their values and failures, and their random bytes.
#include <sched.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <cstring>
#include <iterator>

#include "call.h"

using namespace qel;

Refusal Call::record(Handle owner, QelStatus* status, QelReason reason, const char* text) noexcept {
  QelStatus failure{1, reason, ""};
  std::snprintf(failure.desc, sizeof failure.desc, "%s", text);
  if (Room* own = findContext(owner) == nullptr ? nullptr : ownRoom()) {
    own->failureOwner = owner;
    own->failure = failure;
  }
  if (status != nullptr) *status = failure;
  return {};
}

namespace {

// The lock over provider contexts and their values. A fork cannot leave it taken: the child takes it over.
struct Lock {
  Lock() noexcept {
    const pid_t self = getpid();
    for (pid_t other = 0; !holder.compare_exchange_weak(other, self);) other = other == self ? sched_yield() : other;
  }
  ~Lock() { holder.store(0); }
  static inline std::atomic<pid_t> holder{0};
};

// Under the lock, for a provider context that is live or about to be.
int setValue(const Call& call, Context& context, int id, const char* value) noexcept {
  if (id < QEL_VALUE_STRICT || id > QEL_VALUE_LOAD_PATH) return call.fail(QEL_REASON_BAD_VALUE_ID, "no such value");
  if (value == nullptr) return call.fail(QEL_REASON_NULL_ARGUMENT, "the value is null");
  const size_t bytes = strnlen(value, sizeof context.values[id]) + 1;
  if (bytes > sizeof context.values[id]) return call.fail(QEL_REASON_PATH_TOO_LONG, "the value is too long");
  const bool isOn = std::strcmp(value, "on") == 0;
  if (id == QEL_VALUE_STRICT && !isOn && std::strcmp(value, "off") != 0) {
    return call.fail(QEL_REASON_BAD_VALUE, "the value is neither on nor off");
  }
  if (id == QEL_VALUE_STRICT) context.isLenient.store(!isOn, std::memory_order_relaxed);
  std::memcpy(context.values[id], value, bytes);
  return call.succeed();
}

int checkBytes(const Call& call, const void* bytes, int count) noexcept {
  if (call.context() == nullptr) return 0;
  if (count < 0) return call.fail(QEL_REASON_BAD_LENGTH, "the count is negative");
  if (bytes == nullptr && count > 0) return call.fail(QEL_REASON_NULL_ARGUMENT, "the buffer is null");
  return call.succeed();
}

// Straight from the kernel: there is nothing that a fork, the end of OpenSSL, a lack of memory or a cancellation could
// break.
int drawRandom(const Call& call, unsigned char* buffer, int count) noexcept {
  constexpr size_t kMostBytes = 256;  // in one call
  if (checkBytes(call, buffer, count) == 0) return 0;
  const auto bytes = static_cast<size_t>(count);
  for (size_t at = 0; at < bytes; at += kMostBytes) {
    if (getentropy(buffer + at, std::min(bytes - at, kMostBytes)) == 0) continue;
    return call.fail(QEL_REASON_RANDOM_FAILURE, "the random generator failed");
  }
  return 1;
}

}  // namespace

extern "C" {

int QEL_GetStatus(QEL_CTX* ctx, QelStatus* status) noexcept {
  const Call call{ctx, status};
  if (call.context() == nullptr) return 0;
  if (status == nullptr) return call.fail(QEL_REASON_NULL_ARGUMENT, "the status record is null");
  const Room* own = ownRoom();
  *status = own != nullptr && own->failureOwner == valueOf(ctx) ? own->failure : QelStatus{};
  return 1;
}

int QEL_SetValue(QEL_CTX* ctx, QelStatus* status, int id, const char* value) noexcept {
  const Call call{ctx, status};
  const Lock lock;
  Context* context = call.context();
  return context == nullptr ? 0 : setValue(call, *context, id, value);
}

int QEL_GetValue(QEL_CTX* ctx, QelStatus* status, int id, char* buffer, int size) noexcept {
  const Call call{ctx, status};
  Context* context = call.context();
  if (context == nullptr) return 0;
  if (id < QEL_VALUE_STRICT || id > QEL_VALUE_LOAD_PATH) return call.fail(QEL_REASON_BAD_VALUE_ID, "no such value");
  if (buffer == nullptr) return call.fail(QEL_REASON_NULL_ARGUMENT, "the buffer is null");
  const Lock lock;
  const int bytes = static_cast<int>(std::strlen(context->values[id])) + 1;
  if (size < bytes) return call.fail(QEL_REASON_BUFFER_TOO_SMALL, "the value is longer");
  std::memcpy(buffer, context->values[id], static_cast<size_t>(bytes));
  return call.succeed();
}

QEL_CTX* QEL_Init(QelStatus* status, const char* path) noexcept {
  const Call call{nullptr, status};
  const Lock lock;
  if (!startOpenssl()) return call.fail(QEL_REASON_NOT_AVAILABLE, "OpenSSL's default provider cannot be loaded");
  Context* end = std::end(contexts);
  Context* context = std::find_if(contexts, end, [](const Context& each) { return each.isIdle(); });
  if (context == end) return call.fail(QEL_REASON_OUT_OF_MEMORY, "there are too many provider contexts");
  if (setValue(call, *context, QEL_VALUE_LOAD_PATH, path == nullptr ? "" : path) == 0) return nullptr;
  setValue(call, *context, QEL_VALUE_STRICT, "on");
  const auto place = static_cast<size_t>(context - contexts) << kIndexBits;
  if (context->next == 0) context->next = firstHandle(kContextKind, place);
  return static_cast<QEL_CTX*>(context->publish());
}

int QEL_Attach(QEL_CTX* ctx, QelStatus* status) noexcept {
  const Call call{ctx, status};
  if (call.context() == nullptr) return 0;
  if (findAlgorithm(kDigest, "SHA1") && findAlgorithm(kCipher, "AES-128-ECB")) return call.succeed();
  return call.fail(QEL_REASON_NOT_AVAILABLE, "there is no SHA1 or no AES-128-ECB");
}

int QEL_Cleanup(QEL_CTX* ctx, QelStatus* status) noexcept {
  const Call call{ctx, status};
  const Lock lock;
  Context* context = call.context();
  if (context == nullptr) return 0;
  context->retire();
  if (Room* own = ownRoom()) own->freeWorks(false);
  return call.succeed();
}

int QEL_RAND_bytes(QEL_CTX* ctx, unsigned char* buffer, int count) noexcept {
  return drawRandom(Call{ctx}, buffer, count);
}
int QEL_RAND_seed(QEL_CTX* ctx, const void* data, int length) noexcept {
  return checkBytes(Call{ctx}, data, length);
}
int QEL_GenerateRandomSeed(QEL_CTX* ctx, QelStatus* status, unsigned char* buffer, int count) noexcept {
  return drawRandom(Call{ctx, status}, buffer, count);
}

}  // extern "C"
