// SPDX-License-Identifier: Apache-2.0
// The watches over allocations and releases: the linker routes those of the product through the functions below.
#include "support.h"

#include <malloc.h>

#include <cerrno>

namespace {

using test::watched;

bool fails() {
  if (!watched.isCounting) return false;
  const long number = watched.counted++;
  const bool failed = number == watched.failing || (watched.andLater && number > watched.failing);
  watched.live += failed ? 0 : 1;
  if (failed) errno = ENOMEM;
  return failed;
}

// New memory is full of junk, which goes on behind its end up to a mark with the size: nothing may be taken for zero,
// and nothing written there, without being noticed.
constexpr unsigned char kJunk = 0xa5;
struct Mark {
  static constexpr uint64_t kSign = 0x6c64617070770a5aU;
  uint64_t sign;
  uint64_t size;
};
constexpr size_t kFence = 2 * sizeof(Mark);

unsigned char* markOf(void* data) {
  return static_cast<unsigned char*>(data) + malloc_usable_size(data) - sizeof(Mark);
}

void* fenced(void* data, size_t size) {
  if (data == nullptr) return nullptr;
  const Mark mark{Mark::kSign, size};
  std::memset(data, kJunk, malloc_usable_size(data));
  std::memcpy(markOf(data), &mark, sizeof mark);
  return data;
}

void checkFence(void* data) {
  Mark mark{};
  if (malloc_usable_size(data) < kFence) return;
  std::memcpy(&mark, markOf(data), sizeof mark);
  if (mark.sign != Mark::kSign) return;  // from elsewhere
  for (auto* at = static_cast<unsigned char*>(data) + mark.size; at < markOf(data); ++at) {
    if (*at != kJunk) std::abort();
  }
  std::memset(markOf(data), 0, sizeof mark);
}

}  // namespace

// Visible, since the linker finds the sanitizer's runtime asking for the same names.
#pragma GCC visibility push(default)
extern "C" {
void* __real_malloc(size_t size);
void __real_free(void* data);

void* __wrap_malloc(size_t size) {
  return fails() ? nullptr : fenced(__real_malloc(size + kFence), size);
}
void* __wrap_calloc(size_t count, size_t size) {
  if (fails()) return nullptr;
  void* data = fenced(__real_malloc(count * size + kFence), count * size);
  return data == nullptr ? nullptr : std::memset(data, 0, count * size);
}
char* __wrap_strdup(const char* text) {
  void* data = __wrap_malloc(std::strlen(text) + 1);
  return data == nullptr ? nullptr : std::strcpy(static_cast<char*>(data), text);
}
void __wrap_free(void* data) {
  if (data != nullptr) checkFence(data);
  if (data != nullptr && watched.secret != nullptr) {
    const std::string& secret = *watched.secret;
    if (memmem(data, malloc_usable_size(data), secret.data(), secret.size()) != nullptr) ++watched.withSecret;
  }
  if (data != nullptr && watched.isCounting) --watched.live;
  __real_free(data);
}
}
#pragma GCC visibility pop
