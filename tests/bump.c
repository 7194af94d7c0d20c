/* SPDX-License-Identifier: Apache-2.0 */
/* A host's own allocator of the smallest kind: malloc, calloc, realloc and free alone. Memory is never used twice, and
 * free looks at the guards before and behind each block. On demand it refuses requests. */
#include <stdatomic.h>
#include <stdint.h>
#include <stdlib.h>
#include <string.h>

#define EXPORT __attribute__((visibility("default")))

enum { kLive = 0x11feb10c, kFreed = 0xf2eeb10c & 0x7fffffff, kGuard = 8, kUnit = 16 };

struct header {
  uint64_t size;
  uint64_t mark;
};

static _Alignas(16) unsigned char arena[512U << 20U];
static atomic_size_t used;
static atomic_long left = -1; /* requests before the one that is refused; below 0, none is */
static atomic_int refusesLater;
static const unsigned char guard[kGuard] = {0xa5, 0x5a, 0xa5, 0x5a, 0xa5, 0x5a, 0xa5, 0x5a};

/* From now on, the request with this number is refused, with all that follow or alone; -1 ends it. Says whether one
 * would still be refused. */
EXPORT int bump_refuse(long number, int andLater) {
  refusesLater = andLater;
  const long before = atomic_exchange(&left, number);
  return before > 0;
}

EXPORT void* malloc(size_t size) {
  if (left >= 0) {
    const long before = atomic_fetch_sub(&left, 1);
    if (before == 0 && refusesLater) left = 0;
    if (before == 0) return NULL;
  }
  const size_t whole = (sizeof(struct header) + size + kGuard + kUnit - 1) / kUnit * kUnit;
  if (size > sizeof arena || used + whole > sizeof arena) return NULL;
  unsigned char* data = arena + atomic_fetch_add(&used, whole) + sizeof(struct header);
  const struct header header = {size, kLive};
  memcpy(data - sizeof header, &header, sizeof header);
  memset(data, 0xdb, size);
  memcpy(data + size, guard, sizeof guard);
  return data;
}

EXPORT void* calloc(size_t count, size_t size) {
  if (size != 0 && count > SIZE_MAX / size) return NULL;
  void* data = malloc(count * size);
  return data == NULL ? NULL : memset(data, 0, count * size);
}

EXPORT void free(void* data) {
  if (data == NULL) return;
  struct header* header = (struct header*)data - 1;
  if (header->mark != kLive || memcmp((char*)data + header->size, guard, sizeof guard) != 0) abort();
  header->mark = kFreed;
}

EXPORT void* realloc(void* data, size_t size) {
  void* larger = malloc(size);
  if (data == NULL || larger == NULL) return larger;
  const size_t before = (size_t)((struct header*)data - 1)->size;
  memcpy(larger, data, before < size ? before : size);
  free(data);
  return larger;
}
