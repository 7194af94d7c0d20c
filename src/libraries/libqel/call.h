// SPDX-License-Identifier: Apache-2.0
// The start of every entry: a Call checks the handles that it is given, and records the failure.
#pragma once

#include "objects.h"

namespace qel {

// What a failing step returns: 0, or null.
struct Refusal {
  constexpr operator int() const noexcept { return 0; }
  template <typename T>
  constexpr operator T*() const noexcept {
    return nullptr;
  }
};

inline Handle valueOf(const void* handle) noexcept {
  return reinterpret_cast<Handle>(handle);
}

class Call {
 public:
  explicit Call(const QEL_CTX* ctx, QelStatus* status = nullptr) noexcept : owner_{valueOf(ctx)}, out_{status} {}

  // What a handle leads to; null after a failure.
  Context* context() const noexcept {
    Context* context = findContext(owner_);
    return context != nullptr ? context : failHandle(owner_);
  }
  Work* work(Type type, const void* handle) const noexcept {
    Work* work = findWork(type, valueOf(handle));
    const bool isOwn = work != nullptr && work->owner.load(std::memory_order_relaxed) == owner_;
    return isOwn && findContext(owner_) != nullptr ? work : failHandle(valueOf(handle));
  }
  const Algorithm* algorithm(Type type, const void* handle) const noexcept {  // comes after one of the others
    const Handle distance = valueOf(handle) - firstOf(type);
    const Handle index = distance >> kKindBits;
    const bool isOne = index << kKindBits == distance && index < algorithmCounts[type];
    return isOne ? &algorithms[type][index] : failHandle(valueOf(handle));
  }
  const void* handleOf(const Algorithm& algorithm) const noexcept {
    const auto index = static_cast<Handle>(&algorithm - algorithms[algorithm.type]);
    return reinterpret_cast<const void*>(firstOf(algorithm.type) + (index << kKindBits));
  }

  int succeed() const noexcept {
    if (out_ != nullptr) *out_ = {};
    return 1;
  }
  Refusal fail(QelReason why, const char* text) const noexcept { return record(owner_, out_, why, text); }
  Refusal failHandle(Handle handle) const noexcept {
    const bool isNull = owner_ == 0 || handle == 0;
    return fail(isNull ? QEL_REASON_NULL_ARGUMENT : QEL_REASON_FOREIGN_HANDLE,
                isNull ? "a handle is null" : "a handle is not live in this provider context, or of another kind");
  }

 private:
  Handle firstOf(Type type) const noexcept { return owner_ - kContextKind + kAlgorithmKind + type; }

  // Takes its parts one by one, so that a call that succeeds stays in registers.
  [[gnu::cold]] static Refusal record(Handle owner, QelStatus* status, QelReason reason, const char* text) noexcept;

  Handle owner_;
  QelStatus* out_;
};

}  // namespace qel
