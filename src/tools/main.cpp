// SPDX-License-Identifier: Apache-2.0
// The ldappw command: what a process needs before its command line is read.
#include <fcntl.h>
#include <sys/resource.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>

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

void prepareProcess() {
  occupyStandardDescriptors();
  signal(SIGXFSZ, SIG_IGN);  // a file that grows too large is an error like a full disk
  const struct rlimit noCore {};
  setrlimit(RLIMIT_CORE, &noCore);  // a core file would hold passwords and keys
}

}  // namespace
}  // namespace tool

int main(int argc, char** argv) {
  tool::prepareProcess();
  return tool::runCommand(argc, argv);
}
