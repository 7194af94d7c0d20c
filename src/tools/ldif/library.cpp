// SPDX-License-Identifier: Apache-2.0
// Opening the LDAP client library.
#include "ldif/library.h"

#include <dlfcn.h>

#include <cstring>
#include <string>

#include "base/failure.h"

namespace tool {
namespace {

template <typename Function>
void resolve(void* library, const char* name, Function& function) {
  void* address = library != nullptr ? dlsym(library, name) : nullptr;
  if (address == nullptr) throw Failure(kInternal, std::string("directory exports cannot be read: ") + dlerror());
  memcpy(&function, &address, sizeof function);
}

// What it writes to standard error of lines that it does not like is said here in other words.
void silence(void* library) {
  decltype(&ber_set_option) setOption = nullptr;
  resolve(library, "ber_set_option", setOption);
  const BER_LOG_PRINT_FN keepQuiet = [](const char*) {};
  setOption(nullptr, LBER_OPT_LOG_PRINT_FN, reinterpret_cast<const void*>(keepQuiet));
}

LdifLibrary openLibrary() {
  void* library = dlopen(LDAPPW_LDAP_SONAME, RTLD_NOW | RTLD_LOCAL);
  LdifLibrary functions{};
  resolve(library, "ldif_parse_line2", functions.parseLine);
  resolve(library, "ldif_sput_wrap", functions.putLine);
  resolve(library, "ldif_is_not_printable", functions.isNotPrintable);
  resolve(library, "ber_memfree", functions.release);
  silence(library);
  return functions;
}

}  // namespace

const LdifLibrary& ldifLibrary() {
  static const LdifLibrary library = openLibrary();
  return library;
}

}  // namespace tool
