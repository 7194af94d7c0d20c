// SPDX-License-Identifier: Apache-2.0
// Bytes that are wiped before they are released, and the comparison of secrets.
#pragma once

#include <cstdlib>
#include <cstring>
#include <string_view>

namespace plugin {

// A terminated buffer on the heap; false when memory has run out.
class SecretBytes {
 public:
  explicit SecretBytes(size_t size) noexcept : SecretBytes(static_cast<char*>(std::calloc(size + 1, 1)), size) {}
  // Takes over what malloc gave to somebody else.
  SecretBytes(char* bytes, size_t size) noexcept : bytes_(bytes), size_(size) {}
  ~SecretBytes() {
    if (bytes_ == nullptr) return;
    explicit_bzero(bytes_, size_);
    std::free(bytes_);
  }
  SecretBytes(const SecretBytes&) = delete;
  SecretBytes& operator=(const SecretBytes&) = delete;

  explicit operator bool() const noexcept { return bytes_ != nullptr; }
  char* data() noexcept { return bytes_; }
  const char* data() const noexcept { return bytes_; }
  size_t size() const noexcept { return size_; }

 private:
  char* bytes_;
  size_t size_;
};

// The time depends on the two lengths alone.
inline bool equalBytes(std::string_view a, std::string_view b) noexcept {
  if (a.size() != b.size()) return false;
  unsigned differences = 0;
  for (size_t i = 0; i < a.size(); ++i) differences |= static_cast<unsigned char>(a[i] ^ b[i]);
  return differences == 0;
}

}  // namespace plugin
