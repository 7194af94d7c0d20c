// SPDX-License-Identifier: Apache-2.0
// The trace facility: the event mask, the sink and the formatting of lines.
#include "ldtr.h"

#include <pthread.h>
#include <unwind.h>

#include <cstdarg>
#include <cstdio>
#include <cstdlib>

#include "guards.h"

namespace {

using Sink = void (*)(const ldtr_record*, void*);

struct SinkSlot {
  Sink sink = nullptr;
  void* user = nullptr;
};

pthread_mutex_t sinkMutex = PTHREAD_MUTEX_INITIALIZER;
SinkSlot installedSink;  // guarded by sinkMutex; copied out, so that a sink may itself trace or change the sink

class SinkLock {
 public:
  SinkLock() noexcept { pthread_mutex_lock(&sinkMutex); }
  ~SinkLock() { pthread_mutex_unlock(&sinkMutex); }
  SinkLock(const SinkLock&) = delete;
  SinkLock& operator=(const SinkLock&) = delete;
};

SinkSlot currentSink() {
  const SinkLock lock;
  return installedSink;
}

// Calls a sink, and is the frame at which the search for a handler of its exception fails: the exception then ends the
// process where it was thrown (std::terminate), in place of unwinding operations of which nothing would be undone. The
// compiler would give a noexcept function the same at the price of the C++ library, which nothing here needs.
[[gnu::noinline]] void callSink(const SinkSlot& slot, const ldtr_record* record) {
  __asm__ volatile(".cfi_personality 0x1b, ldtr_refuse_to_unwind");
  slot.sink(record, slot.user);
  __asm__ volatile("");  // behind the call, so that the frame is there while it runs
}

// A fork takes the lock, so that the child, which has none of the other threads, finds it free.
void lockSink() {
  pthread_mutex_lock(&sinkMutex);
}
void unlockSink() {
  pthread_mutex_unlock(&sinkMutex);
}

void writeToStandardError(const ldtr_record& record) {
  if (record.kind == LDTR_LINE) {
    const size_t length = __builtin_strlen(record.text);
    const bool complete = length > 0 && record.text[length - 1] == '\n';
    std::fprintf(stderr, "%08x %s %s%s", record.id, record.severity == LDTR_ERROR ? "error" : "debug", record.text,
                 complete ? "" : "\n");
  } else if (record.kind == LDTR_ENTRY) {
    std::fprintf(stderr, "%08x entry level %u mask %#x\n", record.id, record.level, record.mask);
  } else {
    std::fprintf(stderr, "%08x exit rc = %d\n", record.id, record.rc);
  }
}

void writeLine(const ldtr_scope& scope, int severity, const char* format, va_list values) {
  char shortLine[512];
  va_list again;
  va_copy(again, values);
  const int length = std::vsnprintf(shortLine, sizeof shortLine, format, values);
  dsutil::Text longLine;
  if (length >= static_cast<int>(sizeof shortLine)) {
    const size_t size = static_cast<size_t>(length) + 1;
    longLine.reset(static_cast<char*>(std::malloc(size)));
    if (longLine) std::vsnprintf(longLine.get(), size, format, again);
  }
  va_end(again);
  const ldtr_record record{
      LDTR_LINE, severity, scope.id, scope.level, scope.mask, 0, longLine ? longLine.get() : shortLine};
  ldtr_write(&record);
}

__attribute__((constructor)) void start() {
  if (const char* text = secure_getenv("LDTR_EVENTS"))
    trcEvents = static_cast<unsigned>(std::strtoul(text, nullptr, 0));
  pthread_atfork(lockSink, unlockSink, unlockSink);
}

}  // namespace

extern "C" {

// The personality routine of callSink; its place is stated relative to that one (DW_EH_PE_pcrel, DW_EH_PE_sdata4).
__attribute__((used, visibility("hidden"))) _Unwind_Reason_Code ldtr_refuse_to_unwind(int, _Unwind_Action actions,
                                                                                      _Unwind_Exception_Class,
                                                                                      _Unwind_Exception*,
                                                                                      _Unwind_Context*) {
  return (actions & _UA_SEARCH_PHASE) != 0 ? _URC_FATAL_PHASE1_ERROR : _URC_FATAL_PHASE2_ERROR;
}

unsigned int trcEvents = 0;

void ldtr_set_sink(void (*sink)(const struct ldtr_record*, void* user), void* user) {
  const SinkLock lock;
  installedSink = {sink, user};
}

void ldtr_write(const struct ldtr_record* record) {
  const dsutil::NoCancellation uncancelled;
  const SinkSlot slot = currentSink();
  if (slot.sink != nullptr) {
    callSink(slot, record);
  } else {
    writeToStandardError(*record);
  }
}

void ldtr_write_entry(const struct ldtr_scope* scope) {
  const ldtr_record record{LDTR_ENTRY, LDTR_DEBUG, scope->id, scope->level, scope->mask, 0, nullptr};
  ldtr_write(&record);
}

void ldtr_write_exit(const struct ldtr_scope* scope, int rc) {
  const ldtr_record record{LDTR_EXIT, LDTR_DEBUG, scope->id, scope->level, scope->mask, rc, nullptr};
  ldtr_write(&record);
}

void ldtr_formater_local(const struct ldtr_scope* scope, int severity, const char* format, ...) {
  va_list values;
  va_start(values, format);
  writeLine(*scope, severity, format, values);
  va_end(values);
}

void ldtr_formater_global(int severity, const char* format, ...) {
  const ldtr_scope none{0, 0, 0};
  va_list values;
  va_start(values, format);
  writeLine(none, severity, format, values);
  va_end(values);
}

}  // extern "C"
