// SPDX-License-Identifier: Apache-2.0
// The record of one key stash file, and the provider that keys and digests need.
#pragma once

#include <memory>
#include <string>
#include <string_view>

#include "aes_keys.h"
#include "base/secret.h"

namespace tool {

// Move-only.
class KeyRecord {
 public:
  explicit KeyRecord(AesKeyData* record = nullptr) noexcept : record_(record) {}

  // Reads a stash file, once, and warns when others can read it; an empty path gives no record. Throws Failure:
  // kIoError when the file cannot be read, kBadKey when it is not a stash file.
  static KeyRecord load(const std::string& path);
  // Takes the content of a stash file apart; no record when it is none.
  static KeyRecord parse(const Secret& content);
  // The content of the record's stash file.
  Secret content() const;

  AesKeyData* get() const noexcept { return record_.get(); }
  explicit operator bool() const noexcept { return record_ != nullptr; }
  std::string_view sync() const noexcept;  // not of an empty one
  std::string_view salt() const noexcept;

 private:
  struct Free {
    void operator()(AesKeyData* record) const noexcept { freeAesKeyData(record); }
  };
  std::unique_ptr<AesKeyData, Free> record_;
};

bool sameRecord(const KeyRecord& a, const KeyRecord& b);

// The group that may read stash files beside their owner and its own group. Throws Failure (kUsage) when there is none
// of that name or number.
void allowKeysGroup(const std::string& name);

std::string_view viewOf(const SecBuffer& buffer) noexcept;

// Loads the crypto provider; throws Failure with kInternal when it cannot be loaded. Call it before threads start.
void requireProvider();

}  // namespace tool
