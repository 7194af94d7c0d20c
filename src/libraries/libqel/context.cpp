// SPDX-License-Identifier: Apache-2.0
// Provider contexts: making, checking and releasing them, their values and their last failures.
#include <cstring>
#include <new>
#include <utility>

#include "algorithms.h"

namespace qel {
namespace {

QEL_CTX* failInit(QelStatus* status, QelReason reason, const char* text, Source source = Source::kProvider) noexcept {
  recordFailure(0, status, reason, source, text);
  return nullptr;
}

int setPath(const Call& call, ProviderContext& provider, const char* path) noexcept {
  const std::size_t bytes = strnlen(path, kPathBytes) + 1;
  if (bytes > kPathBytes) return call.fail(QEL_REASON_PATH_TOO_LONG, "the load path is longer than 4095 bytes");
  std::lock_guard<std::mutex> lock{provider.mutex};
  std::memcpy(provider.path, path, bytes);
  return call.succeed();
}

int setStrict(const Call& call, ProviderContext& provider, const char* value) noexcept {
  const bool on = std::strcmp(value, "on") == 0;
  if (!on && std::strcmp(value, "off") != 0) return call.fail(QEL_REASON_BAD_VALUE, "the value is neither on nor off");
  provider.strict.store(on, std::memory_order_relaxed);
  return call.succeed();
}

int copyText(const Call& call, const char* text, char* buffer, int size) noexcept {
  const std::size_t bytes = std::strlen(text) + 1;
  if (size < 0) return call.fail(QEL_REASON_BAD_LENGTH, "the buffer size is negative");
  if (static_cast<std::size_t>(size) < bytes) {
    return call.fail(QEL_REASON_BUFFER_TOO_SMALL, "the buffer is too small for the value");
  }
  std::memcpy(buffer, text, bytes);
  return call.succeed();
}

}  // namespace
}  // namespace qel

using qel::Call;
using qel::ProviderContext;
using qel::providers;

extern "C" {

int QEL_GetStatus(QEL_CTX* ctx, QelStatus* status) noexcept {
  const Call call{ctx, status};
  if (call.open() == nullptr) return 0;
  if (status == nullptr) return call.failNull("the status record is null");
  qel::lastFailure(call.handle(), *status);
  return 1;
}

int QEL_SetValue(QEL_CTX* ctx, QelStatus* status, int id, const char* value) noexcept {
  const Call call{ctx, status};
  const qel::ProviderPool::Slot* slot = call.open();
  if (slot == nullptr) return 0;
  if (id != QEL_VALUE_STRICT && id != QEL_VALUE_LOAD_PATH) {
    return call.fail(QEL_REASON_BAD_VALUE_ID, "there is no value with this id");
  }
  if (value == nullptr) return call.failNull("the value is null");
  ProviderContext& provider = *slot->value.context;
  return id == QEL_VALUE_STRICT ? qel::setStrict(call, provider, value) : qel::setPath(call, provider, value);
}

int QEL_GetValue(QEL_CTX* ctx, QelStatus* status, int id, char* buffer, int size) noexcept {
  const Call call{ctx, status};
  const qel::ProviderPool::Slot* slot = call.open();
  if (slot == nullptr) return 0;
  if (id != QEL_VALUE_STRICT && id != QEL_VALUE_LOAD_PATH) {
    return call.fail(QEL_REASON_BAD_VALUE_ID, "there is no value with this id");
  }
  if (buffer == nullptr) return call.failNull("the buffer is null");
  ProviderContext& provider = *slot->value.context;
  if (id == QEL_VALUE_STRICT) return qel::copyText(call, provider.strict ? "on" : "off", buffer, size);
  std::lock_guard<std::mutex> lock{provider.mutex};
  return qel::copyText(call, provider.path, buffer, size);
}

QEL_CTX* QEL_Init(QelStatus* status, const char* path) noexcept {
  const std::size_t pathBytes = path == nullptr ? 0 : strnlen(path, qel::kPathBytes) + 1;
  if (pathBytes > qel::kPathBytes) {
    return qel::failInit(status, QEL_REASON_PATH_TOO_LONG, "the load path is longer than 4095 bytes");
  }
  std::unique_ptr<ProviderContext> context{new (std::nothrow) ProviderContext};
  if (context == nullptr) return qel::failInit(status, QEL_REASON_OUT_OF_MEMORY, "no memory for a provider context");
  if (!context->libraries[0].open()) {
    return qel::failInit(status, QEL_REASON_NOT_AVAILABLE, "OpenSSL's default provider cannot be loaded",
                         qel::Source::kOpenssl);
  }
  if (path != nullptr) std::memcpy(context->path, path, pathBytes);
  qel::ProviderPool::Slot* slot = providers.take(qel::currentLane());
  if (slot == nullptr) return qel::failInit(status, QEL_REASON_OUT_OF_MEMORY, "no memory for a provider context");
  slot->value.context = std::move(context);
  qel::clearStatus(status);
  return qel::handleOf<QEL_CTX>(providers.publish(*slot, 0));
}

int QEL_Attach(QEL_CTX* ctx, QelStatus* status) noexcept {
  const Call call{ctx, status};
  const qel::ProviderPool::Slot* slot = call.open();
  if (slot == nullptr) return 0;
  if (OSSL_PROVIDER_available(slot->value.context->libraries[0].context.get(), "default") != 1) {
    return call.failOpenssl(QEL_REASON_NOT_AVAILABLE, "the default provider is not active");
  }
  const bool ready = qel::findDigest(call, "SHA1") != nullptr && qel::findCipher(call, "AES-128-ECB") != nullptr;
  return ready ? call.succeed() : 0;
}

int QEL_Cleanup(QEL_CTX* ctx, QelStatus* status) noexcept {
  const Call call{ctx, status};
  qel::ProviderPool::Slot* slot = call.open();
  if (slot == nullptr) return 0;
  if (!providers.retire(*slot, call.handle())) return call.fail(QEL_REASON_FOREIGN_HANDLE, Call::kForeignContext);
  qel::releaseProvider(*slot, call.handle());
  return call.succeed();
}

}  // extern "C"
