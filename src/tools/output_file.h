// SPDX-License-Identifier: Apache-2.0
// A file that appears under its name only when it is complete: written to a new file in the same folder, brought to the
// disk, then renamed. The temporary file goes on every failure and when a signal ends the process.
#ifndef LDAPPW_TOOLS_OUTPUT_FILE_H
#define LDAPPW_TOOLS_OUTPUT_FILE_H

#include <sys/types.h>

#include <cstddef>
#include <string>
#include <string_view>

#include "secret.h"

namespace tool {

// Every operation throws Failure: kUsage when the target exists and overwriting was not asked for, kIoError otherwise.
// Used by one thread.
class OutputFile {
 public:
  // Makes the temporary file with the given mode. A target that is a symbolic link is followed; one that is there keeps
  // its owner and group where the process may set them. Anything but a regular file is refused.
  OutputFile(const std::string& target, mode_t mode, bool overwrite);
  OutputFile(const OutputFile&) = delete;
  OutputFile& operator=(const OutputFile&) = delete;
  ~OutputFile();

  const std::string& target() const noexcept { return target_; }
  const std::string& temporaryPath() const noexcept { return temporary_; }
  int fd() const noexcept { return fd_.get(); }

  void write(std::string_view bytes);
  // Brings the content to the disk. Nothing has appeared under the target's name yet.
  void sync();
  // sync, then gives the file its name and brings the folder to the disk.
  void commit();

 private:
  void resolveTarget(const std::string& target, bool overwrite);
  void syncFolder();

  std::string target_;
  std::string temporary_;
  Descriptor fd_;
  int cleanupSlot_ = -1;
  bool overwrite_;
  bool synced_ = false;
};

}  // namespace tool

#endif
