// SPDX-License-Identifier: Apache-2.0
#include "base/secret.h"

#include <algorithm>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <new>
#include <utility>

namespace tool {

Secret::Secret(Secret&& other) noexcept
    : data_(std::exchange(other.data_, nullptr)),
      size_(std::exchange(other.size_, 0)),
      capacity_(std::exchange(other.capacity_, 0)) {}

Secret& Secret::operator=(Secret&& other) noexcept {
  std::swap(data_, other.data_);
  std::swap(size_, other.size_);
  std::swap(capacity_, other.capacity_);
  return *this;
}

Secret::~Secret() {
  if (data_ == nullptr) return;
  explicit_bzero(data_, capacity_ + 1);
  free(data_);
}

void Secret::reserve(size_t capacity) {
  if (data_ != nullptr && capacity <= capacity_) return;
  if (capacity > SIZE_MAX / 2) throw std::bad_alloc();
  const size_t grown = std::max({capacity, capacity_ * 2, size_t{63}});
  char* fresh = static_cast<char*>(malloc(grown + 1));
  if (fresh == nullptr) throw std::bad_alloc();
  if (data_ != nullptr) {
    memcpy(fresh, data_, size_);
    explicit_bzero(data_, capacity_ + 1);
    free(data_);
  }
  fresh[size_] = '\0';
  data_ = fresh;
  capacity_ = grown;
}

void Secret::append(std::string_view bytes) {
  if (bytes.size() > SIZE_MAX / 2 - size_) throw std::bad_alloc();
  reserve(size_ + bytes.size());
  if (!bytes.empty()) memcpy(data_ + size_, bytes.data(), bytes.size());
  size_ += bytes.size();
  data_[size_] = '\0';
}

void Secret::resize(size_t size) {
  reserve(size);
  if (size < size_) {
    explicit_bzero(data_ + size, size_ - size);
  } else {
    memset(data_ + size_, 0, size - size_);
  }
  size_ = size;
  data_[size_] = '\0';
}

void Secret::clear() noexcept {
  if (data_ == nullptr) return;
  explicit_bzero(data_, size_);
  size_ = 0;
}

void WipeAndFree::operator()(char* text) const noexcept {
  explicit_bzero(text, strlen(text));
  free(text);
}

bool equalBytes(std::string_view a, std::string_view b) noexcept {
  if (a.size() != b.size()) return false;
  volatile unsigned char difference = 0;
  for (size_t i = 0; i < a.size(); ++i) {
    difference = static_cast<unsigned char>(difference | (a[i] ^ b[i]));
  }
  return difference == 0;
}

}  // namespace tool
