/* SPDX-License-Identifier: Apache-2.0 */
/* For programs that are tests themselves: a condition that has to hold. Include stdio.h before it. */
#pragma once

#include <unistd.h>

#define CHECK(condition)                                                    \
  do {                                                                      \
    if (!(condition)) {                                                     \
      fprintf(stderr, "line %d: %s does not hold\n", __LINE__, #condition); \
      _exit(1);                                                             \
    }                                                                       \
  } while (0)
