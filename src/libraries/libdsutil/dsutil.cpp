// SPDX-License-Identifier: Apache-2.0
// The debug printer, the environment, the install directory and the bounded append.
#include "dsutil.h"

#include <dlfcn.h>
#include <link.h>

#include <atomic>
#include <climits>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>

namespace {

int levelFromEnvironment() {
  const char* text = secure_getenv("LDAP_DEBUG");
  return text == nullptr ? 0 : static_cast<int>(std::strtol(text, nullptr, 0));
}

std::atomic<int> debugLevel{levelFromEnvironment()};

}  // namespace

extern "C" {

void PrintDebug(unsigned debugClass, const char* format, ...) {
  if (debugLevel.load(std::memory_order_relaxed) == 0) return;
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

char* getKUBInstallLibPath(void) {
  Dl_info info;
  void* self = nullptr;
  if (dladdr1(reinterpret_cast<void*>(&getKUBInstallLibPath), &info, &self, RTLD_DL_LINKMAP) == 0) return nullptr;
  char origin[PATH_MAX + 1];  // the loader's own bound on the path of an object
  return dlinfo(self, RTLD_DI_ORIGIN, origin) == 0 ? strdup(origin) : nullptr;
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
