// SPDX-License-Identifier: Apache-2.0
// Where the library was loaded from, as the dynamic loader tells it.
#include <dlfcn.h>
#include <link.h>

#include <climits>
#include <cstddef>
#include <cstring>

#include "qel.h"

namespace qel {
namespace {

// A current directory and a name relative to it, each with the system's bound; the loader joins them without a check.
constexpr std::size_t kOriginBytes = 2 * PATH_MAX + 2;

bool loadDirectory(char* origin) noexcept {
  Dl_info info;
  void* self = nullptr;
  if (dladdr1(reinterpret_cast<void*>(&treskqels_path), &info, &self, RTLD_DL_LINKMAP) == 0) return false;
  if (self == nullptr || *static_cast<const link_map*>(self)->l_name == '\0') return false;  // not a loaded library
  return dlinfo(self, RTLD_DI_ORIGIN, origin) == 0;
}

// Cuts slashes and components "." off the end.
std::size_t trimEnd(const char* path, std::size_t length) noexcept {
  for (;;) {
    if (length > 0 && path[length - 1] == '/') {
      --length;
    } else if (length > 1 && path[length - 1] == '.' && path[length - 2] == '/') {
      length -= 2;
    } else {
      return length;
    }
  }
}

// Turns a directory into its parent, by its text; one that ends in ".." has its parent only behind another "..".
void toParent(char* path) noexcept {
  std::size_t length = trimEnd(path, std::strlen(path));
  if (length >= 3 && std::memcmp(path + length - 3, "/..", 3) == 0) {
    std::memcpy(path + length, "/..", sizeof "/..");
    return;
  }
  while (length > 0 && path[length - 1] != '/') --length;
  length = trimEnd(path, length);
  if (length == 0) path[length++] = '/';
  path[length] = '\0';
}

}  // namespace
}  // namespace qel

extern "C" {

int treskqels_path(char* buffer, int size) noexcept {
  char path[qel::kOriginBytes + sizeof "/.."];
  if (buffer == nullptr || !qel::loadDirectory(path)) return 0;
  qel::toParent(path);
  const std::size_t bytes = std::strlen(path) + 1;
  if (size < 0 || static_cast<std::size_t>(size) < bytes) return 0;
  std::memcpy(buffer, path, bytes);
  return 1;
}

}  // extern "C"
