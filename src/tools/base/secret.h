// SPDX-License-Identifier: Apache-2.0
// Owners of bytes that are wiped before their memory is released.
#pragma once

#include <cstddef>
#include <memory>
#include <string_view>

namespace tool {

// A growing byte string. Always followed by a NUL that size() does not count; growth wipes the memory that it leaves.
// Throws std::bad_alloc when memory runs out.
class Secret {
 public:
  Secret() noexcept = default;
  explicit Secret(std::string_view bytes) { append(bytes); }
  Secret(Secret&& other) noexcept;
  Secret& operator=(Secret&& other) noexcept;
  Secret(const Secret&) = delete;
  Secret& operator=(const Secret&) = delete;
  ~Secret();

  char* data() noexcept { return data_ != nullptr ? data_ : &none_; }
  const char* c_str() const noexcept { return data_ != nullptr ? data_ : ""; }
  size_t size() const noexcept { return size_; }
  bool empty() const noexcept { return size_ == 0; }
  std::string_view view() const noexcept { return {c_str(), size_}; }

  void append(std::string_view bytes);
  void append(char byte) { append(std::string_view(&byte, 1)); }
  void resize(size_t size);  // new bytes are NUL; bytes that go are wiped
  void reserve(size_t capacity);
  void clear() noexcept;  // wipes and keeps the memory

 private:
  char* data_ = nullptr;  // capacity_ + 1 bytes
  size_t size_ = 0;
  size_t capacity_ = 0;
  char none_ = '\0';
};

// A text that a C function allocated: wiped up to its NUL, then released with free().
struct WipeAndFree {
  void operator()(char* text) const noexcept;
};
using AllocatedText = std::unique_ptr<char, WipeAndFree>;

// True when both hold the same bytes. The time depends on the two lengths alone.
bool equalBytes(std::string_view a, std::string_view b) noexcept;

}  // namespace tool
