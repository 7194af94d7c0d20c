// SPDX-License-Identifier: Apache-2.0
#include "base/descriptor.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>

#include "base/failure.h"

namespace tool {

Descriptor::~Descriptor() {
  if (fd_ >= 0) close(fd_);
}

Descriptor openPath(const std::string& path, int flags) noexcept {
  return Descriptor(open(path.c_str(), flags | O_NOCTTY | O_CLOEXEC));
}

Secret beginningOf(int fd, size_t bytes) {
  Secret content;
  content.resize(bytes);
  size_t filled = 0;
  while (filled < bytes) {
    const ssize_t count = pread(fd, content.data() + filled, bytes - filled, static_cast<off_t>(filled));
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) throw ioFailure("a file that is open");
    if (count == 0) break;
    filled += static_cast<size_t>(count);
  }
  content.resize(filled);
  return content;
}

void writeAll(int fd, std::string_view bytes, const std::string& name) {
  while (!bytes.empty()) {
    const ssize_t count = write(fd, bytes.data(), bytes.size());
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) throw ioFailure(name);
    bytes.remove_prefix(static_cast<size_t>(count));
  }
}

void tryWrite(int fd, std::string_view text) noexcept {
  const ssize_t written = write(fd, text.data(), text.size());
  static_cast<void>(written);
}

}  // namespace tool
