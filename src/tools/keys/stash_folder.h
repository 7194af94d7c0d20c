// SPDX-License-Identifier: Apache-2.0
// The folders that stash files are made in: one run at a time makes files in one, and names what an earlier run, ended
// before it could tidy up, has left there.
#pragma once

#include <string>
#include <vector>

#include "base/descriptor.h"

namespace tool {

// Locks the folders of stash files to be made; they are unlocked when the object or the process ends. Waits for another
// run, with a message. Throws Failure (kIoError) for a folder that cannot be opened.
class StashFolders {
 public:
  explicit StashFolders(const std::vector<std::string>& files);

 private:
  std::vector<Descriptor> folders_;
};

}  // namespace tool
