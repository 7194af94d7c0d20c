// SPDX-License-Identifier: Apache-2.0
// Several key records, tried one after the other: an export in which a rotation has stopped holds values of two.
#pragma once

#include <atomic>
#include <string>
#include <vector>

#include "schemes/values.h"

namespace tool {

class KeyRing {
 public:
  static constexpr size_t kNoKey = static_cast<size_t>(-1);

  // The stash files; empty paths are left out. Throws Failure.
  explicit KeyRing(const std::vector<std::string>& paths);

  bool empty() const noexcept { return keys_.empty(); }
  const std::vector<KeyRecord>& keys() const noexcept { return keys_; }

  // Opens a reversible value. A key that opens it into text is the right one. Bytes count with allowBinary when no key
  // gives text: of two keys the one that finds more padding, which a wrong one hardly ever does; with equal padding
  // neither. Keys before first are left out; used is the place of the key, or kNoKey. The key that opened the last value
  // is tried first, as it mostly opens the next one, and another takes longer to fail.
  Status open(const Examined& value, size_t first, bool allowBinary, Secret& clear, size_t& used) const;

 private:
  std::vector<KeyRecord> keys_;
  mutable std::atomic<size_t> latest_{0};  // that opened a value
};

}  // namespace tool
