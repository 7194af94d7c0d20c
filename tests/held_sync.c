/* SPDX-License-Identifier: Apache-2.0 */
/* Preloaded into the command: fsync() fails for files (HELD_SYNC=file) or for folders (HELD_SYNC=folder), or its first
 * call stops the process (HELD_SYNC=stop): then temporary files are complete and no file has been replaced. */
#include <errno.h>
#include <signal.h>
#include <stdlib.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

__attribute__((visibility("default"))) int fsync(int fd) {
  static int calls;
  struct stat status;
  const char* what = getenv("HELD_SYNC");
  if (what == NULL || fstat(fd, &status) != 0) return -1;
  if (strcmp(what, S_ISDIR(status.st_mode) ? "folder" : "file") == 0) {
    errno = EIO;
    return -1;
  }
  if (calls++ == 0 && strcmp(what, "stop") == 0) raise(SIGSTOP);
  return fdatasync(fd);
}
