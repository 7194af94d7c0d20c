// SPDX-License-Identifier: Apache-2.0
// Owners of bytes that are wiped, and of descriptors.
#include "secret.h"

#include <errno.h>
#include <fcntl.h>
#include <string.h>
#include <unistd.h>

#include <algorithm>
#include <cstdlib>
#include <new>
#include <utility>

#include "common.h"

namespace tool {
namespace {

constexpr std::size_t kReadBytes = std::size_t{1} << 16;

}  // namespace

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

void Secret::reserve(std::size_t capacity) {
  if (data_ != nullptr && capacity <= capacity_) return;
  if (capacity > SIZE_MAX / 2) throw std::bad_alloc();
  const std::size_t grown = std::max({capacity, capacity_ * 2, std::size_t{63}});
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

void Secret::resize(std::size_t size) {
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

bool equalBytes(std::string_view a, std::string_view b) noexcept {
  if (a.size() != b.size()) return false;
  volatile unsigned char difference = 0;
  for (std::size_t i = 0; i < a.size(); ++i) {
    difference = static_cast<unsigned char>(difference | (a[i] ^ b[i]));
  }
  return difference == 0;
}

Descriptor& Descriptor::operator=(Descriptor&& other) noexcept {
  if (this != &other) {
    reset();
    fd_ = other.release();
  }
  return *this;
}

int Descriptor::release() noexcept {
  return std::exchange(fd_, -1);
}

void Descriptor::reset() noexcept {
  if (fd_ >= 0) close(fd_);
  fd_ = -1;
}

Descriptor openInput(const std::string& path) {
  Descriptor file(open(path.c_str(), O_RDONLY | O_NOCTTY | O_CLOEXEC));
  if (!file.valid()) throw Failure(kIoError, systemText(path, errno));
  return file;
}

bool LineReader::lineBuffered() const noexcept {
  return ended_ || buffer_.view().find('\n', position_) != std::string_view::npos;
}

// Drops what was handed out and reads once more; false at the end of the input.
bool LineReader::fill() {
  if (ended_) return false;
  if (position_ > 0) {
    const std::size_t rest = buffer_.size() - position_;
    memmove(buffer_.data(), buffer_.data() + position_, rest);
    buffer_.resize(rest);
    position_ = 0;
  }
  const std::size_t before = buffer_.size();
  buffer_.resize(before + kReadBytes);
  ssize_t count = 0;
  do {
    count = read(fd_, buffer_.data() + before, kReadBytes);
  } while (count < 0 && errno == EINTR);
  const int error = errno;
  buffer_.resize(before + static_cast<std::size_t>(std::max<ssize_t>(count, 0)));
  if (count < 0) throw Failure(kIoError, systemText(name_, error));
  ended_ = count == 0;
  return !ended_;
}

bool LineReader::next(Secret& line) {
  line.clear();
  std::size_t searched = position_;
  for (;;) {
    const std::size_t end = buffer_.view().find('\n', searched);
    if (end != std::string_view::npos) {
      line.append(buffer_.view().substr(position_, end - position_));
      position_ = end + 1;
      return true;
    }
    const std::size_t pending = buffer_.size() - position_;
    if (!fill()) break;
    searched = pending;
  }
  if (position_ == buffer_.size()) return false;
  line.append(buffer_.view().substr(position_));
  position_ = buffer_.size();
  return true;
}

}  // namespace tool
