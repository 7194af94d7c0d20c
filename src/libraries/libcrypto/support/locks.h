// SPDX-License-Identifier: Apache-2.0
// The library's two locks. A fork takes both, so that the child, which has none of the other threads, finds what they
// guard complete and the locks free. They are over pthreads, whose mutexes need no constructor to run.
#pragma once

namespace ldappw {

// Held while the provider context is created. The thread that holds it passes: a trace sink may itself format a
// password.
class CreationLock {
 public:
  CreationLock() noexcept;
  ~CreationLock();
  CreationLock(const CreationLock&) = delete;
  CreationLock& operator=(const CreationLock&) = delete;

 private:
  bool passed_;
};

}  // namespace ldappw
