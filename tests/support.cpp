// SPDX-License-Identifier: Apache-2.0
// The watches over allocations and releases: the linker routes those of the product through the functions below.
#include "support.h"

#include <malloc.h>

namespace {

thread_local bool watching = false;
thread_local long counted = 0;
thread_local long failing = -1;

thread_local const std::string* soughtSecret = nullptr;
thread_local long released = 0;
thread_local long releasedWithSecret = 0;

bool fails() {
  return watching && counted++ == failing;
}

}  // namespace

// Visible, since the linker finds the sanitizer's runtime asking for the same names.
#pragma GCC visibility push(default)
extern "C" {
void* __real_malloc(size_t size);
void* __real_calloc(size_t count, size_t size);
char* __real_strdup(const char* text);
void __real_free(void* data);

void* __wrap_malloc(size_t size) {
  return fails() ? nullptr : __real_malloc(size);
}
void* __wrap_calloc(size_t count, size_t size) {
  return fails() ? nullptr : __real_calloc(count, size);
}
char* __wrap_strdup(const char* text) {
  return fails() ? nullptr : __real_strdup(text);
}
void __wrap_free(void* data) {
  if (data != nullptr && soughtSecret != nullptr) {
    ++released;
    const size_t bytes = malloc_usable_size(data);
    if (memmem(data, bytes, soughtSecret->data(), soughtSecret->size()) != nullptr) ++releasedWithSecret;
  }
  __real_free(data);
}
}
#pragma GCC visibility pop

namespace test {

AllocationWatch::AllocationWatch(long failingNumber) {
  counted = 0;
  failing = failingNumber;
  watching = true;
}

AllocationWatch::~AllocationWatch() {
  watching = false;
}

long AllocationWatch::count() const {
  return counted;
}

ReleaseWatch::ReleaseWatch(std::string secret) : secret_(std::move(secret)) {
  released = releasedWithSecret = 0;
  soughtSecret = &secret_;
}

ReleaseWatch::~ReleaseWatch() {
  soughtSecret = nullptr;
}

long ReleaseWatch::releases() const {
  return released;
}

long ReleaseWatch::withSecret() const {
  return releasedWithSecret;
}

}  // namespace test
