// SPDX-License-Identifier: Apache-2.0
// Writing a file beside its target and renaming it when it is complete.
#include "base/output_file.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <filesystem>

#include "base/failure.h"
#include "base/input.h"
#include "base/messages.h"
#include "base/signals.h"

namespace tool {
namespace {

constexpr char kAccessList[] = "system.posix_acl_access";
constexpr size_t kAccessListBytes = 4096;  // a page holds it
constexpr size_t kShownNameBytes = 200;    // of the target, so that the temporary name is not too long

// The absolute path of a file that need not exist, links followed.
std::string resolved(const std::string& path) {
  std::error_code error;
  const std::filesystem::path whole = std::filesystem::weakly_canonical(std::filesystem::absolute(path), error);
  if (error) throw ioFailure(path, error.value());
  return whole;
}

// Of two files that are not too large to be stash files.
bool sameContent(const std::string& a, const std::string& b) {
  constexpr size_t kMostBytes = size_t{1} << 16;
  Input first(a);
  Input second(b);
  Secret one;
  Secret other;
  while (one.size() < kMostBytes && first.more(one, kMostBytes)) {
  }
  while (other.size() < kMostBytes && second.more(other, kMostBytes)) {
  }
  return one.size() < kMostBytes && equalBytes(one.view(), other.view());
}

Failure existsFailure(const std::string& path) {
  return Failure(kUsage, path + " exists already; --force replaces it");
}

// Renames without replacing a file that has appeared meanwhile. A file system that has no such step has links.
bool renameToNew(const std::string& from, const std::string& to) {
  if (renameat2(AT_FDCWD, from.c_str(), AT_FDCWD, to.c_str(), RENAME_NOREPLACE) == 0) return true;
  return (errno == EINVAL || errno == ENOSYS) && link(from.c_str(), to.c_str()) == 0 && unlink(from.c_str()) == 0;
}

}  // namespace

OutputFile::OutputFile(const std::string& target, mode_t mode, bool overwrite) : overwrite_(overwrite) {
  resolveTarget(target, overwrite);
  struct stat old {};
  const bool replaces = stat(target_.c_str(), &old) == 0;
  const size_t slash = target_.rfind('/');
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
  const std::string name = std::filesystem::path(target).filename();
  struct stat found {};
  const bool exists = stat(target.c_str(), &found) == 0;
  if (target == "-") throw Failure(kUsage, "this file is not written to standard output");
  if (exists && !S_ISREG(found.st_mode)) throw Failure(kIoError, target + " is not a regular file");
  if (name.empty() || name == "." || name == "..") throw Failure(kUsage, "'" + target + "' does not name a file");
  if (!overwrite && lstat(target.c_str(), &found) == 0) throw existsFailure(target);
  target_ = resolved(target);
}

void OutputFile::keepAccess() {
  struct stat old {};
  if (stat(target_.c_str(), &old) != 0) return;
  char list[kAccessListBytes];
  const ssize_t bytes = getxattr(target_.c_str(), kAccessList, list, sizeof list);
  if (bytes < 0 && errno == ENODATA) fremovexattr(fd_.get(), kAccessList);  // one that the folder gives to new files
  if (fchmod(fd_.get(), old.st_mode & 07777) != 0) throw ioFailure(target_);
  const bool unknown = bytes < 0 && errno != ENODATA && errno != EOPNOTSUPP;
  if (unknown || (bytes > 0 && fsetxattr(fd_.get(), kAccessList, list, static_cast<size_t>(bytes), 0) != 0)) {
    warning(target_ + " will not keep its access list: " + strerror(errno));
  }
}

void OutputFile::requireRoom(off_t bytes) {
  const int error = posix_fallocate(fd_.get(), 0, bytes);
  if (error != 0 && error != EINVAL && error != EOPNOTSUPP) throw ioFailure(target_, error);
  if (ftruncate(fd_.get(), 0) != 0) throw ioFailure(target_);
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
  giveName();
  syncFolder();
}

std::string OutputFile::keepOld() {
  constexpr int kMostCopies = 1000;
  struct stat old {};
  if (!overwrite_ || stat(target_.c_str(), &old) != 0 || sameContent(target_, temporary_.path())) return "";
  for (int i = 1; i <= kMostCopies; ++i) {
    std::string kept = target_ + ".bak" + (i > 1 ? std::to_string(i) : "");
    if (link(target_.c_str(), kept.c_str()) == 0 || renameToNew(target_, kept)) return kept;
    if (errno != EEXIST) throw ioFailure(kept);
  }
  throw ioFailure(target_ + ".bak", EEXIST);
}

void OutputFile::giveName() {
  const std::string& from = temporary_.path();
  if (overwrite_ ? rename(from.c_str(), target_.c_str()) != 0 : !renameToNew(from, target_)) {
    throw errno == EEXIST ? existsFailure(target_) : ioFailure(target_);
  }
  temporary_.forget();
  fd_ = Descriptor();
}

// The name has changed already: that a folder cannot be synced is reported, not undone. Some file systems refuse.
void OutputFile::syncFolder() {
  const std::string path = std::filesystem::path(target_).parent_path();
  const Descriptor folder = openPath(path, O_RDONLY | O_DIRECTORY);
  if (folder.valid() && fsync(folder.get()) == 0) return;
  if (errno != EINVAL && errno != EACCES) throw ioFailure(path);
}

}  // namespace tool
