// SPDX-License-Identifier: Apache-2.0
// Opening the LDAP client library.
#include "ldif/library.h"

#include "base/loaded_library.h"

namespace tool {
namespace {

// Keeps it from writing about lines to standard error: the command has messages of its own.
void silence(const LoadedLibrary& library) {
  decltype(&ber_set_option) setOption = nullptr;
  library.resolve("ber_set_option", setOption);
  const BER_LOG_PRINT_FN keepQuiet = [](const char*) {};
  setOption(nullptr, LBER_OPT_LOG_PRINT_FN, reinterpret_cast<const void*>(keepQuiet));
}

LdifLibrary openLibrary() {
  const LoadedLibrary library(LDAPPW_LDAP_SONAME, "directory exports cannot be read");
  LdifLibrary functions{};
  library.resolve("ldif_parse_line2", functions.parseLine);
  library.resolve("ldif_sput_wrap", functions.putLine);
  library.resolve("ldif_is_not_printable", functions.isNotPrintable);
  library.resolve("ber_memfree", functions.release);
  silence(library);
  return functions;
}

}  // namespace

const LdifLibrary& ldifLibrary() {
  static const LdifLibrary library = openLibrary();
  return library;
}

}  // namespace tool
