// SPDX-License-Identifier: Apache-2.0
// The trace facility: the event mask, the sink and the formatting of lines.
#include "ldtr.h"

#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <memory>
#include <mutex>

namespace {

using Sink = void (*)(const ldtr_record*, void*);

struct SinkSlot {
  Sink sink = nullptr;
  void* user = nullptr;
};

std::mutex sinkMutex;
SinkSlot installedSink;  // guarded by sinkMutex; copied out, so that a sink may itself trace or change the sink

SinkSlot currentSink() {
  const std::lock_guard<std::mutex> lock(sinkMutex);
  return installedSink;
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

struct FreeDeleter {
  void operator()(char* text) const noexcept { std::free(text); }
};

void writeLine(const ldtr_scope& scope, int severity, const char* format, va_list values) {
  char shortLine[512];
  va_list again;
  va_copy(again, values);
  const int length = std::vsnprintf(shortLine, sizeof shortLine, format, values);
  std::unique_ptr<char, FreeDeleter> longLine;
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

__attribute__((constructor)) void readEventsFromEnvironment() {
  if (const char* text = secure_getenv("LDTR_EVENTS"))
    trcEvents = static_cast<unsigned>(std::strtoul(text, nullptr, 0));
}

}  // namespace

extern "C" {

unsigned int trcEvents = 0;

void ldtr_set_sink(void (*sink)(const struct ldtr_record*, void* user), void* user) {
  const std::lock_guard<std::mutex> lock(sinkMutex);
  installedSink = {sink, user};
}

void ldtr_write(const struct ldtr_record* record) {
  const SinkSlot slot = currentSink();
  if (slot.sink != nullptr) {
    slot.sink(record, slot.user);
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
