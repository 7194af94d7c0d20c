// SPDX-License-Identifier: Apache-2.0
// One budget of memory for all threads that compute schemes which take much on purpose: a stored value says how much,
// and as many at once as there are threads would take as many times that.
#pragma once

#include <cstdint>

namespace tool {

// A share of the budget, waited for until the others leave enough. A thread holds one at a time.
class MemoryShare {
 public:
  explicit MemoryShare(std::uint64_t bytes);
  ~MemoryShare();
  MemoryShare(const MemoryShare&) = delete;
  MemoryShare& operator=(const MemoryShare&) = delete;
  // False when the whole budget is less than what was asked for.
  bool granted() const noexcept { return granted_; }

 private:
  std::uint64_t bytes_;
  bool granted_;
};

// Before threads start; without it the budget is a quarter of the machine's memory.
void setMemoryLimit(std::uint64_t mebibytes);

}  // namespace tool
