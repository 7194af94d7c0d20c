// SPDX-License-Identifier: Apache-2.0
// What the key modules share inside the library.
#pragma once

#include "aes_keys.h"

namespace ldappw {

// Guards a caller's slot for a record: unless it is kept, what the slot holds is freed and the slot nulled.
class RecordGuard {
 public:
  explicit RecordGuard(AesKeyData** slot) noexcept : slot_(slot) {}
  ~RecordGuard() {
    if (kept_ || *slot_ == nullptr) return;
    freeAesKeyData(*slot_);
    *slot_ = nullptr;
  }
  RecordGuard(const RecordGuard&) = delete;
  RecordGuard& operator=(const RecordGuard&) = delete;
  void keep() noexcept { kept_ = true; }

 private:
  AesKeyData** slot_;
  bool kept_ = false;
};

// Writes a stash file, created with mode 0600 or truncated. Returns 0 or 1; a file written in part stays.
int writeKeyStashFile(const char* keyStashFile, const AesKeyData* keyData) noexcept;

// A random number from lowBound to highBound - 1. Ends the process for bounds that are not in order.
int morva_rand_range(void* qelCtx, int lowBound, int highBound) noexcept;

}  // namespace ldappw
