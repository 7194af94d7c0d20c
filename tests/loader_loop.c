/* SPDX-License-Identifier: Apache-2.0 */
/* Opens and closes the library many times without linking it, before and after the provider's first use, and sees that
 * memory stays as it is, and that the library path which it has set outlives it: loader_loop LIBRARY [TIMES]. */
#include <dlfcn.h>
#include <malloc.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>

#include "check.h"

typedef int (*Format)(int, char*, void*, const char*, int, char*, int);

static int isMapped(const char* library) {
  FILE* maps = fopen("/proc/self/maps", "r");
  char line[4096];
  int found = 0;
  while (maps != NULL && fgets(line, sizeof line, maps) != NULL) found |= strstr(line, library) != NULL;
  if (maps != NULL) fclose(maps);
  return found;
}

int main(int argc, char** argv) {
  enum { kWithoutProvider = 2, kWithProvider = 9 }; /* {SHA} and {SSHA} */
  CHECK(argc > 1);
  const int times = argc > 2 ? atoi(argv[2]) : 200;
  size_t before = 0;
  setenv("LD_LIBRARY_PATH", "/opt/x", 1);
  for (int i = 0; i < times; ++i) {
    void* library = dlopen(argv[1], RTLD_NOW | RTLD_LOCAL);
    Format format = NULL;
    int (*setPath)(void) = NULL;
    char value[128];
    CHECK(library != NULL);
    void* symbol = dlsym(library, "format_password");
    memcpy(&format, &symbol, sizeof symbol);
    symbol = dlsym(library, "setDefLibpath");
    memcpy(&setPath, &symbol, sizeof symbol);
    setPath();
    const int scheme = i % 2 == 0 ? kWithoutProvider : kWithProvider;
    CHECK(format != NULL && format(scheme, NULL, NULL, "abc", 3, value, sizeof value) > 0);
    CHECK(dlclose(library) == 0 && dlopen(argv[1], RTLD_NOW | RTLD_NOLOAD) == NULL);
    CHECK(strcmp(getenv("LD_LIBRARY_PATH"), "/opt/x:/usr/lib") == 0);
    if (i == 20) before = mallinfo2().uordblks;
  }
  const size_t after = mallinfo2().uordblks;
  CHECK(isMapped("libtresk7qels.so") && isMapped("libcrypto.so"));
  CHECK(after <= before);
  return 0;
}
