// SPDX-License-Identifier: Apache-2.0
// What the fuzz targets share: the input, taken apart from its front into heap blocks of exactly their size, so that
// the sanitizers see every step beyond one; the requirement whose breach is a find; and a key record.
#pragma once

#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <string>
#include <string_view>
#include <type_traits>

#include "aes_keys.h"

namespace fuzz {

inline void require(bool holds, int line = __builtin_LINE()) {
  if (holds) return;
  std::fprintf(stderr, "The requirement in line %d does not hold.\n", line);
  std::abort();
}

// Bytes with nothing readable behind them.
class Block {
 public:
  explicit Block(size_t size) : size_(size), data_(new char[size]()) {}
  explicit Block(std::string_view bytes) : Block(bytes.size()) { bytes.copy(data_.get(), bytes.size()); }
  // A NUL-terminated text: what comes before a first NUL.
  static Block text(std::string_view bytes) {
    Block block(bytes.substr(0, bytes.find('\0')).size() + 1);
    bytes.copy(block.text(), block.size_ - 1);
    return block;
  }

  char* text() const { return data_.get(); }
  unsigned char* bytes() const { return reinterpret_cast<unsigned char*>(data_.get()); }
  int length() const { return static_cast<int>(size_); }
  std::string_view view() const { return {data_.get(), size_}; }

 private:
  size_t size_;
  std::unique_ptr<char[]> data_;
};

class Input {
 public:
  Input(const uint8_t* data, size_t size) : rest_(reinterpret_cast<const char*>(data), size) {}

  // What is not there is zeros, or less.
  template <typename T>
  T number() {
    static_assert(std::is_integral_v<T>);
    T value = 0;
    const std::string_view bytes = take(sizeof value);
    if (!bytes.empty()) std::memcpy(&value, bytes.data(), bytes.size());
    return value;
  }
  unsigned byte() { return number<unsigned char>(); }
  std::string_view take(size_t size) {
    const std::string_view taken = rest_.substr(0, size);
    rest_.remove_prefix(taken.size());
    return taken;
  }
  std::string_view counted() { return take(byte()); }
  std::string_view rest() { return take(rest_.size()); }
  bool empty() const { return rest_.empty(); }

 private:
  std::string_view rest_;
};

struct Free {
  void operator()(void* data) const { std::free(data); }
};
template <typename T>
using Made = std::unique_ptr<T, Free>;

inline AesKeyData* keyRecord() {
  static AesKeyData* const record = [] {
    AesKeyData* made = nullptr;
    require(initAesKeyData(&made) == 0 && setCipherNameGlobal() == 0);
    for (const SecBuffer& key : made->aesKeys) std::memset(key.data, 'k', key.length);
    std::memset(made->cryptoSalt.data, 's', made->cryptoSalt.length);
    return made;
  }();
  return record;
}

}  // namespace fuzz
