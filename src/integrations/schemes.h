// SPDX-License-Identifier: Apache-2.0
// The schemes that plug-ins serve, as one table.
#pragma once

#include <cstddef>
#include <string_view>

#include "aes_keys.h"
#include "library.h"

namespace plugin {

// What a check looks at: the payload of a stored value, without its tag, and a presented clear password.
struct Check {
  const Library& library;
  AesKeyData* keys;  // null for a scheme that needs none
  std::string_view payload;
  std::string_view presented;
};

struct Scheme {
  const char* name;   // "aes256"
  const char* tag;    // "{AES256}"
  int code;           // of enum PasswordFormat
  int keyIndex;       // of the AES schemes, else -1
  bool lacking;       // servers do not have it: its tag is registered whatever is served
  size_t holdsBytes;  // a longer new password is refused, not cut; 0: any length
  bool holdsNul;      // a NUL byte is a byte like any other
  bool readsTag;      // the library takes a clear text with the scheme's tag for a digest
  bool (*matches)(const Scheme& scheme, const Check& check);  // null: nothing ever matches, and nothing can be made

  bool needsKeys() const noexcept { return keyIndex >= 0; }
};

enum SchemeIndex : size_t { kQveil, kAes128, kAes192, kAes256, kVldl, kCrypt, kSha, kSsha, kMd5, kSchemeCount };
extern const Scheme kSchemes[kSchemeCount];

// By name ("aes256") or by tag ("{AES256}"), in any case; null when there is none.
const Scheme* findScheme(std::string_view nameOrTag) noexcept;

}  // namespace plugin
