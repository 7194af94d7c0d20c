// SPDX-License-Identifier: Apache-2.0
// Locks on the folders themselves, which leave no lock file behind, and the search for left temporary files.
#include "keys/stash_folder.h"

#include <fcntl.h>
#include <sys/file.h>

#include <algorithm>
#include <cerrno>
#include <filesystem>

#include "base/failure.h"
#include "base/messages.h"
#include "schemes/key_record.h"

namespace tool {
namespace {

constexpr size_t kDrawnCharacters = 6;  // at the end of a temporary file's name

// Some file systems have no locks: there the runs of a careful administrator come one after the other.
void lock(const Descriptor& folder, const std::string& path) {
  int result = flock(folder.get(), LOCK_EX | LOCK_NB);
  if (result != 0 && errno == EWOULDBLOCK) {
    message("waiting for another run that makes stash files in " + path);
    do {
      result = flock(folder.get(), LOCK_EX);
    } while (result != 0 && errno == EINTR);
  }
}

std::string describe(const std::string& path) {
  try {
    return "a whole stash file with the sync text " + std::string(KeyRecord::load(path).sync());
  } catch (const Failure&) {
    return "no whole stash file";
  }
}

void nameLeftovers(const std::filesystem::path& folder, const std::string& name) {
  const std::string beginning = "." + name + ".";
  std::error_code error;
  for (std::filesystem::directory_iterator entry(folder, error), end; !error && entry != end; entry.increment(error)) {
    const std::string found = entry->path().filename();
    if (found.size() != beginning.size() + kDrawnCharacters || found.compare(0, beginning.size(), beginning) != 0)
      continue;
    warning("a run that was ended has left " + entry->path().string() + ", " + describe(entry->path()));
  }
}

}  // namespace

StashFolders::StashFolders(const std::vector<std::string>& files) {
  std::vector<std::filesystem::path> paths;
  for (const std::string& file : files) {
    std::error_code error;
    const std::filesystem::path whole = std::filesystem::weakly_canonical(std::filesystem::absolute(file), error);
    if (!error && !whole.filename().empty()) paths.push_back(whole);
  }
  std::sort(paths.begin(), paths.end());  // in one order, so that two runs do not wait for each other
  std::string last;
  for (const std::filesystem::path& path : paths) {
    const std::string folder = path.parent_path();
    if (folder != last) folders_.push_back(openPath(folder, O_RDONLY | O_DIRECTORY));
    if (folder != last && folders_.back().valid()) lock(folders_.back(), folder);
    last = folder;
    nameLeftovers(folder, path.filename());
  }
}

}  // namespace tool
