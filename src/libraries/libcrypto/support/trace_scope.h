// SPDX-License-Identifier: Apache-2.0
// One traced call: the scope record, the usual lines about entering, failing and leaving, and the result code, so that
// a failing step is one return. Log readers match these lines as they are; a text that departs from the usual shape
// stands whole where it is used.
#pragma once

#include <cstdarg>
#include <cstddef>

#include "encoding_utils.h"
#include "ldtr.h"

namespace ldappw {

enum class LineClass : int { debug = LDTR_DEBUG, error = LDTR_ERROR };

// Whether a function writes "<name>: Entering. ..." and "<name>: Leaving. rc = ..." lines.
enum class Lines { none, leavingOnly, usual };

// The names of the pointer arguments that the entering line shows, in the order in which a TracedCall takes them.
struct ArgumentNames {
  static constexpr size_t kMost = 6;
  const char* names[kMost];
};

struct TraceInfo : ldtr_scope {
  const char* name;
  LineClass failures;  // the class of the module's failure lines
  ArgumentNames arguments{};
  Lines lines = Lines::usual;
  const char* enteringAs = nullptr;   // another name in the entering line
  const char* leavingLine = nullptr;  // another leaving line, with one %d
};

constexpr unsigned kOperationLevel = 43;
constexpr unsigned kOperationMask = 0x10000;
constexpr unsigned kSmallLevel = 33;  // getters, setters and password verification
constexpr unsigned kSmallMask = 0x1000;

// The modules by the numbers in their identifiers.
enum Module : unsigned {
  kQelUtils = 1,
  kAesUtils,
  kAesSalt,
  kAesKey,
  kAesSync,
  kAesFile,
  kAesCrypto,
  kSaltedHash,
  kUnsaltedHash
};

// Identifiers are 0x0409NN00 in the password module and 0x50MMNN00 in the others; NN counts a module's functions
// from 1.
constexpr unsigned passwordId(unsigned function) {
  return 0x04090000U | (function << 8U);
}
constexpr unsigned moduleId(Module module, unsigned function) {
  return 0x50000000U | (module << 16U) | (function << 8U);
}

// Loading and keys report failures as errors, the operations on passwords as debug lines.
constexpr LineClass failuresOf(Module module) {
  return module < kAesCrypto ? LineClass::error : LineClass::debug;
}

constexpr TraceInfo operation(Module module, unsigned function, const char* name, ArgumentNames arguments = {}) {
  return {{moduleId(module, function), kOperationLevel, kOperationMask}, name, failuresOf(module), arguments};
}
constexpr TraceInfo accessor(Module module, unsigned function, const char* name, ArgumentNames arguments = {}) {
  return {{moduleId(module, function), kSmallLevel, kSmallMask}, name, failuresOf(module), arguments};
}

template <typename... Pointers>
constexpr bool anyNull(Pointers... pointers) {
  return ((pointers == nullptr) || ...);
}

class TracedCall {
 public:
  // The pointers are those that the entering line shows; they are put together only when there is a line to write.
  template <typename... Pointers>
  explicit TracedCall(const TraceInfo& info, Pointers... arguments) noexcept : scope_(info) {
    static_assert(sizeof...(arguments) <= ArgumentNames::kMost);
    if (__builtin_expect(scope_.isOn(), 0) && scope_.debugOn() && info.lines == Lines::usual) {
      const void* const list[] = {static_cast<const void*>(arguments)..., nullptr};
      writeEntering(list, sizeof...(arguments));
    }
  }
  ~TracedCall() {
    if (__builtin_expect(scope_.isOn(), 0) && scope_.debugOn() && info().lines != Lines::none) writeLeaving();
  }
  TracedCall(const TracedCall&) = delete;
  TracedCall& operator=(const TracedCall&) = delete;

  // Records the code for the leaving line and the exit record, and returns it.
  int leave(int rc) noexcept {
    scope_.ldtr_exit_errcode(rc);
    return rc;
  }

  // "Error - <name>: <what> rc = <rc>\n"
  [[gnu::cold]] int fail(int rc, const char* what) noexcept { return failShowing(rc, what, rc); }

  // The same with another value shown than the one returned.
  [[gnu::cold]] int failShowing(int rc, const char* what, int shown) noexcept;

  [[gnu::cold]] int invalid() noexcept { return fail(LDAPPW_OPERATIONS_ERROR, "Invalid parameter."); }

  // A failure line that departs from the usual shape, whole.
  [[gnu::cold, gnu::format(printf, 3, 4)]] int failText(int rc, const char* format, ...) noexcept;

  [[gnu::cold, gnu::format(printf, 3, 4)]] void line(LineClass lineClass, const char* format, ...) noexcept;

 private:
  [[gnu::cold]] void write(LineClass lineClass, const char* format, va_list values) noexcept;
  [[gnu::cold]] void writeEntering(const void* const* arguments, size_t count) noexcept;
  [[gnu::cold]] void writeLeaving() noexcept;

  const TraceInfo& info() const noexcept { return static_cast<const TraceInfo&>(scope_.scope()); }

  ldtr_function_local scope_;
};

// A line from a function that has no scope.
[[gnu::cold, gnu::format(printf, 2, 3)]] void globalLine(LineClass lineClass, const char* format, ...) noexcept;

}  // namespace ldappw
