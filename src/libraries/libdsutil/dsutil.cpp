// SPDX-License-Identifier: Apache-2.0
// The debug printer, the environment, the install directory and the bounded append.
#include "dsutil.h"

#include <dlfcn.h>
#include <link.h>

#include <unistd.h>

#include <atomic>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "guards.h"

namespace {

int levelFromEnvironment() {
  const char* text = secure_getenv("LDAP_DEBUG");
  return text == nullptr ? 0 : static_cast<int>(std::strtol(text, nullptr, 0));
}

std::atomic<int> debugLevel{levelFromEnvironment()};

// The name under which the loader knows this library, or null where it is part of the program.
const char* nameOfThisLibrary() {
  Dl_info info;
  void* self = nullptr;
  if (dladdr1(static_cast<const void*>(&debugLevel), &info, &self, RTLD_DL_LINKMAP) == 0 || self == nullptr) {
    return nullptr;
  }
  const char* name = static_cast<const link_map*>(self)->l_name;
  return *name == '\0' ? nullptr : name;
}

// The working directory when this library was loaded, which a relative name starts from; the process may leave it.
dsutil::Text folderAtLoad;

__attribute__((constructor)) void rememberFolder() {
  const char* name = nameOfThisLibrary();
  if (name != nullptr && *name != '/') folderAtLoad.reset(getcwd(nullptr, 0));
}

}  // namespace

extern "C" {

void PrintDebug(unsigned debugClass, const char* format, ...) {
  if (debugLevel.load(std::memory_order_relaxed) == 0) return;
  const dsutil::NoCancellation uncancelled;
  va_list values;
  va_start(values, format);
  flockfile(stderr);  // the class and the text stay together when threads print at once
  std::fprintf(stderr, "%08x ", debugClass);
  std::vfprintf(stderr, format, values);
  funlockfile(stderr);
  va_end(values);
}

int read_ldap_debug(void) {
  return debugLevel.load(std::memory_order_relaxed);
}

void set_ldap_debug(int level) {
  debugLevel.store(level, std::memory_order_relaxed);
}

char* ldap_getenv(const char* name) {
  const char* value = name == nullptr ? nullptr : secure_getenv(name);
  return value == nullptr ? nullptr : strdup(value);
}

int ldap_chkenv(const char* name) {
  const char* value = name == nullptr ? nullptr : secure_getenv(name);
  return value != nullptr && *value != '\0' ? 1 : 0;
}

int putEnvVar(const char* name, const char* value) {
  return name == nullptr || value == nullptr ? -1 : setenv(name, value, 1);
}

// Not the loader's own account of the directory: that comes without a bound on its length, or not at all.
char* getKUBInstallLibPath(void) {
  const char* name = nameOfThisLibrary();
  if (name == nullptr) return nullptr;
  const bool isRelative = *name != '/';
  if (isRelative && !folderAtLoad) return nullptr;
  const char* start = isRelative ? folderAtLoad.get() : "";
  const char* slash = std::strrchr(name, '/');
  const size_t folderBytes = slash == nullptr ? 0 : static_cast<size_t>(slash - name);
  const size_t size = std::strlen(start) + 1 + folderBytes + 1;
  char* path = static_cast<char*>(std::malloc(size));
  if (path == nullptr) return nullptr;
  std::snprintf(path, size, "%s%s%.*s", start, isRelative && folderBytes != 0 ? "/" : "", static_cast<int>(folderBytes),
                name);
  if (*path == '\0') std::memcpy(path, "/", 2);
  return path;
}

size_t kub_strlcat(char* destination, const char* source, size_t size) {
  const size_t used = strnlen(destination, size);
  const size_t added = std::strlen(source);
  if (used == size) return size + added;
  const size_t fits = added < size - used ? added : size - used - 1;
  std::memcpy(destination + used, source, fits);
  destination[used + fits] = '\0';
  return used + added;
}

}  // extern "C"
