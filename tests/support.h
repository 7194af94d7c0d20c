// SPDX-License-Identifier: Apache-2.0
// What the suites share: a recorder for the trace, failing allocations, guarded memory, replaced provider entries.
#pragma once

#include <gnu/libc-version.h>
#include <pthread.h>
#include <sys/mman.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <functional>
#include <mutex>
#include <sstream>
#include <string>
#include <utility>
#include <vector>

#include "aes_keys.h"
#include "ldtr.h"

namespace test {

struct Record {
  int kind;
  int severity;
  unsigned id, level, mask;
  int rc;
  std::string text;
};

// Records the trace while it lives.
class TraceCapture {
 public:
  static constexpr unsigned kEverything = 0x4011000;
  static constexpr unsigned kLinesOnly = LDTR_EVENT_DEBUG;

  explicit TraceCapture(unsigned events = kEverything) : before_(trcEvents) {
    ldtr_set_sink(&TraceCapture::record, this);
    trcEvents = events;
  }
  ~TraceCapture() {
    trcEvents = before_;
    ldtr_set_sink(nullptr, nullptr);
  }
  std::vector<Record> records() const {
    const std::lock_guard<std::mutex> lock(mutex_);
    return records_;
  }
  // The lines of the error shape, whatever their class, and any other line but those of entering and leaving.
  std::vector<std::string> messages() const {
    std::vector<std::string> result;
    for (const Record& r : records()) {
      const bool usual =
          r.text.find(": Entering.") != std::string::npos || r.text.find(": Leaving.") != std::string::npos;
      if (r.kind == LDTR_LINE && !usual) result.push_back(r.text);
    }
    return result;
  }

 private:
  static void record(const ldtr_record* r, void* user) {
    auto* self = static_cast<TraceCapture*>(user);
    const std::lock_guard<std::mutex> lock(self->mutex_);
    self->records_.push_back(
        {r->kind, r->severity, r->id, r->level, r->mask, r->rc, r->text != nullptr ? r->text : ""});
  }
  unsigned before_;
  mutable std::mutex mutex_;
  std::vector<Record> records_;
};

// What the watches below see on this thread.
struct Watched {
  bool isCounting = false, andLater = false;
  long counted = 0, failing = -1, live = 0, withSecret = 0;
  const std::string* secret = nullptr;
};
inline thread_local Watched watched;

// Counts the product's allocations on this thread and fails the one with the given number (from 0; -1 for none), or all
// from that one on. Calls of malloc, calloc, strdup and free in the product's objects are routed here by the linker,
// and a write behind the end of what they give ends the suite.
class AllocationWatch {
 public:
  explicit AllocationWatch(long failing = -1, bool andLater = false) {
    watched.counted = watched.live = 0;
    watched.failing = failing;
    watched.andLater = andLater;
    watched.isCounting = true;
  }
  ~AllocationWatch() { watched.isCounting = false; }
  long count() const { return watched.counted; }
  long unreleased() const { return watched.live; }
};

// Looks into what the product releases on this thread, just before it goes: whether the secret still lies in it.
class ReleaseWatch {
 public:
  explicit ReleaseWatch(const std::string& secret) {  // which outlives it
    watched.withSecret = 0;
    watched.secret = &secret;
  }
  ~ReleaseWatch() { watched.secret = nullptr; }
  long withSecret() const { return watched.withSecret; }
};

// Runs in a child process, which has a minute: what is returned there, or -1 for a signal.
template <typename Run>
int inChild(Run run) {
  std::fflush(nullptr);
  const pid_t child = fork();
  if (child == 0) {
    alarm(60);
    _exit(run());
  }
  int status = 0;
  return waitpid(child, &status, 0) == child && WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

// Leaves no zeros where the next call has its locals.
[[gnu::noinline]] inline void dirtyStack() {
  char dirt[8192];
  std::memset(dirt, 0xa5, sizeof dirt);
  __asm__ volatile("" : : "r"(dirt) : "memory");
}

// Whether the secret lies on the stack of a thread that has run the function.
inline bool leftOnStack(std::function<void()> run, const std::string& secret) {
  std::string stack(size_t{1} << 20U, '\0');
  pthread_attr_t attributes;
  pthread_attr_init(&attributes);
  pthread_attr_setstack(&attributes, stack.data(), stack.size());
  const auto start = [](void* body) -> void* {
    char depth[32768];  // the end of the thread uses what is above
    __asm__ volatile("" : : "r"(depth) : "memory");
    return (*static_cast<std::function<void()>*>(body))(), nullptr;
  };
  pthread_t thread;
  if (pthread_create(&thread, &attributes, start, &run) != 0) std::abort();
  pthread_join(thread, nullptr);
  pthread_attr_destroy(&attributes);
  return stack.find(secret) != std::string::npos;
}

// Bytes that end right before a page that cannot be touched.
class Guarded {
 public:
  explicit Guarded(const std::string& bytes) : page_(static_cast<size_t>(sysconf(_SC_PAGESIZE))) {
    size_ = (bytes.size() / page_ + 2) * page_;
    base_ = static_cast<char*>(mmap(nullptr, size_, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0));
    mprotect(base_ + size_ - page_, page_, PROT_NONE);
    data_ = base_ + size_ - page_ - bytes.size();
    std::memcpy(data_, bytes.data(), bytes.size());
  }
  ~Guarded() { munmap(base_, size_); }
  Guarded(const Guarded&) = delete;
  Guarded& operator=(const Guarded&) = delete;
  char* data() { return data_; }

 private:
  size_t page_;
  size_t size_;
  char* base_;
  char* data_;
};

// Puts another value in place while it lives, such as a failing provider entry.
template <typename T>
class Replaced {
 public:
  Replaced(T& slot, T value) : slot_(slot), before_(std::exchange(slot, value)) {}
  ~Replaced() { slot_ = before_; }
  Replaced(const Replaced&) = delete;
  Replaced& operator=(const Replaced&) = delete;

 private:
  T& slot_;
  T before_;
};
template <typename T, typename V>
Replaced(T&, V) -> Replaced<T>;

// Whether a relative name can be opened from a folder deeper than any path. The loader of a C library newer than 2.36
// waits for ever there, for a lock of its own.
inline bool loaderFindsDeepFolders() {
  return strverscmp(gnu_get_libc_version(), "2.37") < 0;
}

// A folder of its own, removed with all that is in it.
class TempFolder {
 public:
  TempFolder() {
    std::string name = (std::filesystem::temp_directory_path() / "ldappw-test-XXXXXX").string();
    path_ = mkdtemp(name.data());
  }
  ~TempFolder() { std::filesystem::remove_all(path_); }
  std::string file(const std::string& name) const { return (path_ / name).string(); }

 private:
  std::filesystem::path path_;
};

inline std::string fileContent(const std::string& path) {
  std::stringstream content;
  content << std::ifstream(path, std::ios::binary).rdbuf();
  return content.str();
}
inline void putFile(const std::string& path, const std::string& content) {
  std::ofstream(path, std::ios::binary) << content;
}

inline const unsigned char* bytesOf(const std::string& text) {
  return reinterpret_cast<const unsigned char*>(text.data());
}
inline unsigned char* bytesOf(std::string& text) {
  return reinterpret_cast<unsigned char*>(text.data());
}

inline const unsigned char* bytesOf(const char* text) {
  return reinterpret_cast<const unsigned char*>(text);
}
inline unsigned char* bytesOf(char* text) {
  return reinterpret_cast<unsigned char*>(text);
}
inline std::string textOf(const SecBuffer& buffer) {
  return std::string(reinterpret_cast<const char*>(buffer.data), buffer.length);
}

// Takes a text from the product and releases it.
inline std::string taken(char* text) {
  const std::string copy = text != nullptr ? text : "(null)";
  std::free(text);
  return copy;
}

inline std::string fromHex(const std::string& hex) {
  std::string bytes;
  for (size_t i = 0; i + 1 < hex.size(); i += 2) {
    bytes.push_back(static_cast<char>(std::stoi(hex.substr(i, 2), nullptr, 16)));
  }
  return bytes;
}

inline std::string toHex(const void* data, size_t size) {
  static const char digits[] = "0123456789abcdef";
  std::string hex;
  for (size_t i = 0; i < size; ++i) {
    const unsigned byte = static_cast<const unsigned char*>(data)[i];
    hex += {digits[byte >> 4U], digits[byte & 15U]};
  }
  return hex;
}

// A record whose keys are the bytes 0, 1, 2 ... and whose texts are fixed.
inline AesKeyData* fixedRecord() {
  AesKeyData* record = nullptr;
  if (initAesKeyData(&record) != 0) return nullptr;
  for (SecBuffer& key : record->aesKeys) {
    for (uint32_t i = 0; i < key.length; ++i) key.data[i] = static_cast<unsigned char>(i);
  }
  std::memcpy(record->cryptoSalt.data, "saltsaltsalt", 13);
  record->cryptoSync.data = reinterpret_cast<unsigned char*>(strdup("c3luYw=="));
  record->cryptoSync.length = 8;
  setCipherNameGlobal();
  return record;
}

// A record's buffers in the order of a stash file, those of fixedRecord, and its file.
inline std::string contentOf(const AesKeyData& record) {
  std::string content;
  for (const SecBuffer* buffer = &record.cryptoSync; buffer != record.aesKeys + 3; ++buffer) {
    content.append(reinterpret_cast<const char*>(buffer->data), buffer->length);
  }
  return content;
}
inline std::string fixedContent() {
  std::string content = "c3luYw==saltsaltsalt";
  for (const int length : {16, 24, 32}) {
    for (int i = 0; i < length; ++i) content += static_cast<char>(i);
  }
  return content;
}
inline std::string fixedFile() {
  return std::string("\x08\0\0\0", 4) + fixedContent();
}

}  // namespace test
