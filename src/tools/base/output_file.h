// SPDX-License-Identifier: Apache-2.0
// A file that appears under its name only when it is complete: written to a new file in the same folder, brought to the
// disk, then renamed. The temporary file is removed on every failure and when a signal ends the process.
#pragma once

#include <sys/types.h>

#include <string>
#include <string_view>

#include "base/descriptor.h"
#include "base/signals.h"

namespace tool {

// Every operation throws Failure: kUsage when the target exists and overwriting was not asked for, kIoError otherwise.
// Used by one thread.
class OutputFile {
 public:
  // Makes the temporary file with the given mode. A target that is a symbolic link is followed; one that exists keeps
  // its owner and group where the process may set them. Anything but a regular file is refused.
  OutputFile(const std::string& target, mode_t mode, bool overwrite);

  const std::string& target() const noexcept { return target_; }
  const std::string& temporaryPath() const noexcept { return temporary_.path(); }
  int fd() const noexcept { return fd_.get(); }

  // Gives the file the mode and the access list of the one that it replaces, where there is one.
  void keepAccess();
  // Throws when there is no room for so many bytes, for a writer that does not say why it fails.
  void requireRoom(off_t bytes);

  void write(std::string_view bytes);
  // Brings the content to the disk. Nothing has appeared under the target's name yet.
  void sync();
  // Does that where it has not been done, then gives the file its name and brings the folder to the disk.
  void commit();
  // The two steps of that, for several files.
  void giveName();
  void syncFolder();
  // Gives the file that will be replaced a second name, ".bak" behind its own, and a number where that is taken.
  // Returns it, or nothing where no file will be replaced, or one with the same content.
  std::string keepOld();

 private:
  void resolveTarget(const std::string& target, bool overwrite);

  std::string target_;
  TemporaryFile temporary_;
  Descriptor fd_;
  bool overwrite_;
  bool synced_ = false;
};

}  // namespace tool
