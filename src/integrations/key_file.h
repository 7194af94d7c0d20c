// SPDX-License-Identifier: Apache-2.0
// Loading a key stash file for a server, which goes on without keys when it cannot be used.
#pragma once

#include "library.h"

namespace plugin {

// What to write to the server's log about a key file.
struct KeyReport {
  char problem[4352] = "";  // why there are no keys; empty when there are
  char warning[4352] = "";  // what is wrong with a file that was loaded; empty when nothing is
};

// Loads the file and makes sure that its keys can be used. Returns null when there are none; a null path is one reason
// for that. To be called while the process has one thread.
AesKeyData* loadKeyFile(const Library& library, const char* path, KeyReport& report) noexcept;

}  // namespace plugin
