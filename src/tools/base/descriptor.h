// SPDX-License-Identifier: Apache-2.0
// Owning a file descriptor, and writing to one.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>
#include <utility>

#include "base/secret.h"

namespace tool {

// An open file descriptor, closed on destruction.
class Descriptor {
 public:
  Descriptor() noexcept = default;
  explicit Descriptor(int fd) noexcept : fd_(fd) {}
  Descriptor(Descriptor&& other) noexcept : fd_(std::exchange(other.fd_, -1)) {}
  Descriptor& operator=(Descriptor&& other) noexcept {
    std::swap(fd_, other.fd_);
    return *this;
  }
  ~Descriptor();
  int get() const noexcept { return fd_; }
  bool valid() const noexcept { return fd_ >= 0; }

 private:
  int fd_ = -1;
};

// Opens a path, closed in programs that are started and never a controlling terminal. Not valid after a failure
// (errno).
Descriptor openPath(const std::string& path, int flags) noexcept;

// The beginning of a file, wherever it is read or written otherwise: so many bytes, or all of it. Throws Failure with
// kIoError.
Secret beginningOf(int fd, size_t bytes);

// Writes all bytes; throws Failure with kIoError, in which name stands for the descriptor.
void writeAll(int fd, std::string_view bytes, const std::string& name);

// Writes once, where nobody is left whom a failure could be reported to.
void tryWrite(int fd, std::string_view text) noexcept;

}  // namespace tool
