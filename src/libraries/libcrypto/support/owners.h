// SPDX-License-Identifier: Apache-2.0
// Owners of memory: what is released, and what is wiped first. Secrets live in SecretArray, SecretBytes, TextCopy or
// SecretText; the plain owners are for public data and have to be chosen. Whoever wipes knows the size: the allocator
// is never asked, since a host may have replaced it.
#pragma once

#include <cerrno>
#include <cstddef>
#include <cstdlib>
#include <cstring>
#include <memory>

#include "support/wipe.h"

namespace ldappw {

struct Free {
  void operator()(void* data) const noexcept { std::free(data); }
};

// Wipes a text up to its terminator and releases it.
inline void wipeAndFreeText(char* text) noexcept {
  if (text != nullptr) wipe(text, std::strlen(text));
  std::free(text);
}

// Wipes so many bytes and releases them.
inline void wipeAndFree(void* data, size_t bytes) noexcept {
  if (data != nullptr) wipe(data, bytes);
  std::free(data);
}

struct WipeText {
  void operator()(char* text) const noexcept { wipeAndFreeText(text); }
};

// Public data from malloc, and clear text from malloc.
template <typename T>
using PlainOwner = std::unique_ptr<T, Free>;
using SecretText = std::unique_ptr<char, WipeText>;

// Memory; null when it has run out, which a result tells, and not the host's errno as well.
template <typename T>
T* newBytes(size_t bytes, void* (*allocate)(size_t) = std::malloc) noexcept {
  const int before = errno;
  void* data = allocate(bytes);
  if (__builtin_expect(data == nullptr, 0)) errno = before;
  return static_cast<T*>(data);
}

// A copy of a text.
inline char* newText(const char* text) noexcept {
  const size_t bytes = std::strlen(text) + 1;
  char* copy = newBytes<char>(bytes);
  if (copy != nullptr) std::memcpy(copy, text, bytes);
  return copy;
}

// Zeroed memory. For small sizes malloc and a fill: glibc's calloc passes by the cache of the thread.
template <typename T>
T* zeroedBytes(size_t bytes) noexcept {
  constexpr size_t kSmall = 1024;
  if (bytes > kSmall) return newBytes<T>(bytes, [](size_t size) { return std::calloc(size, 1); });
  T* data = newBytes<T>(bytes == 0 ? 1 : bytes);
  if (data != nullptr) std::memset(static_cast<void*>(data), 0, bytes);
  return data;
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

// A buffer whose size is known when it is made; up to kInline bytes need no allocation. One for secrets is zeroed,
// since who fills it may fill less than it claims, and wiped when it goes; one for public data is for those who write
// all of it.
template <size_t kInline, bool kSecret>
class Buffer {
 public:
  explicit Buffer(size_t bytes) noexcept : bytes_(bytes), data_(bytes <= kInline ? inline_ : allocated(bytes)) {
    if (kSecret && isInline()) std::memset(inline_, 0, inlineBytes());
  }
  ~Buffer() {
    if (!isInline()) {
      wipeAndFree(data_, kSecret ? bytes_ : 0);
    } else if (kSecret) {
      wipe(inline_, inlineBytes());
    }
  }
  Buffer(const Buffer&) = delete;
  Buffer& operator=(const Buffer&) = delete;

  explicit operator bool() const noexcept { return data_ != nullptr; }
  unsigned char* get() noexcept { return data_; }
  char* text() noexcept { return reinterpret_cast<char*>(data_); }
  size_t size() const noexcept { return bytes_; }

 private:
  static unsigned char* allocated(size_t bytes) noexcept {
    return kSecret ? zeroedBytes<unsigned char>(bytes) : newBytes<unsigned char>(bytes);
  }
  bool isInline() const noexcept { return data_ == inline_; }
  size_t inlineBytes() const noexcept { return kInline <= 128 ? kInline : bytes_; }  // a known size needs no call

  size_t bytes_;
  unsigned char* data_;
  unsigned char inline_[kInline];
};

template <size_t kInline>
using SecretBytes = Buffer<kInline, true>;
template <size_t kInline>
using PlainBytes = Buffer<kInline, false>;

// A terminated copy of counted text.
class TextCopy {
 public:
  TextCopy(const char* text, size_t length) noexcept : buffer_(length + 1) {
    if (buffer_ && length != 0) std::memcpy(buffer_.get(), text, length);
  }
  explicit operator bool() const noexcept { return static_cast<bool>(buffer_); }
  char* get() noexcept { return buffer_.text(); }

 private:
  SecretBytes<256> buffer_;  // passwords and their values are shorter
};

// Guards a caller's slot: every way out but keep() releases what the slot holds and nulls it. A null slot is nobody's.
template <typename T, typename Release = Free>
class OutGuard {
 public:
  explicit OutGuard(T** slot) noexcept : slot_(slot) {}
  ~OutGuard() {
    if (slot_ == nullptr) return;
    Release{}(*slot_);
    *slot_ = nullptr;
  }
  OutGuard(const OutGuard&) = delete;
  OutGuard& operator=(const OutGuard&) = delete;

  // Success: what the slot holds now is the caller's.
  void keep() noexcept { slot_ = nullptr; }

 private:
  T** slot_;
};

}  // namespace ldappw
