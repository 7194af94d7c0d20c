// SPDX-License-Identifier: Apache-2.0
// Bytes that are wiped before their memory is released, and reading them from a file descriptor without a copy that
// nobody wipes.
#ifndef LDAPPW_TOOLS_SECRET_H
#define LDAPPW_TOOLS_SECRET_H

#include <cstddef>
#include <string>
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
  std::size_t size() const noexcept { return size_; }
  bool empty() const noexcept { return size_ == 0; }
  std::string_view view() const noexcept { return {c_str(), size_}; }

  void append(std::string_view bytes);
  void append(char byte) { append(std::string_view(&byte, 1)); }
  void resize(std::size_t size);  // new bytes are NUL; bytes that go are wiped
  void reserve(std::size_t capacity);
  void clear() noexcept;  // wipes and keeps the memory

 private:
  char* data_ = nullptr;  // capacity_ + 1 bytes
  std::size_t size_ = 0;
  std::size_t capacity_ = 0;
  char none_ = '\0';
};

// True when both hold the same bytes. The time depends on the two lengths alone.
bool equalBytes(std::string_view a, std::string_view b) noexcept;

// An open file descriptor, closed on destruction.
class Descriptor {
 public:
  Descriptor() noexcept = default;
  explicit Descriptor(int fd) noexcept : fd_(fd) {}
  Descriptor(Descriptor&& other) noexcept : fd_(other.release()) {}
  Descriptor& operator=(Descriptor&& other) noexcept;
  ~Descriptor() { reset(); }
  int get() const noexcept { return fd_; }
  bool valid() const noexcept { return fd_ >= 0; }
  int release() noexcept;
  void reset() noexcept;

 private:
  int fd_ = -1;
};

// Opens a file to be read; throws Failure with kIoError.
Descriptor openInput(const std::string& path);

// Splits what a descriptor delivers into lines. The newline is no part of a line, a carriage return stays, and a last
// line without a newline counts. The descriptor stays the caller's.
class LineReader {
 public:
  // name is what messages call the input.
  LineReader(int fd, std::string name) : fd_(fd), name_(std::move(name)) {}

  // Puts the next line into line; false at the end of the input. Throws Failure with kIoError.
  bool next(Secret& line);
  // False when next() may have to wait for input: the moment to flush results.
  bool lineBuffered() const noexcept;

 private:
  bool fill();

  int fd_;
  std::string name_;
  Secret buffer_;
  std::size_t position_ = 0;
  bool ended_ = false;
};

}  // namespace tool

#endif
