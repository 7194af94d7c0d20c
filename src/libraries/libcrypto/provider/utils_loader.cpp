// SPDX-License-Identifier: Apache-2.0
// The wrappers over the dynamic loader, and two helpers of the server's start-up: the library path and the repair of
// cipher specifications. Failures go to the debug printer alone.
#include "provider/utils_loader.h"

#include <dlfcn.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "dsutil.h"
#include "encoding_utils.h"
#include "support/cancellation.h"
#include "support/no_fork.h"
#include "support/owners.h"

namespace ldappw {
namespace {

constexpr unsigned kLoaderClass = 0xc8110000;
constexpr unsigned kTextClass = 0xc8010000;
constexpr size_t kPathSize = 2049;
constexpr size_t kSpecsSize = 65;
constexpr char kVariable[] = "LD_LIBRARY_PATH";
constexpr char kSystemFolder[] = "/usr/lib";

void** closedCell = nullptr;

bool isDebugging() noexcept {
  return read_ldap_debug() != 0;
}

void reportOverflow(size_t tried, size_t size, int line) noexcept {
  if (tried >= size && isDebugging()) PrintDebug(kTextClass, "kubstr error near %s:%d\n", __FILE__, line);
}

void* open(const char* fileName, int flags) noexcept {
  const NoFork unforked;
  return dlopen(fileName, flags);
}

void* find(void* library, const char* symbol) noexcept {
  const NoFork unforked;
  return dlsym(library, symbol);
}

bool holdsElement(char* path, const char* element) noexcept {
  char* rest = nullptr;
  for (const char* at = strtok_r(path, ":", &rest); at != nullptr; at = strtok_r(nullptr, ":", &rest)) {
    if (std::strcmp(at, element) == 0) return true;
  }
  return false;
}

}  // namespace

void rememberClosed(void** cell) noexcept {
  __atomic_store_n(&closedCell, cell, __ATOMIC_RELAXED);
}

bool isClosed(void** cell) noexcept {
  return cell != nullptr && cell == __atomic_load_n(&closedCell, __ATOMIC_RELAXED);
}

}  // namespace ldappw

using namespace ldappw;

extern "C" {

// Documented in encoding_utils.h.

int defFlags = RTLD_NOW | RTLD_GLOBAL;

void** ldapLoadLib(const char* fileName, int flags) noexcept {
  if (fileName == nullptr) return nullptr;  // the loader would open the program itself
  const NoCancellation uncancelled;
  PlainOwner<void*> cell(newBytes<void*>(sizeof(void*)));
  if (!cell) return nullptr;
  *cell = open(fileName, flags == 0 ? defFlags : flags);
  if (*cell == nullptr) {  // the loader's text is asked for once: without debugging it stays for the caller
    if (isDebugging()) PrintDebug(kLoaderClass, "dlopen failed for %s: %s\n", fileName, dlerror());
    return nullptr;
  }
  if (isClosed(cell.get())) rememberClosed(nullptr);
  return cell.release();
}

int ldapUnloadLib(void** handle) noexcept {
  if (handle == nullptr) return LDAPPW_OTHER;
  const NoCancellation uncancelled;
  if (*handle != nullptr) {
    const NoFork unforked;
    dlclose(*handle);
  }
  *handle = nullptr;
  std::free(handle);
  return LDAPPW_SUCCESS;
}

void* ldapGetSymAddress(void** handle, const char* symbol) noexcept {
  if (handle == nullptr || symbol == nullptr) return nullptr;
  void* address = find(*handle, symbol);
  if (address == nullptr && isDebugging()) PrintDebug(kLoaderClass, "dlsym failed: %s\n", dlerror());
  return address;
}

int setDefLibpath(void) noexcept {
  const PlainOwner<char> value(ldap_getenv(kVariable));
  if (!value && ldap_chkenv(kVariable) != 0) return LDAPPW_NO_MEMORY;  // set, but there is no copy: the path stays
  if (value) {
    char elements[kPathSize] = "";
    kub_strlcat(elements, value.get(), sizeof elements);
    if (holdsElement(elements, kSystemFolder)) return 0;
  }
  char libraryPath[kPathSize] = "";
  kub_strlcat(libraryPath, kVariable, sizeof libraryPath);
  const size_t first = kub_strlcat(libraryPath, "=", sizeof libraryPath);
  reportOverflow(first, sizeof libraryPath, __LINE__);
  if (value) {
    kub_strlcat(libraryPath, value.get(), sizeof libraryPath);
    reportOverflow(first, sizeof libraryPath, __LINE__);  // of the first append: a cut here is not reported
    reportOverflow(kub_strlcat(libraryPath, ":", sizeof libraryPath), sizeof libraryPath, __LINE__);
    reportOverflow(kub_strlcat(libraryPath, kSystemFolder, sizeof libraryPath), sizeof libraryPath, __LINE__);
  } else {
    kub_strlcat(libraryPath, kSystemFolder, sizeof libraryPath);
    reportOverflow(first, sizeof libraryPath, __LINE__);
  }
  return setenv(kVariable, libraryPath + first, 1);  // a copy, which outlives this library
}

void fixupCipherSpecs(char* specs) noexcept {
  if (specs == nullptr) return;
  const char* later = std::strstr(specs, "0A");
  char* earlier = std::strstr(specs, "09");
  if (later == nullptr || earlier == nullptr || later < earlier) return;
  char fixed[kSpecsSize] = "";
  const auto before = static_cast<size_t>(earlier - specs);
  std::memcpy(fixed, specs, before < kSpecsSize ? before : kSpecsSize - 1);
  reportOverflow(kub_strlcat(fixed, "0A", sizeof fixed), sizeof fixed, __LINE__);
  reportOverflow(kub_strlcat(fixed, earlier, sizeof fixed), sizeof fixed, __LINE__);
  std::memcpy(specs, fixed, std::strlen(fixed) + 1);
}

}  // extern "C"
