// SPDX-License-Identifier: Apache-2.0
// Where the library was loaded from. That is worked out while it is loaded, before the host can change its working
// folder, against which the loader has just read a relative name; the loader's own note of it cannot be read when
// memory ran out for it.
#include <dlfcn.h>
#include <unistd.h>

#include <atomic>
#include <climits>
#include <cstdio>
#include <cstring>

#include "qel.h"

namespace {

char folder[PATH_MAX];               // that holds qellib/
std::atomic<size_t> folderBytes{0};  // with the NUL; 0 when it is not known. Other threads may load at the same time

// Cuts the last component off an absolute path, and the slashes and components "." before it.
void toParent(char* path) noexcept {
  char* end = std::strrchr(path, '/');
  while (end != path && (end[-1] == '/' || (end[-1] == '.' && end[-2] == '/'))) --end;
  end[end == path ? 1 : 0] = '\0';
}

[[gnu::constructor]] void findFolder() noexcept {
  Dl_info info;
  char here[PATH_MAX] = "";
  if (dladdr(reinterpret_cast<void*>(&treskqels_path), &info) == 0) return;
  if (*info.dli_fname != '/' && getcwd(here, sizeof here) == nullptr) return;
  const int length = std::snprintf(folder, sizeof folder, "%s%s%s", here, *here == '\0' ? "" : "/", info.dli_fname);
  if (length < 0 || static_cast<size_t>(length) + sizeof "/.." > sizeof folder) return;
  toParent(folder);
  char* end = folder + std::strlen(folder);
  const bool isNamed = end - folder < 3 || std::strcmp(end - 3, "/..") != 0;
  isNamed ? toParent(folder)
          : void(std::memcpy(end, "/..", sizeof "/.."));  // else its parent's name is not in the text
  folderBytes.store(std::strlen(folder) + 1, std::memory_order_release);
}

}  // namespace

extern "C" {

int treskqels_path(char* buffer, int size) noexcept {
  const size_t bytes = folderBytes.load(std::memory_order_acquire);
  if (buffer == nullptr || bytes == 0 || size < 0 || static_cast<size_t>(size) < bytes) return 0;
  std::memcpy(buffer, folder, bytes);
  return 1;
}

}  // extern "C"
