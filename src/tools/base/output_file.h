// SPDX-License-Identifier: Apache-2.0
// A file that appears under its name only when it is complete: written to a new file in the same folder, brought to the
// disk, then renamed. The temporary file is removed on every failure and when a signal ends the process.
#pragma once

#include <sys/types.h>

#include <string>
#include <string_view>

#include "base/descriptor.h"
#include "base/secret.h"
#include "base/signals.h"

namespace tool {

// Where a file is to be: its folder, which is opened once, and its name there. Whoever may write to a folder above can
// put another in its place afterwards, and nothing is written there.
class Place {
 public:
  // Throws Failure: kUsage when the target exists and overwriting was not asked for, kIoError when it is no regular
  // file or its folder cannot be opened. A target that is a symbolic link is followed where root or the process's own
  // user has made it: another user's would lead the process to a file that this user cannot write.
  Place(const std::string& target, bool overwrite);

  const std::string& path() const noexcept { return path_; }  // for messages
  const std::string& folderPath() const noexcept { return folderPath_; }
  const std::string& name() const noexcept { return name_; }
  int folder() const noexcept { return folder_.get(); }
  bool overwrite() const noexcept { return overwrite_; }
  // Opens a regular file in the folder, to be read, without waiting and without following a link. Not valid after a
  // failure.
  Descriptor open(const std::string& name) const noexcept;

 private:
  std::string path_;
  std::string folderPath_;
  std::string name_;
  Descriptor folder_;
  bool overwrite_;
};

// Warns of the temporary files for this place that runs which were killed have left; those of runs that go on are in
// use. describe (may be null) says what the open file holds.
void nameLeftovers(const Place& place, std::string (*describe)(int fd));

// Every operation throws Failure: kUsage when the target exists and overwriting was not asked for, kIoError otherwise.
// Used by one thread.
class OutputFile {
 public:
  // Makes the temporary file with the given mode. A target that exists keeps its owner and group where the process may
  // set them.
  OutputFile(Place place, mode_t mode);

  const std::string& target() const noexcept { return place_.path(); }
  int fd() const noexcept { return fd_.get(); }

  // Gives the file the mode and the access list of the one that it replaces, where there is one.
  void keepAccess();

  void write(std::string_view bytes);
  // Brings the content to the disk. Nothing has appeared under the target's name yet.
  void sync();
  // Calls sync() if needed, then renames the file and syncs the folder.
  void commit();
  // The two steps of that, for several files.
  void giveName();
  void syncFolder();
  // Gives the file that will be replaced a second name, ".bak" behind its own, and a number where that is taken.
  // Returns its path, or nothing where no file will be replaced, or one with the same content.
  std::string keepOld();
  // Takes both names back.
  void undo() noexcept;

 private:
  Place place_;
  Descriptor old_;  // the file that is replaced
  TemporaryFile temporary_;
  Descriptor fd_;
  std::string kept_;
  bool synced_ = false;
  bool named_ = false;
};

}  // namespace tool
