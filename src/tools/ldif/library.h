// SPDX-License-Identifier: Apache-2.0
// The LDAP client library, which parses and writes the lines of directory exports. It is opened when a verb reads an
// export instead of being linked: with the libraries that it needs it would take half of the start of every other verb.
#pragma once

#include <cstdio>  // ldif.h uses FILE without including it

#include <ldap.h>
#include <ldif.h>

namespace tool {

struct LdifLibrary {
  decltype(&ldif_parse_line2) parseLine;
  decltype(&ldif_sput_wrap) putLine;
  decltype(&ldif_is_not_printable) isNotPrintable;
  decltype(&ber_memfree) release;
};

// Opened at the first call; throws Failure with kInternal when it cannot be.
const LdifLibrary& ldifLibrary();

}  // namespace tool
