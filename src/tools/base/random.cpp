// SPDX-License-Identifier: Apache-2.0
#include "base/random.h"

#include <sys/random.h>

#include <cerrno>

#include "base/failure.h"

namespace tool {

void drawRandom(void* out, size_t bytes) {
  auto* next = static_cast<char*>(out);
  while (bytes > 0) {
    const ssize_t count = getrandom(next, bytes, 0);
    if (count < 0 && errno == EINTR) continue;
    if (count <= 0) throw Failure(kInternal, "the system has no random bytes");
    next += count;
    bytes -= static_cast<size_t>(count);
  }
}

}  // namespace tool
