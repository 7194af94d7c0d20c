// SPDX-License-Identifier: Apache-2.0
// Owners of key data records and of their buffers.
#pragma once

#include "aes_keys.h"
#include "support/owners.h"

namespace ldappw {

// Wipes and releases a buffer that holds its length in bytes.
inline void release(SecBuffer& buffer) noexcept {
  wipeAndFree(buffer.data, buffer.length);
  buffer.data = nullptr;
}

struct FreeRecord {
  void operator()(AesKeyData* record) const noexcept {
    if (record != nullptr) freeAesKeyData(record);
  }
};

// Guards a caller's slot for a record.
using RecordGuard = OutGuard<AesKeyData, FreeRecord>;

}  // namespace ldappw
