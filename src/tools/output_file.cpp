// SPDX-License-Identifier: Apache-2.0
// Writing a file beside its target and renaming it when it is complete.
#include "output_file.h"

#include <errno.h>
#include <fcntl.h>
#include <limits.h>
#include <stdio.h>
#include <stdlib.h>
#include <sys/stat.h>
#include <unistd.h>

#include "failure.h"
#include "messages.h"
#include "secret.h"
#include "signals.h"

namespace tool {
namespace {

constexpr std::size_t kShownNameBytes = 200;  // of the target, so that the temporary name is not too long

std::string realPath(const std::string& path) {
  const AllocatedText resolved(realpath(path.c_str(), nullptr));
  if (!resolved) throw ioFailure(path);
  return resolved.get();
}

std::string folderOf(const std::string& path) {
  const std::size_t slash = path.rfind('/');
  if (slash == std::string::npos) return ".";
  return slash == 0 ? "/" : path.substr(0, slash);
}

// The path of a file that need not exist, with its folder resolved.
std::string canonical(const std::string& path) {
  const std::size_t slash = path.rfind('/');
  const std::string name = slash == std::string::npos ? path : path.substr(slash + 1);
  if (name.empty() || name == "." || name == "..") throw Failure(kUsage, "'" + path + "' does not name a file");
  const std::string folder = realPath(folderOf(path));
  return folder == "/" ? folder + name : folder + "/" + name;
}

Failure existsFailure(const std::string& path) {
  return Failure(kUsage, path + " exists already; --force replaces it");
}

// Renames without replacing a file that has appeared meanwhile. On a file system that cannot do that in one step, it
// looks first.
int renameToNew(const std::string& from, const std::string& to) {
  if (renameat2(AT_FDCWD, from.c_str(), AT_FDCWD, to.c_str(), RENAME_NOREPLACE) == 0) return 0;
  if (errno != EINVAL && errno != ENOSYS) return -1;
  if (access(to.c_str(), F_OK) == 0) {
    errno = EEXIST;
    return -1;
  }
  return rename(from.c_str(), to.c_str());
}

}  // namespace

OutputFile::OutputFile(const std::string& target, mode_t mode, bool overwrite) : overwrite_(overwrite) {
  resolveTarget(target, overwrite);
  struct stat old {};
  const bool replaces = stat(target_.c_str(), &old) == 0;
  const std::size_t slash = target_.rfind('/');
  std::string path = target_.substr(0, slash + 1) + "." + target_.substr(slash + 1, kShownNameBytes) + ".XXXXXX";
  const SignalBlock block;  // until the file is on the list of what a signal removes
  fd_ = Descriptor(mkostemp(path.data(), O_CLOEXEC));
  if (!fd_.valid()) throw ioFailure("a new file beside " + target_);
  temporary_ = TemporaryFile(path);
  if (replaces && fchown(fd_.get(), old.st_uid, old.st_gid) != 0) {
    warning(target_ + " will not keep its owner: " + strerror(errno));
  }
  if (fchmod(fd_.get(), mode) != 0) throw ioFailure(path);
}

void OutputFile::resolveTarget(const std::string& target, bool overwrite) {
  struct stat found {};
  if (stat(target.c_str(), &found) == 0) {
    if (!S_ISREG(found.st_mode)) throw Failure(kIoError, target + " is not a regular file");
    if (!overwrite) throw existsFailure(target);
    target_ = realPath(target);
    return;
  }
  target_ = canonical(target);
  if (!overwrite && lstat(target_.c_str(), &found) == 0) throw existsFailure(target);
}

void OutputFile::write(std::string_view bytes) {
  synced_ = false;
  writeAll(fd_.get(), bytes, target_);
}

void OutputFile::sync() {
  if (fsync(fd_.get()) != 0) throw ioFailure(target_);
  synced_ = true;
}

void OutputFile::commit() {
  if (!synced_) sync();
  const std::string& from = temporary_.path();
  const int renamed = overwrite_ ? rename(from.c_str(), target_.c_str()) : renameToNew(from, target_);
  if (renamed != 0 && errno == EEXIST) throw existsFailure(target_);
  if (renamed != 0) throw ioFailure(target_);
  temporary_.forget();
  fd_ = Descriptor();
  syncFolder();
}

// The name has changed already: that a folder cannot be synced is reported, not undone. Some file systems refuse.
void OutputFile::syncFolder() {
  const Descriptor folder = openPath(folderOf(target_), O_RDONLY | O_DIRECTORY);
  if (folder.valid() && fsync(folder.get()) == 0) return;
  if (errno != EINVAL && errno != EACCES) throw ioFailure(folderOf(target_));
}

}  // namespace tool
