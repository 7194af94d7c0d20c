// SPDX-License-Identifier: Apache-2.0
// Owners of memory: what is released, and what is wiped first. Secrets live in SecretBytes or SecretText; the plain
// owner is for public data and has to be chosen.
#pragma once

#include <malloc.h>

#include <cstddef>
#include <cstdlib>
#include <cstring>
#include <memory>

#include "wipe.h"

namespace ldappw {

// Wipes and releases an allocation of unknown size.
inline void wipeAndFree(void* data) noexcept {
  if (data != nullptr) wipe(data, malloc_usable_size(data));
  std::free(data);
}

struct Free {
  void operator()(void* data) const noexcept { std::free(data); }
};

struct WipeAndFree {
  void operator()(void* data) const noexcept { wipeAndFree(data); }
};

// Public data from malloc.
template <class T>
using PlainOwner = std::unique_ptr<T, Free>;

// Clear text, keys, decrypted output from malloc.
template <class T>
using SecretOwner = std::unique_ptr<T, WipeAndFree>;

// Zeroed memory; null when it has run out. For small sizes malloc and a fill: glibc's calloc passes by the cache of the
// thread.
template <class T>
T* zeroedBytes(size_t bytes) noexcept {
  constexpr size_t kSmall = 1024;
  if (bytes > kSmall) return static_cast<T*>(std::calloc(bytes, 1));
  void* data = std::malloc(bytes == 0 ? 1 : bytes);
  return static_cast<T*>(data == nullptr ? nullptr : std::memset(data, 0, bytes));
}

// A zeroed array on the stack, wiped when it goes.
template <size_t kBytes>
class SecretArray {
 public:
  SecretArray() noexcept { std::memset(bytes_, 0, kBytes); }
  ~SecretArray() { wipe(bytes_, kBytes); }
  SecretArray(const SecretArray&) = delete;
  SecretArray& operator=(const SecretArray&) = delete;

  char* text() noexcept { return reinterpret_cast<char*>(bytes_); }
  unsigned char* data() noexcept { return bytes_; }
  static constexpr size_t size() noexcept { return kBytes; }

 private:
  unsigned char bytes_[kBytes];
};

// A buffer whose size is known when it is made; up to kInline bytes need no allocation. Secrets are wiped when it goes.
template <size_t kInline, bool kSecret>
class Buffer {
 public:
  explicit Buffer(size_t bytes) noexcept : bytes_(bytes) {
    if (bytes_ > kInline) heap_.reset(static_cast<unsigned char*>(std::malloc(bytes_)));
  }
  ~Buffer() {
    if (kSecret && *this) wipe(get(), bytes_);
  }
  Buffer(const Buffer&) = delete;
  Buffer& operator=(const Buffer&) = delete;

  explicit operator bool() const noexcept { return bytes_ <= kInline || heap_ != nullptr; }
  unsigned char* get() noexcept { return bytes_ <= kInline ? inline_ : heap_.get(); }
  char* text() noexcept { return reinterpret_cast<char*>(get()); }

 private:
  size_t bytes_;
  PlainOwner<unsigned char> heap_;
  unsigned char inline_[kInline];
};

template <size_t kInline>
using SecretBytes = Buffer<kInline, true>;
template <size_t kInline>
using PlainBytes = Buffer<kInline, false>;

// A terminated copy of counted text.
class SecretText {
 public:
  SecretText(const char* text, size_t length) noexcept : buffer_(length + 1) {
    if (!buffer_) return;
    if (length != 0) std::memcpy(buffer_.get(), text, length);
    buffer_.get()[length] = '\0';
  }
  explicit operator bool() const noexcept { return static_cast<bool>(buffer_); }
  char* get() noexcept { return buffer_.text(); }

 private:
  SecretBytes<256> buffer_;  // passwords and their values are shorter
};

// Guards an out-argument from the point after which a failure must clear it, its making or arm(): on every way out but
// keep() what it holds is wiped, released and nulled.
template <class T>
class OutGuard {
 public:
  explicit OutGuard(T** out, bool armed = true) noexcept : out_(out), armed_(armed) {}
  ~OutGuard() {
    if (!armed_) return;
    wipeAndFree(*out_);
    *out_ = nullptr;
  }
  OutGuard(const OutGuard&) = delete;
  OutGuard& operator=(const OutGuard&) = delete;

  void arm() noexcept { armed_ = true; }

  // Success: what the slot held goes and the caller owns result.
  void keep(T* result) noexcept {
    if (result != *out_) wipeAndFree(*out_);
    *out_ = result;
    armed_ = false;
  }

 private:
  T** out_;
  bool armed_;
};

}  // namespace ldappw
