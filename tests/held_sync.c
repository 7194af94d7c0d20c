/* SPDX-License-Identifier: Apache-2.0 */
/* Preloaded into the command: its first fsync() fails (HELD_SYNC=fail), or stops the process (HELD_SYNC=stop), which is
 * the moment at which temporary files are complete and no file has been replaced. */
#include <errno.h>
#include <signal.h>
#include <stdlib.h>
#include <string.h>
#include <unistd.h>

__attribute__((visibility("default"))) int fsync(int fd) {
  static int calls;
  const char* what = getenv("HELD_SYNC");
  if (calls++ == 0 && what != NULL && strcmp(what, "fail") == 0) {
    errno = EIO;
    return -1;
  }
  if (calls == 1 && what != NULL) raise(SIGSTOP);
  return fdatasync(fd);
}
