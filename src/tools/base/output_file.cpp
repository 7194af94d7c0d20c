// SPDX-License-Identifier: Apache-2.0
// Writing a file beside its target and renaming it when it is complete.
#include "base/output_file.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <filesystem>
#include <memory>

#include "base/failure.h"
#include "base/generate.h"
#include "base/messages.h"

namespace tool {
namespace {

constexpr char kAccessList[] = "system.posix_acl_access";
constexpr size_t kAccessListBytes = 4096;  // a page holds it
constexpr size_t kShownNameBytes = 200;    // of the target, so that the temporary name is not too long
constexpr size_t kDrawnCharacters = 6;     // at the end of a temporary name
constexpr size_t kComparedBytes = size_t{1} << 16;

// The absolute path of a file that need not exist, links followed.
std::filesystem::path resolved(const std::string& path) {
  std::error_code error;
  std::filesystem::path whole = std::filesystem::weakly_canonical(std::filesystem::absolute(path), error);
  if (error) throw ioFailure(path, error.value());
  return whole;
}

// Of two files that are not too large to be stash files.
bool sameContent(int a, int b) {
  const Secret first = beginningOf(a, kComparedBytes);
  return first.size() < kComparedBytes && equalBytes(first.view(), beginningOf(b, kComparedBytes).view());
}

Failure existsFailure(const std::string& path) {
  return Failure(kUsage, path + " exists already; --force replaces it");
}

// Renames without replacing a file that has appeared meanwhile. A file system that has no such step has links.
bool renameToNew(int folder, const std::string& from, const std::string& to) {
  if (renameat2(folder, from.c_str(), folder, to.c_str(), RENAME_NOREPLACE) == 0) return true;
  return (errno == EINVAL || errno == ENOSYS) && linkat(folder, from.c_str(), folder, to.c_str(), 0) == 0 &&
         unlinkat(folder, from.c_str(), 0) == 0;
}

std::string temporaryBeginning(const Place& place) {
  return "." + place.name().substr(0, kShownNameBytes) + ".";
}

bool sameFile(const struct stat& a, const struct stat& b) noexcept {
  return a.st_dev == b.st_dev && a.st_ino == b.st_ino;
}

// Folders that may be written but not read cannot be locked or synced, and serve all the same.
Descriptor openFolder(const std::string& path) {
  Descriptor folder = openPath(path, O_RDONLY | O_DIRECTORY);
  if (!folder.valid() && errno == EACCES) folder = openPath(path, O_PATH | O_DIRECTORY);
  if (!folder.valid()) throw ioFailure(path);
  return folder;
}

}  // namespace

Place::Place(const std::string& target, bool overwrite) : overwrite_(overwrite) {
  const std::string name = std::filesystem::path(target).filename();
  struct stat found {};
  const bool exists = stat(target.c_str(), &found) == 0;
  if (target == "-") throw Failure(kUsage, "this file is not written to standard output");
  if (exists && !S_ISREG(found.st_mode)) throw Failure(kIoError, target + " is not a regular file");
  if (name.empty() || name == "." || name == "..") throw Failure(kUsage, "'" + target + "' does not name a file");
  if (lstat(target.c_str(), &found) == 0) {
    if (!overwrite) throw existsFailure(target);
    if (S_ISLNK(found.st_mode) && found.st_uid != 0 && found.st_uid != geteuid()) {
      throw Failure(kIoError, target + " is a link that another user has made; it is not followed");
    }
  }
  const std::filesystem::path whole = resolved(target);
  path_ = whole;
  folderPath_ = whole.parent_path();
  name_ = whole.filename();
  folder_ = openFolder(folderPath_);
}

Descriptor Place::open(const std::string& name) const noexcept {
  constexpr int kFlags = O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC;
  Descriptor file(openat(folder_.get(), name.c_str(), kFlags));
  struct stat found {};
  if (file.valid() && fstat(file.get(), &found) == 0 && S_ISREG(found.st_mode)) return file;
  return Descriptor();
}

void nameLeftovers(const Place& place, std::string (*describe)(int fd)) {
  struct Close {
    void operator()(DIR* folder) const noexcept { closedir(folder); }
  };
  const std::string beginning = temporaryBeginning(place);
  const int fd = openat(place.folder(), ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  const std::unique_ptr<DIR, Close> folder(fd < 0 ? nullptr : fdopendir(fd));
  if (!folder) return;
  while (const dirent* entry = readdir(folder.get())) {
    const std::string name = entry->d_name;
    if (name.size() != beginning.size() + kDrawnCharacters || name.compare(0, beginning.size(), beginning) != 0) {
      continue;
    }
    const Descriptor file = place.open(name);
    if (file.valid() && flock(file.get(), LOCK_SH | LOCK_NB) != 0 && errno == EWOULDBLOCK) continue;
    std::string left = "a run that was ended has left " + place.folderPath();
    left.append("/").append(name);
    if (describe != nullptr && file.valid()) left.append(", ").append(describe(file.get()));
    warning(left);
  }
}

OutputFile::OutputFile(Place place, mode_t mode) : place_(std::move(place)) {
  constexpr int kFlags = O_RDWR | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC;
  if (place_.overwrite()) old_ = place_.open(place_.name());
  struct stat old {};
  const bool replaces = fstatat(place_.folder(), place_.name().c_str(), &old, AT_SYMLINK_NOFOLLOW) == 0;
  const SignalBlock block;  // until the file is on the list of what a signal removes
  std::string name;
  do {
    name = temporaryBeginning(place_) + std::string(generatePassword(kDrawnCharacters).view());
    fd_ = Descriptor(openat(place_.folder(), name.c_str(), kFlags, S_IRUSR | S_IWUSR));
  } while (!fd_.valid() && errno == EEXIST);
  if (!fd_.valid()) throw ioFailure("a new file beside " + target());
  temporary_ = TemporaryFile(place_.folder(), name);
  flock(fd_.get(), LOCK_EX | LOCK_NB);  // in use, as nameLeftovers() sees; some file systems have no locks
  if (replaces && fchown(fd_.get(), old.st_uid, old.st_gid) != 0) {
    warning(target() + " will not keep its owner: " + strerror(errno));
  }
  if (fchmod(fd_.get(), mode) != 0) throw ioFailure(target());
}

void OutputFile::keepAccess() {
  struct stat old {};
  const bool replaces = old_.valid() ? fstat(old_.get(), &old) == 0
                                     : fstatat(place_.folder(), place_.name().c_str(), &old, AT_SYMLINK_NOFOLLOW) == 0;
  if (!replaces) return;
  char list[kAccessListBytes];
  const ssize_t bytes = fgetxattr(old_.get(), kAccessList, list, sizeof list);
  if (bytes < 0 && errno == ENODATA) fremovexattr(fd_.get(), kAccessList);  // one that the folder gives to new files
  if (fchmod(fd_.get(), old.st_mode & 07777) != 0) throw ioFailure(target());
  const bool unknown = bytes < 0 && errno != ENODATA && errno != EOPNOTSUPP;
  if (unknown || (bytes > 0 && fsetxattr(fd_.get(), kAccessList, list, static_cast<size_t>(bytes), 0) != 0)) {
    warning(target() + " will not keep its access list: " + strerror(errno));
  }
}

void OutputFile::write(std::string_view bytes) {
  synced_ = false;
  writeAll(fd_.get(), bytes, target());
}

void OutputFile::sync() {
  if (fsync(fd_.get()) != 0) throw ioFailure(target());
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
  const int folder = place_.folder();
  const std::string& name = place_.name();
  if (!place_.overwrite() || fstatat(folder, name.c_str(), &old, AT_SYMLINK_NOFOLLOW) != 0) return "";
  if (old_.valid() && sameContent(old_.get(), fd_.get())) return "";
  for (int i = 1; i <= kMostCopies; ++i) {
    const std::string kept = name + ".bak" + (i > 1 ? std::to_string(i) : "");
    if (linkat(folder, name.c_str(), folder, kept.c_str(), 0) == 0 || renameToNew(folder, name, kept)) {
      kept_ = kept;
      return place_.folderPath() + "/" + kept;
    }
    if (errno != EEXIST) throw ioFailure(target() + ".bak");
  }
  throw ioFailure(target() + ".bak", EEXIST);
}

void OutputFile::giveName() {
  const int folder = place_.folder();
  const std::string& from = temporary_.name();
  const std::string& to = place_.name();
  if (place_.overwrite() ? renameat(folder, from.c_str(), folder, to.c_str()) != 0 : !renameToNew(folder, from, to)) {
    throw errno == EEXIST ? existsFailure(target()) : ioFailure(target());
  }
  temporary_.forget();
  named_ = true;
  struct stat named {};
  struct stat made {};
  if (fstatat(folder, to.c_str(), &named, AT_SYMLINK_NOFOLLOW) != 0 || fstat(fd_.get(), &made) != 0 ||
      !sameFile(named, made)) {
    throw Failure(kIoError, target() + " is not the file that was written: somebody else writes to its folder");
  }
}

void OutputFile::undo() noexcept {
  const int folder = place_.folder();
  if (named_ && kept_.empty()) unlinkat(folder, place_.name().c_str(), 0);
  if (named_ && !kept_.empty()) renameat(folder, kept_.c_str(), folder, place_.name().c_str());
  if (!named_ && !kept_.empty()) unlinkat(folder, kept_.c_str(), 0);
}

// The name has changed already: that a folder cannot be synced is reported, not undone. Some file systems refuse.
void OutputFile::syncFolder() {
  if (fsync(place_.folder()) == 0) return;
  if (errno != EINVAL && errno != EBADF) throw ioFailure(place_.folderPath());
}

}  // namespace tool
