// SPDX-License-Identifier: Apache-2.0
// Several key records, tried in turn: an export in which a rotation has stopped holds values under two keys.
#pragma once

#include <atomic>
#include <string>
#include <vector>

#include "schemes/values.h"

namespace tool {

class KeyRing {
 public:
  static constexpr size_t kNoKey = static_cast<size_t>(-1);

  // What came of opening a value.
  struct Opened {
    // kAmbiguous: the two best keys give bytes of the same length, so either can be the wrong one.
    enum class Result { kRefused, kText, kBytes, kAmbiguous };

    Result result = Result::kRefused;
    size_t key = kNoKey;  // the place of the key
    Status refusal;       // of kRefused

    // Bytes are an error unless they are allowed.
    Status status(bool allowBinary) const noexcept;
  };

  KeyRing() = default;
  explicit KeyRing(const std::vector<std::string>& paths) {
    for (const std::string& path : paths) add(path);
  }

  // Loads a stash file; an empty path is left out. Throws Failure.
  void add(const std::string& path);

  bool empty() const noexcept { return keys_.empty(); }
  const std::vector<KeyRecord>& keys() const noexcept { return keys_; }

  // Opens a reversible value with the keys from first on. A key that opens it into text is the right one. If none does,
  // the shortest bytes count: the right key finds all of the padding, a wrong one hardly ever more than a byte.
  Opened open(const Examined& value, size_t first, Secret& clear) const;

 private:
  std::vector<KeyRecord> keys_;
  mutable std::atomic<size_t> latest_{0};  // opened the last value, so it is tried first
};

}  // namespace tool
