// SPDX-License-Identifier: Apache-2.0
// The folders that stash files are made in: one run at a time makes files in one, and names what an earlier run, ended
// before it could tidy up, has left there.
#pragma once

#include <vector>

#include "base/output_file.h"

namespace tool {

// Locks the folders of stash files to be made; they are unlocked when the places go, or the process ends. Another run
// is waited for with a message, and not for long: whoever may read a folder can lock it for ever. Throws Failure
// (kIoError) that says who holds the lock.
class StashFolders {
 public:
  explicit StashFolders(std::vector<const Place*> places);
};

}  // namespace tool
