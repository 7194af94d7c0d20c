// SPDX-License-Identifier: Apache-2.0
// One traced call: the scope record, the usual lines about entering, failing and leaving, and the result code, so that
// a failing step is one return. Lines that depart from the usual shape are given whole through failText.
#pragma once

#include <cstddef>

#include "encoding_utils.h"
#include "ldtr.h"

namespace ldappw {

enum class LineClass : int { debug = LDTR_DEBUG, error = LDTR_ERROR };

// Whether a function writes "<name>: Entering. ..." and "<name>: Leaving. rc = ..." lines.
enum class Lines { none, leavingOnly, usual };

struct TraceInfo {
  const char* name;
  ldtr_scope scope;
  LineClass failures;  // the class of the module's failure lines
  Lines lines = Lines::usual;
  const char* enteringAs = nullptr;   // another name in the entering line
  const char* leavingLine = nullptr;  // another leaving line, with one %d
};

constexpr unsigned kOperationLevel = 43;
constexpr unsigned kOperationMask = 0x10000;
constexpr unsigned kSmallLevel = 33;  // getters, setters and password verification
constexpr unsigned kSmallMask = 0x1000;

constexpr ldtr_scope operationScope(unsigned id) {
  return {id, kOperationLevel, kOperationMask};
}
constexpr ldtr_scope smallScope(unsigned id) {
  return {id, kSmallLevel, kSmallMask};
}

// Identifiers: 0x0409NN00 of the password module, 0x50MMNN00 of the others; NN counts a module's functions from 1.
constexpr unsigned passwordId(unsigned function) {
  return 0x04090000U | (function << 8U);
}
constexpr unsigned moduleId(unsigned module, unsigned function) {
  return 0x50000000U | (module << 16U) | (function << 8U);
}

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

class TracedCall {
 public:
  // After the function come the pointer arguments to show, each as its name and its value. They are put together only
  // when there is a line to write.
  template <class... NamesAndValues>
  explicit TracedCall(const TraceInfo& info, NamesAndValues... pairs) noexcept : info_(info), scope_(info.scope) {
    static_assert(sizeof...(pairs) % 2 == 0, "names and values");
    if (__builtin_expect(scope_.debugOn(), 0) && info_.lines == Lines::usual) {
      const void* const list[] = {static_cast<const void*>(pairs)..., nullptr};
      writeEntering(list, sizeof...(pairs) / 2);
    }
  }
  ~TracedCall() {
    if (__builtin_expect(scope_.debugOn(), 0) && info_.lines != Lines::none) writeLeaving();
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
  [[gnu::cold]] int failShowing(int rc, const char* what, int shown) noexcept {
    if (__builtin_expect(scope_.debugOn(), 0)) writeFailure(what, shown);
    return leave(rc);
  }

  // A line that departs from the usual shape, whole.
  template <class... Values>
  [[gnu::cold]] int failText(int rc, const char* format, Values... values) noexcept {
    line(info_.failures, format, values...);
    return leave(rc);
  }

  template <class... Values>
  void line(LineClass lineClass, const char* format, Values... values) noexcept {
    if (__builtin_expect(scope_.debugOn(), 0)) {
      ldtr_formater_local(&info_.scope, static_cast<int>(lineClass), format, values...);
    }
  }

 private:
  [[gnu::cold]] void writeEntering(const void* const* pairs, size_t count) noexcept;
  [[gnu::cold]] void writeLeaving() noexcept;
  [[gnu::cold]] void writeFailure(const char* what, int shown) noexcept;

  const TraceInfo& info_;
  ldtr_function_local scope_;
};

// A line of the debug class from a function that has no scope.
template <class... Values>
void globalLine(LineClass lineClass, const char* format, Values... values) noexcept {
  if ((ldtr_events() & static_cast<unsigned>(LDTR_EVENT_DEBUG)) != 0) {
    ldtr_formater_global(static_cast<int>(lineClass), format, values...);
  }
}

}  // namespace ldappw
