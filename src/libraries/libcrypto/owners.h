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

template <class T>
T* callocBytes(size_t bytes) noexcept {
  return static_cast<T*>(std::calloc(bytes == 0 ? 1 : bytes, 1));
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

// A terminated copy of counted text, wiped when it goes. Passwords are short: up to kInline bytes need no allocation.
class SecretText {
 public:
  SecretText(const char* text, size_t length) noexcept : length_(length) {
    if (length_ >= kInline) heap_.reset(static_cast<char*>(std::malloc(length_ + 1)));
    if (char* to = get(); to != nullptr) {
      if (length_ != 0) std::memcpy(to, text, length_);
      to[length_] = '\0';
    }
  }
  ~SecretText() {
    if (!heap_ && length_ < kInline) wipe(inline_, length_);
  }
  SecretText(const SecretText&) = delete;
  SecretText& operator=(const SecretText&) = delete;

  explicit operator bool() const noexcept { return length_ < kInline || heap_ != nullptr; }
  char* get() noexcept { return length_ < kInline ? inline_ : heap_.get(); }
  size_t length() const noexcept { return length_; }

 private:
  static constexpr size_t kInline = 256;
  size_t length_;
  SecretOwner<char> heap_;
  char inline_[kInline];
};

// Guards an out-argument from the point after which a failure must clear it: on every way out but keep() what it holds
// is wiped, released and nulled.
template <class T>
class OutGuard {
 public:
  explicit OutGuard(T** out) noexcept : out_(out) {}
  ~OutGuard() {
    if (kept_) return;
    wipeAndFree(*out_);
    *out_ = nullptr;
  }
  OutGuard(const OutGuard&) = delete;
  OutGuard& operator=(const OutGuard&) = delete;

  // Success: what the slot held goes and the caller owns result.
  void keep(T* result) noexcept {
    if (result != *out_) wipeAndFree(*out_);
    *out_ = result;
    kept_ = true;
  }

 private:
  T** out_;
  bool kept_ = false;
};

}  // namespace ldappw
