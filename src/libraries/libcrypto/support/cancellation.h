// SPDX-License-Identifier: Apache-2.0
// Keeps a thread from being cancelled while it opens libraries or files: a cancellation unwinds the stack, which would
// leave locks held, and ends the process where it meets a function that nothing may leave in that way. What those calls
// do to errno is undone too.
#pragma once

#include <pthread.h>

#include <cerrno>

namespace ldappw {

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

}  // namespace ldappw
