// SPDX-License-Identifier: Apache-2.0
// What the pieces of this library share: memory from malloc, and threads that are not cancelled while they write.
#pragma once

#include <pthread.h>

#include <cerrno>
#include <cstdlib>
#include <memory>

namespace dsutil {

struct Free {
  void operator()(char* text) const noexcept { std::free(text); }
};

using Text = std::unique_ptr<char, Free>;

// A cancellation would unwind the caller in the middle of a line, with the stream locked. What the writing does to
// errno is undone too.
class NoCancellation {
 public:
  NoCancellation() noexcept { pthread_setcancelstate(PTHREAD_CANCEL_DISABLE, &before_); }
  ~NoCancellation() {
    pthread_setcancelstate(before_, nullptr);
    errno = error_;
  }
  NoCancellation(const NoCancellation&) = delete;
  NoCancellation& operator=(const NoCancellation&) = delete;

 private:
  int before_ = 0;
  int error_ = errno;
};

}  // namespace dsutil
