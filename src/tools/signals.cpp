// SPDX-License-Identifier: Apache-2.0
// The handlers of ending signals. Everything here that a handler reads is static, filled while the signals are held
// back, and touched with async-signal-safe calls only.
#include "signals.h"

#include <errno.h>
#include <limits.h>
#include <unistd.h>

#include <cstring>

namespace tool {
namespace {

constexpr int kEndingSignals[] = {SIGINT, SIGTERM, SIGHUP, SIGQUIT, SIGPIPE};
constexpr int kFileSlots = 4;

struct FileSlot {
  volatile sig_atomic_t used;
  char path[PATH_MAX];
};

struct TerminalState {
  volatile sig_atomic_t quiet;
  int fd;
  int promptFd;
  const char* prompt;
  termios normal;
  termios silent;
};

FileSlot fileSlots[kFileSlots];
TerminalState terminal;

sigset_t endingSet() noexcept {
  sigset_t set;
  sigemptyset(&set);
  for (int number : kEndingSignals) sigaddset(&set, number);
  sigaddset(&set, SIGTSTP);
  return set;
}

void undoAll() noexcept {
  for (FileSlot& slot : fileSlots) {
    if (slot.used != 0) unlink(slot.path);
  }
  if (terminal.quiet != 0) tcsetattr(terminal.fd, TCSANOW, &terminal.normal);
}

// The signal is blocked while its handler runs: raised again, it takes its default effect on the return.
extern "C" void onEnd(int number) {
  undoAll();
  signal(number, SIG_DFL);
  raise(number);
}

extern "C" void onSuspend(int number);

void handle(int number, void (*handler)(int)) noexcept {
  struct sigaction before;
  if (sigaction(number, nullptr, &before) != 0 || before.sa_handler == SIG_IGN) return;  // as of nohup: stays ignored
  struct sigaction action {};
  action.sa_handler = handler;
  action.sa_mask = endingSet();
  action.sa_flags = SA_RESTART;
  sigaction(number, &action, nullptr);
}

// Stops with the terminal as it was found, and goes on with echo off.
extern "C" void onSuspend(int number) {
  const int savedErrno = errno;
  tcsetattr(terminal.fd, TCSANOW, &terminal.normal);
  signal(number, SIG_DFL);
  raise(number);
  sigset_t only;
  sigemptyset(&only);
  sigaddset(&only, number);
  pthread_sigmask(SIG_UNBLOCK, &only, nullptr);  // the process stops here
  pthread_sigmask(SIG_BLOCK, &only, nullptr);
  struct sigaction action {};
  action.sa_handler = onSuspend;
  action.sa_mask = endingSet();
  action.sa_flags = SA_RESTART;
  sigaction(number, &action, nullptr);
  tcsetattr(terminal.fd, TCSANOW, &terminal.silent);
  if (write(terminal.promptFd, terminal.prompt, strlen(terminal.prompt)) < 0) errno = savedErrno;
  errno = savedErrno;
}

void handleEndings() noexcept {
  for (int number : kEndingSignals) handle(number, onEnd);
}

}  // namespace

SignalBlock::SignalBlock() noexcept {
  const sigset_t set = endingSet();
  pthread_sigmask(SIG_BLOCK, &set, &before_);
}

SignalBlock::~SignalBlock() {
  pthread_sigmask(SIG_SETMASK, &before_, nullptr);
}

int removeOnSignal(const std::string& path) noexcept {
  const SignalBlock block;
  if (path.size() >= PATH_MAX) return -1;
  for (int i = 0; i < kFileSlots; ++i) {
    FileSlot& slot = fileSlots[i];
    if (slot.used != 0) continue;
    memcpy(slot.path, path.c_str(), path.size() + 1);
    slot.used = 1;
    handleEndings();
    return i;
  }
  return -1;
}

void forgetFile(int slot) noexcept {
  if (slot >= 0) fileSlots[slot].used = 0;
}

bool quietTerminal(int fd, const termios& normal, const termios& quiet, int promptFd, const char* prompt) noexcept {
  const SignalBlock block;
  terminal.fd = fd;
  terminal.promptFd = promptFd;
  terminal.prompt = prompt;
  terminal.normal = normal;
  terminal.silent = quiet;
  terminal.quiet = 1;
  handleEndings();
  handle(SIGTSTP, onSuspend);
  if (tcsetattr(fd, TCSANOW, &quiet) == 0) return true;
  restoreTerminal();
  return false;
}

void restoreTerminal() noexcept {
  const SignalBlock block;
  if (terminal.quiet == 0) return;
  tcsetattr(terminal.fd, TCSANOW, &terminal.normal);
  terminal.quiet = 0;
  struct sigaction before;
  if (sigaction(SIGTSTP, nullptr, &before) == 0 && before.sa_handler == onSuspend) signal(SIGTSTP, SIG_DFL);
}

}  // namespace tool
