/* SPDX-License-Identifier: Apache-2.0 */
/* Preloaded into the command: fsync() fails for files (HELD_SYNC=file) or for folders (HELD_SYNC=folder), or its first
 * call stops the process (HELD_SYNC=stop): then temporary files are complete and no file has been replaced. With
 * HELD_SYNC=swap fchmod() puts a link to the file "victim" in the place of the file that it is given. */
#include <errno.h>
#include <signal.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/stat.h>
#include <sys/syscall.h>
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

__attribute__((visibility("default"))) int fchmod(int fd, mode_t mode) {
  char link[64];
  char path[4096];
  const char* what = getenv("HELD_SYNC");
  snprintf(link, sizeof link, "/proc/self/fd/%d", fd);
  const ssize_t length = readlink(link, path, sizeof path - 1);
  if (what != NULL && strcmp(what, "swap") == 0 && length > 0) {
    path[length] = '\0';
    if (unlink(path) != 0 || symlink("victim", path) != 0) return -1;
  }
  return (int)syscall(SYS_fchmod, fd, mode);
}
