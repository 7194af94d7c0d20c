// SPDX-License-Identifier: Apache-2.0
// Locks on the folders themselves, which leave no lock file behind.
#include "keys/stash_folder.h"

#include <sys/file.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstdio>
#include <fstream>
#include <sstream>
#include <string>
#include <thread>

#include "base/failure.h"
#include "base/messages.h"
#include "schemes/key_record.h"

namespace tool {
namespace {

constexpr int kTries = 50;
constexpr std::chrono::milliseconds kBetweenTries{100};

// Who has locked the folder, as /proc/locks lists it: "1: FLOCK ADVISORY WRITE 4711 08:01:1234 0 EOF".
std::string holderOf(int folder) {
  struct stat locked {};
  fstat(folder, &locked);
  char place[64];
  snprintf(place, sizeof place, "%02x:%02x:%llu", major(locked.st_dev), minor(locked.st_dev),
           static_cast<unsigned long long>(locked.st_ino));
  std::ifstream locks("/proc/locks");
  std::string line;
  while (std::getline(locks, line)) {
    std::istringstream fields(line);
    std::string number, kind, way, access, file;
    int process = 0;
    if (!(fields >> number >> kind >> way >> access >> process >> file)) continue;
    if (kind != "FLOCK" || file != place || process <= 0) continue;
    std::string name = "?";
    std::getline(std::ifstream("/proc/" + std::to_string(process) + "/comm"), name);
    return "process " + std::to_string(process) + " (" + name + ")";
  }
  return "a process that cannot be seen from here";
}

// Some file systems have no locks: there the runs of a careful administrator come one after the other.
void lock(const Place& place) {
  for (int i = 0; i < kTries; ++i) {
    if (flock(place.folder(), LOCK_EX | LOCK_NB) == 0 || errno != EWOULDBLOCK) return;
    if (i == 0) message("waiting for another run that makes stash files in " + place.folderPath());
    std::this_thread::sleep_for(kBetweenTries);
  }
  throw Failure(kIoError, place.folderPath() + " is locked by " + holderOf(place.folder()) + "; nothing was written");
}

std::string describe(int fd) {
  constexpr size_t kMostBytes = size_t{1} << 16;
  const KeyRecord record = KeyRecord::parse(beginningOf(fd, kMostBytes));
  return record ? "a whole stash file with the sync text " + std::string(record.sync()) : "no whole stash file";
}

}  // namespace

StashFolders::StashFolders(std::vector<const Place*> places) {
  // In one order, so that two runs do not wait for each other.
  std::sort(places.begin(), places.end(), [](const Place* a, const Place* b) { return a->path() < b->path(); });
  const Place* last = nullptr;
  for (const Place* place : places) {
    if (last == nullptr || place->folderPath() != last->folderPath()) lock(*place);
    last = place;
    nameLeftovers(*place, describe);
  }
}

}  // namespace tool
