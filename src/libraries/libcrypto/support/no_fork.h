// SPDX-License-Identifier: Apache-2.0
// Keeps forks waiting while a thread opens libraries, changes the environment or sets up the provider: a child would
// find that half done and nobody to finish it. It is no lock. Threads do not wait for each other, and since a fork may
// hold what such a thread waits for, neither waits for longer than a second. No trace sink runs meanwhile.
#pragma once

namespace ldappw {

class NoFork {
 public:
  NoFork() noexcept;
  ~NoFork();
  NoFork(const NoFork&) = delete;
  NoFork& operator=(const NoFork&) = delete;

 private:
  unsigned generation_;
};

}  // namespace ldappw
