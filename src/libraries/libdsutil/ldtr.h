/* SPDX-License-Identifier: Apache-2.0 */
/*
 * The trace facility: functions open a scope, and entry records, exit records and debug lines go to one sink.
 *
 * Rules for the whole header:
 *  1. Nothing is recorded unless `trcEvents` asks for it; with tracing off a traced call costs one load and one test.
 *  2. Records arrive at the sink in the order in which things happen on their thread; threads may interleave.
 *  3. A line of any length arrives whole. When memory runs out, a line longer than 511 characters is cut there.
 *  4. Every function may be called from many threads at once.
 */
#ifndef DSUTIL_LDTR_H
#define DSUTIL_LDTR_H

#if defined(__GNUC__)
#define LDTR_API __attribute__((visibility("default")))
#define LDTR_PRINTF(formatAt, valuesAt) __attribute__((format(printf, formatAt, valuesAt)))
#define LDTR_COLD __attribute__((cold))
#else
#define LDTR_API
#define LDTR_COLD
#define LDTR_PRINTF(formatAt, valuesAt)
#endif

#ifdef __cplusplus
extern "C" {
#endif

enum { LDTR_ENTRY = 1, LDTR_EXIT = 2, LDTR_LINE = 3 }; /* ldtr_record.kind */
enum { LDTR_DEBUG = 0, LDTR_ERROR = 1 };               /* ldtr_record.severity, the class of a line */
enum { LDTR_EVENT_DEBUG = 0x4000000 };                 /* the bit of trcEvents that switches debug lines */

/* What a scope says about itself. */
struct ldtr_scope {
  unsigned id;
  unsigned level;
  unsigned mask; /* the bit of trcEvents that switches this scope's entry and exit records */
};

struct ldtr_record {
  int kind;
  int severity;
  unsigned id, level, mask; /* of the scope; all 0 for a line written outside any scope */
  int rc;                   /* of an exit record */
  const char* text;         /* of a line: exactly as its caller wrote it; null for entry and exit records */
};

/* The event mask. 0 at start, or the number in LDTR_EVENTS (C notation). May be written at any time. */
extern LDTR_API unsigned int trcEvents;

/* Sends records to sink (called with user, possibly from many threads at once) instead of to standard error, one line a
 * record. Null brings the default back. A call under way on another thread may still reach the former sink. A sink may
 * trace and call what traces; it must return: an exception that leaves it, or an end of its thread, ends the process.
 * */
LDTR_API void ldtr_set_sink(void (*sink)(const struct ldtr_record*, void* user), void* user);

/* Hands one record to the sink, whatever trcEvents says. */
LDTR_API void ldtr_write(const struct ldtr_record* record);

LDTR_COLD LDTR_API void ldtr_write_entry(const struct ldtr_scope* scope);
LDTR_COLD LDTR_API void ldtr_write_exit(const struct ldtr_scope* scope, int rc);

/* Writes one printf-style line of the class severity, inside a scope or without one. The caller tests the debug bit. */
LDTR_API void ldtr_formater_local(const struct ldtr_scope* scope, int severity, const char* format, ...)
    LDTR_PRINTF(3, 4);
LDTR_API void ldtr_formater_global(int severity, const char* format, ...) LDTR_PRINTF(2, 3);

#ifdef __cplusplus
} /* extern "C" */

inline unsigned ldtr_events() noexcept {
  return __atomic_load_n(&trcEvents, __ATOMIC_RELAXED);
}

/* The scope of one call: an entry record when it is made, an exit record with the recorded result code on every way
 * out. What is recorded is decided once, on entry, so that an entry always has its exit. */
class ldtr_function_local {
 public:
  explicit ldtr_function_local(const ldtr_scope& scope) noexcept
      : scope_(scope), events_(ldtr_events() & (scope.mask | static_cast<unsigned>(LDTR_EVENT_DEBUG))) {
    if (isOn() && recordsScope()) ldtr_write_entry(&scope_);  // one test where nothing is traced, shared with the lines
  }
  ~ldtr_function_local() {
    if (isOn() && recordsScope()) ldtr_write_exit(&scope_, rc_);
  }
  ldtr_function_local(const ldtr_function_local&) = delete;
  ldtr_function_local& operator=(const ldtr_function_local&) = delete;

  void ldtr_exit_errcode(int rc) noexcept { rc_ = rc; }
  int rc() const noexcept { return rc_; }
  bool isOn() const noexcept { return events_ != 0; }
  bool debugOn() const noexcept { return (events_ & static_cast<unsigned>(LDTR_EVENT_DEBUG)) != 0; }
  const ldtr_scope& scope() const noexcept { return scope_; }

 private:
  bool recordsScope() const noexcept { return (events_ & ~static_cast<unsigned>(LDTR_EVENT_DEBUG)) != 0; }

  const ldtr_scope& scope_;
  unsigned events_;  // those of trcEvents that concern this scope
  int rc_ = 0;
};
#endif

#endif
