// SPDX-License-Identifier: Apache-2.0
// The ldappw command: what a process needs before its command line is read.
#include <fcntl.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <csignal>
#include <cstdlib>

#include "command_line.h"

namespace tool {
namespace {

// A descriptor 0, 1 or 2 that is not open would go to the next file that is opened, and messages would be written into
// it: tool_test and ldif_test run with all three closed. The direction is the wrong one, so that using the descriptor
// still fails.
void occupyStandardDescriptors() {
  for (int fd = STDIN_FILENO; fd <= STDERR_FILENO; ++fd) {
    if (fcntl(fd, F_GETFD) >= 0 || errno != EBADF) continue;
    if (open("/dev/null", fd == STDIN_FILENO ? O_WRONLY : O_RDONLY) < 0) _exit(kIoError);
  }
}

// Starts the command again with everything bound. A shared C++ runtime looks its calls up as they come, and the loader
// then saves the vector registers, with pieces of the secrets that were copied last, on the stack: `secrets` finds
// them. Where the command cannot be started again it goes on as it is.
[[maybe_unused]] void bindSharedRuntime(char** argv) {
  char path[PATH_MAX];
  if (getenv("LD_BIND_NOW") != nullptr) return;
  const ssize_t length = readlink("/proc/self/exe", path, sizeof path - 1);
  if (length < 0 || setenv("LD_BIND_NOW", "1", 1) != 0) return;
  path[length] = '\0';
  execv(path, argv);
}

void prepareProcess([[maybe_unused]] char** argv) {
#ifdef LDAPPW_SHARED_RUNTIME
  bindSharedRuntime(argv);
#endif
  occupyStandardDescriptors();
  signal(SIGXFSZ, SIG_IGN);  // a file that grows too large is an error like a full disk
  const struct rlimit noCore {};
  setrlimit(RLIMIT_CORE, &noCore);  // a core file would hold passwords and keys
  prctl(PR_SET_DUMPABLE, 0);        // nor is it to reach a program that takes core files from the kernel
}

}  // namespace
}  // namespace tool

int main(int argc, char** argv) {
  tool::prepareProcess(argv);
  return tool::runCommand(argc, argv);
}
